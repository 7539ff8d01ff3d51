// The health report that a stop message carries.
#include <algorithm>
#include <set>

#include "interfaces/ClientTypes.h"
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

TEST_F(TelvanedSessionHealthTest, aSessionThatNamesATypeThatIsNoneCountsAsUnknown) {
  givenStorebag();
  auto ending = startSession();
  ending->setSessionInfo(sessionInfo(40), userInfo());
  ending->close();
  EXPECT_THAT(lastStop(), HasEntry("SessionsCount_Unknown", 1));
  EXPECT_TRUE(lastStop().contains("BatchSize_Unknown"));
  EXPECT_FALSE(lastStop().contains("SessionsCount_MEDIA"));
}

TEST_F(TelvanedSessionHealthTest, eachClientTypeHasAShortNameOfItsOwn) {
  std::set<std::string_view> names;
  for (const ClientType& row : allClientTypes()) {
    names.insert(row.senderName);
    EXPECT_TRUE(std::all_of(row.senderName.begin(), row.senderName.end(), [](char c) { return c >= 'A' && c <= 'Z'; }))
        << row.senderName;
  }
  EXPECT_EQ(names.size(), 26u);
}

TEST_F(TelvanedSessionHealthTest, withoutMemoryFiguresTheProcessUsesNone) {
  givenStorebag();
  process.processMemory().set(0);
  startSession()->close();
  EXPECT_EQ(lastStop()[kHealthProcessMemoryUsage], Value(0));
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

// Readers of the report know it so: what a total exceeds 31 bits by is counted from the other end.
TEST_F(TelvanedSessionHealthTest, aBatchTotalIsReadBackAsA32BitNumber) {
  constexpr int64_t kMost = INT32_MAX;
  givenStorebag();
  const auto client = startSession();
  const auto session = sessions()[0];
  const auto size = static_cast<int64_t>(session->batchedEventsSize());
  ASSERT_GT(size, 0);
  Dictionary full{{Key("BatchSize_MEDIA"), kMost}};
  EXPECT_EQ(session->addSessionHealthInfo(*session, full), static_cast<uint64_t>(size));
  EXPECT_EQ(full["BatchSize_MEDIA"], Value(kMost + size)) << "what is added is no 32-bit number";
  session->addSessionHealthInfo(*session, full);
  EXPECT_EQ(full["BatchSize_MEDIA"], Value(kMost + size - (int64_t{1} << 32) + size));
}

TEST_F(TelvanedSessionHealthTest, aSessionThatIsStillListedCountsTwice) {
  givenStorebag();
  const auto client = startSession();
  const auto session = sessions()[0];
  const auto size = static_cast<int64_t>(session->batchedEventsSize());
  ASSERT_GT(size, 0);
  Dictionary report;
  session->addSessionsAccumulatedHealthInfoToPayload(report, sessions(), cachedStorebags());
  EXPECT_THAT(report, HasEntry("SessionsCount_MEDIA", 2));
  EXPECT_EQ(report["BatchSize_MEDIA"], Value(2 * size));
  EXPECT_EQ(report[kHealthCalculatedMemoryUsage].integerValue(),
            2 * size + report[kHealthStorebagsSize].integerValue());
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
