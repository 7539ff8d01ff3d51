#include "foundation/Date.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace telvane::testing {
namespace {

using std::chrono::microseconds;
using std::chrono::seconds;

Date dateAt(std::chrono::microseconds sinceEpoch) { return Date(Date::TimePoint(sinceEpoch)); }

TEST(DateTest, isTheEpochByDefault) {
  EXPECT_EQ(Date().secondsSince1970(), 0.0);
  EXPECT_EQ(Date().description(), "1970-01-01 00:00:00 +0000");
}

TEST(DateTest, keepsMicrosecondsThroughSeconds) {
  const double original = 1714571110.123456;
  EXPECT_EQ(Date::fromSecondsSince1970(original).secondsSince1970(), original);
  EXPECT_EQ(Date::fromSecondsSince1970(original).microseconds(), 123456);
}

TEST(DateTest, roundsWholeSecondsTowardsThePast) {
  const Date before = dateAt(microseconds(-1));
  EXPECT_EQ(before.wholeSeconds(), -1);
  EXPECT_EQ(before.microseconds(), 999999);
  const Date after = dateAt(seconds(5) + microseconds(7));
  EXPECT_EQ(after.wholeSeconds(), 5);
  EXPECT_EQ(after.microseconds(), 7);
}

TEST(DateTest, makesTheEpochOfWhatIsNoTime) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  for (const double time : {std::nan(""), kInfinity, -kInfinity, 1e13, -1e13, 1e300, -1e300}) {
    EXPECT_EQ(Date::fromSecondsSince1970(time), Date()) << time;
  }
}

TEST(DateTest, reachesAsFarAsItsMicroseconds) {
  EXPECT_EQ(Date::fromSecondsSince1970(9e12).wholeSeconds(), 9000000000000);
  EXPECT_EQ(Date::fromSecondsSince1970(-9e12).wholeSeconds(), -9000000000000);
}

TEST(DateTest, describesItselfInUTC) {
  EXPECT_EQ(dateAt(seconds(1714571110)).description(), "2024-05-01 13:45:10 +0000");
  EXPECT_EQ(dateAt(seconds(951782399)).description(), "2000-02-28 23:59:59 +0000");
  EXPECT_EQ(dateAt(seconds(951782400)).description(), "2000-02-29 00:00:00 +0000");
  EXPECT_EQ(dateAt(seconds(-1)).description(), "1969-12-31 23:59:59 +0000");
  EXPECT_EQ(dateAt(seconds(4102444800)).description(), "2100-01-01 00:00:00 +0000");
  EXPECT_EQ(dateAt(seconds(253402300800)).description(), "10000-01-01 00:00:00 +0000");
}

TEST(DateTest, agreesWithTheStandardCalendar) {
  using namespace std::chrono;
  for (int64_t day = -800000; day < 800000; day += 997) {
    const year_month_day expected{sys_days(days(day))};
    char text[48];
    std::snprintf(text, sizeof text, "%04d-%02u-%02u 00:00:00 +0000", static_cast<int>(expected.year()),
                  static_cast<unsigned>(expected.month()), static_cast<unsigned>(expected.day()));
    EXPECT_EQ(Date(sys_days(days(day))).description(), text);
  }
}

TEST(DateTest, describesTheFirstAndTheLastTime) {
  EXPECT_EQ(dateAt(microseconds::max()).description(), "294247-01-10 04:00:54 +0000");
  EXPECT_EQ(dateAt(microseconds::min()).description(), "-290308-12-21 19:59:05 +0000");
}

TEST(DateTest, isOrdered) {
  EXPECT_LT(dateAt(microseconds(1)), dateAt(microseconds(2)));
  EXPECT_EQ(dateAt(microseconds(1)), dateAt(microseconds(1)));
}

}  // namespace
}  // namespace telvane::testing
