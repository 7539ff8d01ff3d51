#include "tests/soak/MemoryTrend.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

TEST(MemoryTrendTest, letsMemoryLevelOffAfterTheFirstThird) {
  EXPECT_EQ(memoryGrowth({1, 20, 300, 400, 402, 398, 400, 401, 399}, 1), "");
}

TEST(MemoryTrendTest, namesGrowthThatGoesOn) {
  const std::vector<int64_t> leaking{100, 110, 120, 130, 140, 150, 160, 170, 180};
  EXPECT_THAT(memoryGrowth(leaking, 29), HasSubstr("170 bytes on average in the last 3 rounds, 140 in the 3 before"));
  EXPECT_EQ(memoryGrowth(leaking, 30), "") << "the margin is allowed";
}

TEST(MemoryTrendTest, leavesTheOddRoundsToTheStart) {
  EXPECT_EQ(memoryGrowth({0, 0, 5, 5, 5, 5, 5, 5, 5, 5, 5}, 0), "");
  EXPECT_THAT(memoryGrowth({0, 0, 5, 5, 5, 5, 5, 5, 6, 6, 6}, 0), HasSubstr("grows"));
}

TEST(MemoryTrendTest, tellsNothingOfFewRounds) { EXPECT_EQ(memoryGrowth({1, 2, 4, 8, 16, 32, 64, 128}, 0), ""); }

}  // namespace
}  // namespace telvane::testing
