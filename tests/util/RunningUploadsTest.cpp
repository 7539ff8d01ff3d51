#include "util/RunningUploads.h"

#include <gtest/gtest.h>

#include <vector>

#include "platform/FlowGate.h"
#include "platform/ipc/Limits.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

class RunningUploadsTest : public ::testing::Test {
 protected:
  using Kind = RunningUploads::Kind;

  std::shared_ptr<Semaphore> newSemaphore() { return _process.platform().dispatch.newSemaphore(0); }
  std::optional<RunningUploads::Place> begin(uint64_t bytes = 1, Kind kind = Kind::File) {
    return _uploads.begin(kind, newSemaphore(), bytes);
  }

  SimulatedWorld _world;
  SimulatedPlatform& _process = _world.makeProcess("telvaned");
  RunningUploads _uploads;
};

TEST_F(RunningUploadsTest, takeSixteenAtOnceAndOneMoreWhenOneIsThrough) {
  std::vector<RunningUploads::Place> places;
  for (size_t i = 0; i < RunningUploads::kMostAtOnce; ++i) {
    auto place = begin(1, i % 2 == 0 ? Kind::File : Kind::LogData);
    ASSERT_TRUE(place.has_value()) << i;
    places.push_back(*std::move(place));
  }
  EXPECT_FALSE(begin().has_value());
  EXPECT_FALSE(begin(0, Kind::LogData).has_value());
  places.pop_back();
  EXPECT_TRUE(begin().has_value());
}

TEST_F(RunningUploadsTest, areBoundedByTheBytesOfTheirFilesInAll) {
  const auto most = begin(RunningUploads::kMostBytesAtOnce - 10);
  ASSERT_TRUE(most.has_value());
  EXPECT_FALSE(begin(11).has_value());
  EXPECT_FALSE(begin(UINT64_MAX).has_value()) << "the sum must not wrap";
  EXPECT_TRUE(begin(10).has_value());
  EXPECT_FALSE(begin(RunningUploads::kMostBytesAtOnce + 1).has_value());
}

// These wait in memory, so their bound is another one.
TEST_F(RunningUploadsTest, areBoundedByTheBytesOfLogDataInAll) {
  EXPECT_FALSE(begin(RunningUploads::kMostLogDataBytesAtOnce + 1, Kind::LogData).has_value());
  {
    const auto most = begin(RunningUploads::kMostLogDataBytesAtOnce - 10, Kind::LogData);
    ASSERT_TRUE(most.has_value());
    EXPECT_FALSE(begin(11, Kind::LogData).has_value());
    EXPECT_TRUE(begin(10, Kind::LogData).has_value());
    EXPECT_TRUE(begin(RunningUploads::kMostBytesAtOnce).has_value()) << "files are counted apart";
  }
  EXPECT_TRUE(begin(RunningUploads::kMostLogDataBytesAtOnce, Kind::LogData).has_value());
}

// Or one client's log data, whose server does not answer, would stop the daemon from reading what others send.
TEST_F(RunningUploadsTest, holdLessLogDataThanClosesTheGateForAllClients) {
  EXPECT_LT(RunningUploads::kMostLogDataBytesAtOnce, FlowGate::kDefaultLimit);
  EXPECT_GE(RunningUploads::kMostLogDataBytesAtOnce, ipc::Limits().maximumWaitingBytes)
      << "what a client can hand over";
}

TEST_F(RunningUploadsTest, wakesThoseThatWaitWhenTheProcessIsToEndAndTakesNoMore) {
  const auto semaphore = newSemaphore();
  const auto place = _uploads.begin(Kind::File, semaphore, 1);
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
