// The health report that a stop message carries.
#include "interfaces/HealthKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedSessionHealthTest : public DaemonFixture {
 protected:
  Dictionary lastStop() {
    const auto stops = postedEvents(0, 1);
    return stops.empty() ? Dictionary() : stops.back();
  }
};

TEST_F(TelvanedSessionHealthTest, countsLiveSessionsPerClientTypeTheEndingOneIncluded) {
  givenStorebag({}, "camera");
  auto ending = startSession(sessionInfo(9));
  const auto second = openSession(sessionInfo(9));
  const auto third = openSession(sessionInfo(9));
  const auto other = openSession(sessionInfo(12));
  ending->close();
  EXPECT_THAT(lastStop(), HasEntry("SessionsCount_CAMERA", 3));
  EXPECT_THAT(lastStop(), HasEntry("SessionsCount_ASSISTANT", 1));
}

TEST_F(TelvanedSessionHealthTest, sessionsWithoutAKnownTypeCountAsUnknown) {
  givenStorebag();
  auto ending = startSession();
  const auto untold = connect();
  ending->close();
  EXPECT_THAT(lastStop(), HasEntry("SessionsCount_Unknown", 1));
  EXPECT_THAT(lastStop(), HasEntry("BatchSize_Unknown", 0));
}

TEST_F(TelvanedSessionHealthTest, sumsWhatWaitsInBatches) {
  givenStorebag();
  auto ending = startSession();
  const auto other = startSession();
  other->flush();
  ending->flush();
  const uint64_t empty = sessions()[1]->batchedEventsSize();
  other->send(7, 1, {{Key("k"), std::string(1000, 'x')}});
  const uint64_t full = sessions()[1]->batchedEventsSize();
  EXPECT_GT(full, empty + 1000);
  ending->close();
  EXPECT_EQ(lastStop()["BatchSize_MEDIA"].unsignedValue(), full + empty) << full << " and " << empty;
}

TEST_F(TelvanedSessionHealthTest, tellsOfTheStorebagsAndTheProcess) {
  givenStorebag();
  auto ending = startSession();
  ending->close();
  const Dictionary stop = lastStop();
  EXPECT_EQ(stop[kHealthStorebagsCount], Value(1));
  EXPECT_GT(stop[kHealthStorebagsSize].integerValue(), 100);
  EXPECT_EQ(stop[kHealthCalculatedMemoryUsage].integerValue(),
            stop[kHealthStorebagsSize].integerValue() + stop["BatchSize_MEDIA"].integerValue());
  EXPECT_EQ(stop[kHealthProcessMemoryUsage], Value(FixedProcessMemory::kUsual));
}

}  // namespace
}  // namespace telvane::testing
