#include "client/MetricsMerging.h"

#include <gtest/gtest.h>

#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

constexpr Key kA{"a"};
constexpr Key kB{"b"};

Dictionary merged(const std::vector<Dictionary>& reports) {
  Dictionary payload;
  for (const Dictionary& metrics : reports) mergeMetrics(payload, metrics);
  return payload;
}

TEST(MetricsMergingTest, takesKeysThatAreNotThereAsTheyAre) {
  EXPECT_EQ(merged({{{kA, 1}}, {{kB, Array{1}}}}), (Dictionary{{kA, 1}, {kB, Array{1}}}));
  EXPECT_EQ(merged({{}, {{kA, Dictionary{{kB, 2}}}}, {}}), (Dictionary{{kA, Dictionary{{kB, 2}}}}));
}

TEST(MetricsMergingTest, addsTheEntriesOfADictionaryAndReplacesEqualOnes) {
  EXPECT_EQ(
      merged({{{kA, Dictionary{{Key("x"), 1}, {Key("y"), 1}}}}, {{kA, Dictionary{{Key("y"), 2}, {Key("z"), 2}}}}}),
      (Dictionary{{kA, Dictionary{{Key("x"), 1}, {Key("y"), 2}, {Key("z"), 2}}}}));
}

TEST(MetricsMergingTest, mergesOneLevelOnly) {
  EXPECT_EQ(merged({{{kA, Dictionary{{kB, Array{1}}}}}, {{kA, Dictionary{{kB, Array{2}}}}}}),
            (Dictionary{{kA, Dictionary{{kB, Array{2}}}}}));
}

TEST(MetricsMergingTest, appendsTheElementsOfAnArray) {
  EXPECT_EQ(merged({{{kA, Array{1}}}, {{kA, Array{2, 1}}}, {{kA, Array()}}}), (Dictionary{{kA, Array{1, 2, 1}}}));
}

TEST(MetricsMergingTest, replacesEverythingElse) {
  const Value dictionary = Dictionary{{kB, 1}};
  const Value array = Array{1};
  const std::vector<Value> values{1, 2.5, true, "text", Data::copyOf("d"), dictionary, array};
  for (const Value& present : values) {
    for (const Value& added : values) {
      if (present.kind() == added.kind() && (present.isArray() || present.isDictionary())) continue;
      EXPECT_EQ(merged({{{kA, present}}, {{kA, added}}}), (Dictionary{{kA, added}}));
    }
  }
}

TEST(MetricsMergingTest, leavesWhatWasGivenAsItWas) {
  const Dictionary first{{kA, Array{1}}, {kB, Dictionary{{kA, 1}}}};
  const Dictionary second{{kA, Array{2}}, {kB, Dictionary{{kB, 2}}}};
  merged({first, second});
  EXPECT_EQ(first, (Dictionary{{kA, Array{1}}, {kB, Dictionary{{kA, 1}}}}));
  EXPECT_EQ(second, (Dictionary{{kA, Array{2}}, {kB, Dictionary{{kB, 2}}}}));
}

}  // namespace
}  // namespace telvane::testing
