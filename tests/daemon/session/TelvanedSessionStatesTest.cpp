// What a session tells its client of its backends, and how a child follows its parent.
#include "backends/TelvaneBackend.h"
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

class TelvanedSessionStatesTest : public DaemonFixture {
 protected:
  // What a session over these client entries, one per collector, is told when it starts.
  Answer startWith(std::initializer_list<Dictionary> entries) {
    Dictionary section;
    int number = 0;
    for (const Dictionary& entry : entries) {
      section.addEntriesFrom(StorebagBuilder::section(("splunk" + std::to_string(++number)).c_str(), entry));
    }
    givenSection(section);
    client = openSession();
    return client->start();
  }
  static Dictionary whitelisting(Array categories) { return clientWith(kClientEntryEventWhitelist, categories); }
  static Dictionary blacklisting(Array categories) { return clientWith(kClientEntryEventBlacklist, categories); }
  static Dictionary disabled() { return clientWith(kClientEntrySamplingThreshold, Value()); }
  static std::set<int64_t> setOf(const Value& list) {
    std::set<int64_t> result;
    if (list.array() == nullptr) return {-1};
    for (const Value& value : *list.array()) result.insert(value.integerValue());
    return result;
  }
  static Dictionary sectionWithURL(const char* name, Value url) {
    Dictionary profile{{kProfileClients, Array{Value(StorebagBuilder::permissiveClient())}}};
    profile.set(kProfileDisplayURL, std::move(url));
    Dictionary section;
    section.set(name, profile);
    return section;
  }
  std::string displayURL(Dictionary section) {
    givenSection(std::move(section));
    client = startSession();
    return std::string(client->ask(ClientSessionOperation::FetchDisplayURL)[0].text());
  }
  void TearDown() override { client.reset(); }

  std::unique_ptr<DaemonClient> client;
};

using Categories = std::set<int64_t>;

TEST_F(TelvanedSessionStatesTest, namesTheEnabledBackendsInTheOrderOfTheBag) {
  EXPECT_EQ(startWith({StorebagBuilder::permissiveClient(), disabled(), StorebagBuilder::permissiveClient()})[0],
            Value(Array{"splunk1", "splunk3"}));
  for (const char* name : {"splunk1", "splunk2", "splunk3"}) {
    EXPECT_TRUE(hasLine(log(), std::string(name) + ": client found")) << "each decides, whatever the others did";
  }
}

TEST_F(TelvanedSessionStatesTest, theWhitelistIsTheUnion) {
  EXPECT_EQ(setOf(startWith({whitelisting({1, 2}), whitelisting({2, 3})})[1]), (Categories{1, 2, 3}));
  EXPECT_EQ(client->fetchStates(userInfo())[1].array()->size(), 3u);
}

TEST_F(TelvanedSessionStatesTest, anEnabledCollectorWithoutAWhitelistTakesAll) {
  EXPECT_EQ(startWith({whitelisting({1, 2}), StorebagBuilder::permissiveClient()})[1], Value());
}

TEST_F(TelvanedSessionStatesTest, aDisabledCollectorWithoutAWhitelistDoesNot) {
  const Answer answer = startWith({whitelisting({1, 2}), disabled()});
  EXPECT_EQ(setOf(answer[1]), (Categories{1, 2}));
  EXPECT_EQ(answer[0], Value(Array{"splunk1"}));
}

TEST_F(TelvanedSessionStatesTest, theBlacklistIsTheIntersection) {
  EXPECT_EQ(setOf(startWith({blacklisting({1, 2}), blacklisting({2, 3})})[2]), (Categories{2}));
}

TEST_F(TelvanedSessionStatesTest, numbersThatAreEqualToBackendsAreEqualInTheLists) {
  constexpr int64_t kSevenAndMore = (int64_t{1} << 32) + 7;
  EXPECT_EQ(startWith({whitelisting({7}), whitelisting({kSevenAndMore, 7.5, "7"})})[1].array()->size(), 1u);
  world.advance(std::chrono::seconds(1));
  const Answer answer = startWith({blacklisting({7}), blacklisting({kSevenAndMore})});
  EXPECT_EQ(setOf(answer[2]), (Categories{7}));
}

TEST_F(TelvanedSessionStatesTest, aCollectorWithoutABlacklistDoesNotCount) {
  EXPECT_EQ(setOf(startWith({StorebagBuilder::permissiveClient(), blacklisting({5})})[2]), (Categories{5}));
}

TEST_F(TelvanedSessionStatesTest, withoutBlacklistsNoCategoryIsBarred) {
  EXPECT_EQ(startWith({StorebagBuilder::permissiveClient()})[2], Value());
}

TEST_F(TelvanedSessionStatesTest, withoutBackendsAllThreeAreAbsent) {
  client = openSession();
  const Answer answer = client->fetchStates(userInfo());
  ASSERT_TRUE(answer.values.has_value());
  for (size_t i = 0; i < 3; ++i) EXPECT_EQ(answer[i], Value());
  EXPECT_TRUE(hasLine(log(), "fetchStatesWithUserInfo: Fetching states for session 42"));
}

TEST_F(TelvanedSessionStatesTest, listsCountWhateverTheStateOfTheirBackend) {
  Dictionary disabledWithWhitelist = whitelisting({1, 2});
  disabledWithWhitelist.set(kClientEntrySamplingThreshold, Value());
  Answer answer = startWith({disabledWithWhitelist, whitelisting({2, 3})});
  EXPECT_EQ(answer[0], Value(Array{"splunk2"}));
  EXPECT_EQ(setOf(answer[1]), (Categories{1, 2, 3}));

  Dictionary disabledWithBlacklist = blacklisting({1, 2});
  disabledWithBlacklist.set(kClientEntrySamplingThreshold, Value());
  world.advance(std::chrono::seconds(1));
  answer = startWith({disabledWithBlacklist, blacklisting({2, 3})});
  EXPECT_EQ(answer[0], Value(Array{"splunk2"}));
  EXPECT_EQ(setOf(answer[2]), (Categories{2}));
}

TEST_F(TelvanedSessionStatesTest, anEmptySectionIsAsGoodAsNone) {
  givenSection(Dictionary());
  client = openSession();
  const Answer answer = client->start();
  ASSERT_TRUE(answer.values.has_value());
  for (size_t i = 0; i < 3; ++i) EXPECT_EQ(answer[i], Value()) << i;
}

TEST_F(TelvanedSessionStatesTest, aChildTakesItsParentsStatesAndSampling) {
  givenSection(StorebagBuilder::section("splunk", disabled()));
  const auto parent = startSession(sessionInfoIn("a", 0, 1));
  world.advance(std::chrono::seconds(1));
  givenSection(StorebagBuilder::section("splunk"));
  client = openSession(sessionInfoIn("a", 1, 2));
  EXPECT_EQ(client->start()[0], Value(Array()));
  EXPECT_TRUE(hasLine(log(),
                      "HTTPSPostBackend(syncReportingStates): splunk: state and sampling rate updated to 1, "
                      "0.00%"));
}

// The parent is one that is not asked for consent; what lies below it reports with it, since states come as they are.
TEST_F(TelvanedSessionStatesTest, aChildFollowsItsParentInConsentToo) {
  process.consent().set(false);
  givenStorebag();
  client = openSession(sessionInfoIn("b", 0, 3));
  EXPECT_EQ(client->start()[0], Value(Array())) << "on its own it is disabled";
  Dictionary unasked = sessionInfoIn("a", 0, 1);
  unasked.set(kTelvaneSessionInfoRequireUserInfo, false);
  log().expectError("setSessionInfo: Configure session: user info provided without requiring it");
  const auto parent = startSession(unasked);
  client = openSession(sessionInfoIn("a", 1, 2));
  EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
}

TEST_F(TelvanedSessionStatesTest, aSampledOutChildStaysOut) {
  givenSection(StorebagBuilder::section("splunk"));
  const auto parent = startSession(sessionInfoIn("a", 0, 1));
  world.advance(std::chrono::seconds(1));
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntrySamplingThreshold, 0.0)));
  client = openSession(sessionInfoIn("a", 1, 2));
  EXPECT_EQ(client->start()[0], Value(Array()));
  EXPECT_TRUE(hasNoLine(log(), "state and sampling rate updated"));
}

TEST_F(TelvanedSessionStatesTest, aChildKeepsWhatItsParentDoesNotHave) {
  givenSection(StorebagBuilder::section("gonzo"));
  const auto parent = startSession(sessionInfoIn("a", 0, 1));
  world.advance(std::chrono::seconds(1));
  givenSection(StorebagBuilder::section("splunk"));
  client = openSession(sessionInfoIn("a", 1, 2));
  EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
  EXPECT_TRUE(hasLine(log(),
                      "HTTPSPostBackend(syncReportingStates): Parent session  does not have backend splunk. "
                      "Current state '2' kept for child session"));
}

TEST_F(TelvanedSessionStatesTest, aChildWithoutItsParentKeepsItsStatesAndSaysSo) {
  givenStorebag();
  client = openSession(sessionInfoIn("a", 2, 2));
  EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
  EXPECT_TRUE(hasLines(log(), 1,
                       "syncReportingStates: child session 2 (backend splunk) with hierarchy 2 is missing "
                       "its parent"));
}

TEST_F(TelvanedSessionStatesTest, aTopSessionMissesNoParent) {
  givenStorebag();
  client = startSession(sessionInfoIn("a", 0));
  EXPECT_TRUE(hasNoLine(log(), "is missing its parent"));
}

TEST_F(TelvanedSessionStatesTest, aChildsEventsCarryTheCombinedSessionID) {
  givenStorebag();
  const auto parent = startSession(sessionInfoIn("a", 0, 1));
  client = startSession(sessionInfoIn("a", 1, 2));
  const auto both = sessions();
  const std::string combined = both[0]->sessionIDString().str() + "." + both[1]->sessionIDString().str();
  EXPECT_TRUE(hasLine(
      log(), "updateCombinedSessionID: Updating combined session ID '" + combined + "' for session 2 backends"));
  client->send(7);
  client->flush();
  EXPECT_EQ(postedEvents(7, 1).at(0)[kEventSessionID], Value(combined));
}

TEST_F(TelvanedSessionStatesTest, theDisplayURLIsTheCollectors) {
  EXPECT_EQ(displayURL(sectionWithURL("splunk", "https://show.example")), "https://show.example");
  EXPECT_TRUE(hasLine(log(), "fetchDisplayURL: Fetching display URL for session 42"));
}

TEST_F(TelvanedSessionStatesTest, theFirstCollectorThatHasADisplayURLIsAsked) {
  Dictionary section = sectionWithURL("splunk", Value());
  section.addEntriesFrom(sectionWithURL("gonzo", "https://gonzo.example"));
  section.addEntriesFrom(sectionWithURL("other_splunk", "https://other.example"));
  EXPECT_EQ(displayURL(section), "https://other.example");
}

TEST_F(TelvanedSessionStatesTest, gonzoIsNextForTheDisplayURL) {
  Dictionary section = sectionWithURL("splunk", Value());
  section.addEntriesFrom(sectionWithURL("gonzo", "https://gonzo.example"));
  EXPECT_EQ(displayURL(section), "https://gonzo.example");
}

TEST_F(TelvanedSessionStatesTest, withoutOneTheDisplayURLIsNotAvailable) {
  EXPECT_EQ(displayURL(sectionWithURL("splunk", Value())), "URL not available");
  const auto unstarted = openSession();
  EXPECT_EQ(unstarted->ask(ClientSessionOperation::FetchDisplayURL)[0], Value("URL not available"));
}

}  // namespace
}  // namespace telvane::testing
