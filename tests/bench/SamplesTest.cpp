#include "bench/Samples.h"

#include <gtest/gtest.h>

namespace telvane::bench {
namespace {

Samples upTo(int count) {
  Samples samples;
  // From the largest down, so that an answer needs sorting.
  for (int i = count; i > 0; --i) samples.add(i);
  return samples;
}

TEST(SamplesTest, aPercentileIsASampleThatTheShareDoesNotExceed) {
  const Samples samples = upTo(200);
  EXPECT_EQ(samples.percentile(0.5), 100);
  EXPECT_EQ(samples.percentile(0.95), 190);
  EXPECT_EQ(samples.percentile(0.99), 198);
  EXPECT_EQ(samples.percentile(0.991), 199);
}

TEST(SamplesTest, theMedianOfAnEvenNumberLiesBetweenTheMiddleTwo) {
  EXPECT_EQ(upTo(5).median(), 3);
  EXPECT_EQ(upTo(6).median(), 3.5);
}

TEST(SamplesTest, leastAndMostAreTheEnds) {
  EXPECT_EQ(upTo(9).least(), 1);
  EXPECT_EQ(upTo(9).most(), 9);
}

TEST(SamplesTest, oneSampleIsAllOfThem) {
  const Samples samples({7});
  EXPECT_EQ(samples.median(), 7);
  EXPECT_EQ(samples.percentile(0.99), 7);
  EXPECT_EQ(samples.least(), 7);
}

TEST(SamplesTest, nothingMeasuredIsZero) {
  EXPECT_TRUE(Samples().isEmpty());
  EXPECT_EQ(Samples().median(), 0);
  EXPECT_EQ(Samples().percentile(0.5), 0);
}

}  // namespace
}  // namespace telvane::bench
