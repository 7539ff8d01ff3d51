#include "platform/dispatch/SystemClock.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(SystemClockTest, tellsTheCalendarTimeOfTheSystem) {
  const auto before = std::chrono::floor<std::chrono::microseconds>(std::chrono::system_clock::now());
  const Date now = SystemClock().now();
  const auto after = std::chrono::system_clock::now();
  EXPECT_GE(now.time(), before);
  EXPECT_LE(now.time(), after);
}

TEST(SystemClockTest, neverGoesBackInMonotonicTime) {
  const SystemClock clock;
  Clock::MonotonicTime last = clock.monotonicNow();
  for (int i = 0; i < 1000; ++i) {
    const Clock::MonotonicTime now = clock.monotonicNow();
    ASSERT_GE(now, last);
    last = now;
  }
}

}  // namespace
}  // namespace telvane::testing
