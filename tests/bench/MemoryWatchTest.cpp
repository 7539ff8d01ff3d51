#include "bench/MemoryWatch.h"

#include <gtest/gtest.h>
#include <unistd.h>

namespace telvane::bench {
namespace {

TEST(MemoryWatchTest, whatIsTakenWhileWarmingUpIsNoGrowth) {
  const auto trend = MemoryWatch::trendOf({5, 12, 20, 20, 20, 20, 20, 20});
  EXPECT_EQ(trend.warm, 20);
  EXPECT_EQ(trend.end, 20);
  EXPECT_EQ(trend.growth(), 0);
}

TEST(MemoryWatchTest, whatKeepsBeingTakenIsGrowth) {
  const auto trend = MemoryWatch::trendOf({10, 11, 12, 13, 14, 15, 16, 17});
  EXPECT_EQ(trend.warm, 12.5);
  EXPECT_EQ(trend.end, 16.5);
  EXPECT_NEAR(trend.growth(), 0.32, 1e-9);
  EXPECT_EQ(trend.peak, 17);
}

TEST(MemoryWatchTest, aMomentaryPeakIsNoGrowth) {
  const auto trend = MemoryWatch::trendOf({10, 10, 10, 10, 10, 10, 10, 10, 10, 10, 90, 10});
  EXPECT_EQ(trend.growth(), 0);
  EXPECT_EQ(trend.peak, 90);
}

TEST(MemoryWatchTest, fewSamplesAreAsGoodAsTheyAre) {
  EXPECT_EQ(MemoryWatch::trendOf({3}).end, 3);
  EXPECT_EQ(MemoryWatch::trendOf({3, 4}).end, 4);
  EXPECT_EQ(MemoryWatch::trendOf({}).warm, 0);
}

TEST(MemoryWatchTest, watchesALivingProcess) {
  MemoryWatch watch(getpid());
  watch.sample();
  // A test program of ours has megabytes, and not thousands of them.
  EXPECT_GT(watch.trend().end, 1);
  EXPECT_LT(watch.trend().end, 4000);
}

}  // namespace
}  // namespace telvane::bench
