#include "util/RunningUploads.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

class RunningUploadsTest : public ::testing::Test {
 protected:
  std::shared_ptr<Semaphore> newSemaphore() { return _process.platform().dispatch.newSemaphore(0); }
  std::optional<RunningUploads::Place> begin(uint64_t bytes = 1) { return _uploads.begin(newSemaphore(), bytes); }

  SimulatedWorld _world;
  SimulatedPlatform& _process = _world.makeProcess("telvaned");
  RunningUploads _uploads;
};

TEST_F(RunningUploadsTest, takeSixteenAtOnceAndOneMoreWhenOneIsThrough) {
  std::vector<RunningUploads::Place> places;
  for (size_t i = 0; i < RunningUploads::kMostAtOnce; ++i) {
    auto place = begin();
    ASSERT_TRUE(place.has_value()) << i;
    places.push_back(*std::move(place));
  }
  EXPECT_FALSE(begin().has_value());
  places.pop_back();
  EXPECT_TRUE(begin().has_value());
}

TEST_F(RunningUploadsTest, areBoundedByTheBytesOfTheirFilesInAll) {
  const auto most = begin(RunningUploads::kMostBytesAtOnce - 10);
  ASSERT_TRUE(most.has_value());
  EXPECT_FALSE(begin(11).has_value());
  EXPECT_FALSE(begin(UINT64_MAX).has_value()) << "the sum must not wrap";
  EXPECT_TRUE(begin(10).has_value());
  EXPECT_FALSE(_uploads.begin(newSemaphore(), RunningUploads::kMostBytesAtOnce + 1).has_value());
}

TEST_F(RunningUploadsTest, wakesThoseThatWaitWhenTheProcessIsToEndAndTakesNoMore) {
  const auto semaphore = newSemaphore();
  const auto place = _uploads.begin(semaphore, 1);
  ASSERT_TRUE(place.has_value());
  EXPECT_FALSE(place->isCancelled());
  _uploads.cancelAll();
  _uploads.cancelAll();
  EXPECT_TRUE(place->isCancelled());
  EXPECT_TRUE(semaphore->waitFor(std::chrono::seconds(0)));
  EXPECT_FALSE(semaphore->waitFor(std::chrono::seconds(0))) << "told twice";
  EXPECT_FALSE(begin().has_value());
}

}  // namespace
}  // namespace telvane::testing
