#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "foundation/Value.h"
#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

constexpr int kRounds = 2000;

// One round of what a thread does with a value that others hold too: read it, change a copy, nest it, let all go.
void useSharedValue(const Value& shared) {
  Value copy = shared;
  Dictionary own = *copy.dictionary();
  own.set("name", "mine");
  own.set("list", Array{copy, own["list"]});
  ASSERT_EQ((*shared.dictionary())["name"], "everyone's");
  ASSERT_EQ(own["name"], "mine");
}

Value sharedValue() {
  StringBuffer buffer(64);
  Dictionary dictionary;
  dictionary.set(buffer.append("name"), buffer.append("everyone's"));
  dictionary.set(buffer.append("list"), Array{buffer.append("slice"), Data::copyOf("bytes")});
  return dictionary;
}

// Copies are counted without a lock: whoever lets go last frees, exactly once, and no change is seen by another owner.
TEST(SharingTest, countsOwnersInOneThread) {
  const Value value = sharedValue();
  for (int i = 0; i < kRounds; ++i) useSharedValue(value);
  EXPECT_EQ(value, sharedValue());
}

TEST(SharingTest, countsOwnersAcrossThreads) {
  const Value value = sharedValue();
  std::vector<std::jthread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([copy = value] {
      for (int round = 0; round < kRounds; ++round) useSharedValue(copy);
    });
  }
  threads.clear();
  EXPECT_EQ(value, sharedValue());
}

TEST(SharingTest, freesWhatTheLastThreadLetsGo) {
  const int64_t before = livingAllocationCount();
  for (int round = 0; round < 200; ++round) {
    {
      Value value = Array{sharedValue(), sharedValue()};
      EXPECT_GT(livingAllocationCount(), before);
      std::vector<std::jthread> threads;
      for (int i = 0; i < 2; ++i) {
        threads.emplace_back([copy = value]() mutable { copy = Value(); });
      }
      value = Value();
    }
    ASSERT_EQ(livingAllocationCount(), before) << "in round " << round;
  }
}

}  // namespace
}  // namespace telvane::testing
