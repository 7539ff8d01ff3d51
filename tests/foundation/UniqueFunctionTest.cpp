#include "foundation/UniqueFunction.h"

#include <gtest/gtest.h>

#include <array>
#include <memory>
#include <string>

#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

TEST(UniqueFunctionTest, isEmptyByDefaultAndAfterNull) {
  Job job;
  EXPECT_FALSE(job);
  job = [] {};
  EXPECT_TRUE(job);
  job = nullptr;
  EXPECT_FALSE(job);
  EXPECT_FALSE(Job(nullptr));
}

TEST(UniqueFunctionTest, passesArgumentsAndTheResult) {
  UniqueFunction<std::string(int, std::unique_ptr<int>)> sum = [](int a, std::unique_ptr<int> b) {
    return std::to_string(a + *b);
  };
  EXPECT_EQ(sum(2, std::make_unique<int>(3)), "5");
}

TEST(UniqueFunctionTest, ownsWhatItsCallableOwns) {
  auto watched = std::make_shared<int>(1);
  {
    Job job = [watched] { ++*watched; };
    EXPECT_EQ(watched.use_count(), 2);
    job();
  }
  EXPECT_EQ(watched.use_count(), 1);
  EXPECT_EQ(*watched, 2);
}

TEST(UniqueFunctionTest, keepsSmallCallablesInside) {
  int calls = 0;
  const size_t allocations = allocationsDuring([&] {
    Job job = [&calls] { ++calls; };
    Job moved = std::move(job);
    moved();
  });
  EXPECT_EQ(allocations, 0u);
  EXPECT_EQ(calls, 1);
}

TEST(UniqueFunctionTest, movesSmallAndLargeCallables) {
  auto small = std::make_shared<int>(0);
  auto large = std::make_shared<int>(0);
  Job first = [small] { ++*small; };
  Job second = [large, ballast = std::array<char, 200>{}] { *large += 1 + ballast[0]; };
  std::swap(first, second);
  first();
  EXPECT_EQ(*large, 1);
  second();
  EXPECT_EQ(*small, 1);
  first = std::move(second);
  EXPECT_EQ(large.use_count(), 1);
  EXPECT_FALSE(second);
  first();
  EXPECT_EQ(*small, 2);
}

TEST(UniqueFunctionTest, survivesAssignmentFromItself) {
  int calls = 0;
  Job job = [&calls] { ++calls; };
  Job& alias = job;
  job = std::move(alias);
  ASSERT_TRUE(job);
  job();
  EXPECT_EQ(calls, 1);
}

}  // namespace
}  // namespace telvane::testing
