#include "collector/HTTPDate.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

Date atSecond(int64_t second) { return Date(Date::TimePoint(std::chrono::seconds(second))); }

TEST(HTTPDateTest, writesDayDateAndTimeInGMT) {
  EXPECT_EQ(httpDate(atSecond(784111777)), "Sun, 06 Nov 1994 08:49:37 GMT");
  EXPECT_EQ(httpDate(atSecond(0)), "Thu, 01 Jan 1970 00:00:00 GMT");
}

TEST(HTTPDateTest, cutsFractionsOfASecond) {
  const Date date(Date::TimePoint(std::chrono::milliseconds(784111777999)));
  EXPECT_EQ(httpDate(date), "Sun, 06 Nov 1994 08:49:37 GMT");
}

}  // namespace
}  // namespace telvane::testing
