#include "tests/support/SimulatedClock.h"

#include <gtest/gtest.h>

#include "tests/support/Matchers.h"
#include "tests/support/SeededRandom.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class SimulatedClockTest : public ::testing::Test {
 protected:
  SimulatedScheduler _scheduler{1};
  SimulatedClock _clock{_scheduler};
};

TEST_F(SimulatedClockTest, goesWithVirtualTime) {
  EXPECT_EQ(_clock.now().description(), "2026-01-01 00:00:00 +0000");
  const auto before = _clock.monotonicNow();
  _scheduler.advance(1500ms);
  EXPECT_EQ(_clock.now().time() - SimulatedClock::kCalendarStart.time(), 1500ms);
  EXPECT_EQ(_clock.monotonicNow() - before, 1500ms);
}

TEST_F(SimulatedClockTest, jumpsInTheCalendarButNotInMonotonicTime) {
  const auto before = _clock.monotonicNow();
  _clock.jumpCalendar(-24h);
  EXPECT_EQ(_clock.now().description(), "2025-12-31 00:00:00 +0000");
  EXPECT_EQ(_clock.monotonicNow(), before);
  _scheduler.advance(1s);
  EXPECT_EQ(_clock.now().description(), "2025-12-31 00:00:01 +0000");
}

TEST_F(SimulatedClockTest, standsStillAndGoesOnFromThere) {
  _clock.stopCalendar();
  const auto before = _clock.monotonicNow();
  _scheduler.advance(1h);
  EXPECT_EQ(_clock.now(), SimulatedClock::kCalendarStart);
  EXPECT_EQ(_clock.monotonicNow() - before, 1h);
  _clock.startCalendar();
  _scheduler.advance(1min);
  EXPECT_EQ(_clock.now().description(), "2026-01-01 00:01:00 +0000");
}

TEST_F(SimulatedClockTest, isSetToADate) {
  const Date date = Date::fromSecondsSince1970(1'000'000'000.25);
  _clock.setCalendar(date);
  EXPECT_EQ(_clock.now(), date);
}

TEST(SeededRandomTest, isTheSameForTheSameSeed) {
  SeededRandom a(5);
  SeededRandom b(5);
  SeededRandom c(6);
  const UUID uuid = a.newUUID();
  EXPECT_EQ(uuid, b.newUUID());
  EXPECT_NE(uuid, c.newUUID());
  EXPECT_NE(uuid, a.newUUID());
}

}  // namespace
}  // namespace telvane::testing
