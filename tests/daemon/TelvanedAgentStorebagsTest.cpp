// The storebags in memory: when they are fetched anew, and what is answered when they cannot be.
#include "interfaces/AgentKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

constexpr char kFetching[] = "fetchAndCacheStorebag: Fetching storebag for client type ";

class TelvanedAgentStorebagsTest : public DaemonFixture {
 protected:
  // What a session of that client type is given.
  std::optional<Dictionary> storebagFor(int clientType = kClientType) {
    const auto client = openSession(sessionInfo(clientType));
    return agent().storebagForSession(*sessions().back());
  }
  Dictionary record() { return *cachedStorebags()[kBagName].dictionary(); }
  static StorebagBuilder freshFor(int seconds) { return StorebagBuilder().set(kStorebagRefreshCycle, seconds); }
  // No cache, and a server that fails.
  void givenNoStorebag() {
    givenDefault(kTelvaneDefaultsSuite, kDefaultsStorebagURL, "https://bags.example");
    world.network().answer("https://bags.example", NetworkAnswer::status(500));
    for (const char* line :
         {"loadStorebagFromDisk", "Signature is missing", "Could not fetch storebag for client type 6",
          "fetchAndCacheStorebag: Unable to fetch storebag for client type 6"}) {
      log().expectError(line);
    }
  }
};

TEST_F(TelvanedAgentStorebagsTest, aRequestWithinMaxAgeFetchesNothing) {
  givenStorebag(freshFor(600));
  const auto first = storebagFor();
  EXPECT_TRUE(hasLine(log(), "fetchAndCacheStorebag: Storebag max age: 600 seconds"));
  world.advance(599s);
  EXPECT_EQ(storebagFor(), first);
  EXPECT_EQ(first, StorebagBuilder::section("splunk"));
  EXPECT_TRUE(hasLines(log(), 1, kFetching));
  EXPECT_TRUE(hasLines(log(), 1, "storebagForSession: Cached storebag found for client type 6"));
}

TEST_F(TelvanedAgentStorebagsTest, aRequestAtMaxAgeFetches) {
  givenStorebag(freshFor(600));
  storebagFor();
  world.advance(600s);
  storebagFor();
  EXPECT_TRUE(hasLines(log(), 2, kFetching));
}

TEST_F(TelvanedAgentStorebagsTest, aMaxAgeOf0FetchesOnEveryRequest) {
  givenStorebag(freshFor(0));
  storebagFor();
  storebagFor();
  EXPECT_TRUE(hasLines(log(), 2, kFetching));
}

TEST_F(TelvanedAgentStorebagsTest, aRecordTellsOfTheLastFetch) {
  givenStorebag(freshFor(600));
  storebagFor();
  const Dictionary expected{{kRecordStorebagData, StorebagBuilder::section("splunk")},
                            {kRecordStorebagVersion, "3.1"},
                            {kRecordFetchTime, world.clock().now()},
                            {kRecordFetchState, "Fetch Successful"},
                            {kRecordMaxAge, 600}};
  EXPECT_EQ(record(), expected);
}

TEST_F(TelvanedAgentStorebagsTest, afterAFailedFetchNothingIsFetchedFor900Seconds) {
  givenNoStorebag();
  EXPECT_EQ(storebagFor(), std::nullopt);
  EXPECT_EQ(record()[kRecordFetchState], Value("Fetch Failure"));
  world.advance(899s);
  EXPECT_EQ(storebagFor(), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 1, kFetching));
  EXPECT_TRUE(hasLines(log(), 1,
                       "storebagForSession: Not fetching storebag for client type 6 - must wait 900 seconds between "
                       "attempts"));
  givenStorebag();
  process.files().setModificationDate("~/Library/Caches/telvaned/storebags/media", SimulatedClock::kCalendarStart);
  world.advance(1s);
  EXPECT_TRUE(storebagFor().has_value());
  EXPECT_TRUE(hasLines(log(), 2, kFetching));
}

TEST_F(TelvanedAgentStorebagsTest, afterAFailedFetchTheLastGoodSectionIsServed) {
  givenStorebag(freshFor(60));
  const auto good = storebagFor();
  const Date before = world.clock().now();
  world.advance(61s);
  process.files().place("~/Library/Caches/telvaned/storebags/media", "garbage");
  process.files().setModificationDate("~/Library/Caches/telvaned/storebags/media", before);
  log().expectError("Signature is missing");
  log().expectError("Could not fetch storebag for client type 6");
  log().expectError("Unable to fetch storebag for client type 6");
  EXPECT_EQ(storebagFor(), good);
  world.advance(899s);
  EXPECT_EQ(storebagFor(), good);
  EXPECT_TRUE(hasLines(log(), 2, kFetching));
  world.advance(1s);
  EXPECT_EQ(storebagFor(), good);
  EXPECT_TRUE(hasLines(log(), 3, kFetching));
}

TEST_F(TelvanedAgentStorebagsTest, aFileNewerThanTheLastFetchIsFetchedThoughTheRecordIsFresh) {
  givenStorebag(freshFor(600));
  storebagFor();
  world.advance(10s);
  givenStorebag(freshFor(600).set(kStorebagVersion, "4"));
  storebagFor();
  EXPECT_EQ(record()[kRecordStorebagVersion], Value("4"));
  EXPECT_TRUE(hasLines(log(), 1,
                       "storebagForSession: Override maxAge as disk cache for storebag 'media' was updated: "
                       "modification time '"));
  storebagFor();
  EXPECT_TRUE(hasLines(log(), 2, kFetching));
}

TEST_F(TelvanedAgentStorebagsTest, clientTypesThatShareANameShareOneRecord) {
  givenStorebag(freshFor(600));
  const auto first = storebagFor(6);
  EXPECT_EQ(storebagFor(14), first);
  EXPECT_EQ(storebagFor(15), first);
  EXPECT_TRUE(hasLines(log(), 1, kFetching));
  EXPECT_EQ(cachedStorebags().size(), 1u);
}

TEST_F(TelvanedAgentStorebagsTest, aClientTypeWithoutANameGetsNothing) {
  const auto client = openSession(sessionInfo(3));
  const auto session = sessions()[0];
  EXPECT_EQ(agent().storebagForSession(*session), std::nullopt);
  EXPECT_EQ(agent().storebagVersionForSession(*session), std::nullopt);
  EXPECT_TRUE(hasNoLine(log(), "storebagForSession: Retrieving"));
  log().expectError("fetchAndCacheStorebag: clientType 3 is invalid");
  MonitorLock lock(agent().monitor());
  agent().fetchAndCacheStorebag(3);
}

TEST_F(TelvanedAgentStorebagsTest, theVersionIsTheRecords) {
  const auto client = openSession();
  EXPECT_EQ(agent().storebagVersionForSession(*sessions()[0]), std::nullopt);
  givenStorebag();
  agent().storebagForSession(*sessions()[0]);
  EXPECT_EQ(agent().storebagVersionForSession(*sessions()[0]), String("3.1"));
  EXPECT_TRUE(hasLine(log(), "storebagForSession: Retrieving storebag for session 42 with client type 6"));
}

TEST_F(TelvanedAgentStorebagsTest, sessionsThatStartAtOnceFetchOnce) {
  givenDefault(kTelvaneDefaultsSuite, kDefaultsStorebagURL, "https://bags.example");
  world.network().answer("https://bags.example", NetworkAnswer::ok(freshFor(600).envelope()).after(5s));
  log().expectError("loadStorebagFromDisk");
  const auto first = openSession();
  const auto second = openSession();
  const auto firstAnswer = first->askInPassing(ClientSessionOperation::StartConfig);
  const auto secondAnswer = second->askInPassing(ClientSessionOperation::StartConfig);
  world.advance(6s);
  EXPECT_EQ((*firstAnswer)[0], Value(Array{"splunk"}));
  EXPECT_EQ((*secondAnswer)[0], Value(Array{"splunk"}));
  EXPECT_EQ(world.network().countTo("https://bags.example"), 1u);
}

}  // namespace
}  // namespace telvane::testing
