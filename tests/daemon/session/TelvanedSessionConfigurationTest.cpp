// A session's beginning and end: user infos, start, stop.
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedSessionConfigurationTest : public DaemonFixture {
 protected:
  Dictionary startEvent() {
    const auto events = postedEvents(0, 0);
    EXPECT_EQ(events.size(), 1u);
    return events.empty() ? Dictionary() : events[0];
  }
  Dictionary stopEvent() {
    const auto events = postedEvents(0, 1);
    EXPECT_EQ(events.size(), 1u);
    return events.empty() ? Dictionary() : events[0];
  }
  std::shared_ptr<TelvanedSession> session() { return sessions().back(); }
};

TEST_F(TelvanedSessionConfigurationTest, namesItselfByABase64UUID) {
  const auto client = connect();
  const std::string name = session()->sessionIDString().str();
  EXPECT_EQ(name.size(), 24u);
  EXPECT_TRUE(name.ends_with("==")) << name;
  EXPECT_TRUE(hasLine(log(), "initWithSessionDelegate: Initialized session with UUID " + name));
  EXPECT_TRUE(hasLine(log(), "initWithSessionDelegate: TelvanedSession initWithSessionDelegate:<TelvanedAgent>"));
}

TEST_F(TelvanedSessionConfigurationTest, startsWithTheBackendsAndListsOfItsStorebag) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryEventWhitelist, Array{0, 7, 8})));
  const auto client = openSession();
  const Answer answer = client->start();
  EXPECT_EQ(answer[0], Value(Array{"splunk"}));
  EXPECT_EQ(answer[1], Value(Array{0, 7, 8}));
  EXPECT_EQ(answer[2], Value());
  EXPECT_TRUE(hasLine(log(), "startConfigWithCompletionHandler: Starting configuration for session 42"));
  EXPECT_TRUE(hasLine(log(), "createBackendsWithStorebag: Creating backends for session 42"));
}

TEST_F(TelvanedSessionConfigurationTest, withoutAStorebagAnswersNothingAndMayTryAgain) {
  log().allowErrors();
  givenDefault(kTelvaneDefaultsSuite, kDefaultsStorebagURL, "https://bags.example");
  const auto client = openSession();
  const Answer answer = client->start();
  ASSERT_TRUE(answer.values.has_value());
  for (size_t i = 0; i < 3; ++i) EXPECT_EQ(answer[i], Value());
  EXPECT_TRUE(hasNoLine(log(), "createBackendsWithStorebag"));
  world.advance(std::chrono::seconds(1));
  givenStorebag();
  EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
}

TEST_F(TelvanedSessionConfigurationTest, startingTwiceAnswersAgainAndChangesNothing) {
  givenStorebag();
  const auto client = startSession();
  log().expectError("startConfigWithCompletionHandler: has been called more than once for session 42");
  EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
  EXPECT_TRUE(hasLines(log(), 1, "createBackendsWithStorebag: Creating backends"));
  client->flush();
  EXPECT_EQ(postedEvents(0, 0).size(), 1u);
}

TEST_F(TelvanedSessionConfigurationTest, aSessionThatNeverStartsSendsNeitherStartNorStop) {
  givenStorebag();
  auto client = openSession();
  client->close();
  world.advance(std::chrono::minutes(5));
  EXPECT_TRUE(postedEvents().empty());
  EXPECT_TRUE(hasLine(log(), "dealloc: TelvanedSession dealloc: 42"));
  EXPECT_TRUE(hasNoLine(log(), "internalSendMessage"));
}

TEST_F(TelvanedSessionConfigurationTest, eachSessionSendsOneStartAndOneStop) {
  givenStorebag();
  auto client = startSession();
  EXPECT_TRUE(hasLine(log(), "internalSendMessage: Sent internal message (method:0 respCode:0)"));
  client->close();
  EXPECT_TRUE(hasLine(log(), "internalSendMessage: Sent internal message (method:0 respCode:1)"));
  EXPECT_EQ(startEvent()[kEventLocale], Value("US"));
  EXPECT_EQ(stopEvent()[kEventStorebagVersion], Value("3.1"));
}

TEST_F(TelvanedSessionConfigurationTest, aCustomersStartTellsLocaleAndAutomaticTimeAlone) {
  givenStorebag();
  givenDefault(kTimedDefaultsSuite, kDefaultsAutomaticTimeZoneEnabled, false);
  const auto client = startSession();
  client->flush();
  const Dictionary event = startEvent();
  EXPECT_THAT(event, HasEntry("Locale", "US"));
  EXPECT_EQ(event[kEventAutomaticTimeSet].booleanValue(), false);
  EXPECT_TRUE(event.contains(kEventAutomaticTimeSet));
  for (const char* key : {"SerialNum", "Version", "Build", "Hardware", "Product", "ReportVers"}) {
    EXPECT_FALSE(event.contains(key)) << key;
  }
}

TEST_F(TelvanedSessionConfigurationTest, automaticTimeIsAssumedAndAMissingCountryUnknown) {
  givenStorebag();
  const auto client = openSession();
  process.locale().setCountryCode(std::nullopt);
  client->start();
  // Without a country the backend reports nothing, but the start message waits for nobody.
  EXPECT_TRUE(hasLine(log(), "internalSendMessage: Sent internal message (method:0 respCode:0)"));
  process.locale().setCountryCode(String("US"));
  const auto second = startSession();
  second->flush();
  EXPECT_TRUE(startEvent()[kEventAutomaticTimeSet].booleanValue());
}

TEST_F(TelvanedSessionConfigurationTest, anInternalBuildsStartTellsOfTheDevice) {
  givenInternalBuild();
  process.deviceAnswers().remove("HWModelStr");
  givenSection(StorebagBuilder::section("splunk"));
  const auto client = startSession();
  client->flush();
  const Dictionary event = startEvent();
  EXPECT_THAT(event, HasEntry("SerialNum", "SIM0001"));
  EXPECT_THAT(event, HasEntry("Version", "12.5"));
  EXPECT_THAT(event, HasEntry("Build", "6.1.0-13"));
  EXPECT_THAT(event, HasEntry("Hardware", "Unknown"));
  EXPECT_THAT(event, HasEntry("Product", "simulated"));
  EXPECT_THAT(event, HasEntry("ReportVers", "1.0"));
}

TEST_F(TelvanedSessionConfigurationTest, aStopTellsWhetherTheClientFinished) {
  givenStorebag();
  auto client = startSession();
  client->tell(ClientSessionOperation::FinishSessionGracefully, {});
  EXPECT_TRUE(hasLine(log(), "finishSessionGracefully: Session 42 has been finished gracefully"));
  client->close();
  EXPECT_TRUE(stopEvent()[kEventGracefulTermination].booleanValue());
}

TEST_F(TelvanedSessionConfigurationTest, aStopOfAClientThatJustWentSaysSo) {
  givenStorebag();
  auto client = startSession();
  client->close();
  const Dictionary stop = stopEvent();
  EXPECT_TRUE(stop.contains(kEventGracefulTermination));
  EXPECT_FALSE(stop[kEventGracefulTermination].booleanValue());
}

TEST_F(TelvanedSessionConfigurationTest, withoutAStorebagVersionTheStopHasHealthFiguresOnly) {
  givenStorebag(StorebagBuilder().set(kStorebagVersion, Value()));
  auto client = startSession();
  client->close();
  const Dictionary stop = stopEvent();
  EXPECT_FALSE(stop.contains(kEventStorebagVersion));
  EXPECT_FALSE(stop.contains(kEventGracefulTermination));
  EXPECT_TRUE(stop.contains("StorebagsCount"));
}

TEST_F(TelvanedSessionConfigurationTest, aUserInfoThatWasNotAskedForIsUsedAllTheSame) {
  log().expectError("setSessionInfo: Configure session: user info provided without requiring it");
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoRequireUserInfo, false);
  const auto client = openSession(info);
  EXPECT_EQ(session()->userInfo(), Value(userInfo()));
}

TEST_F(TelvanedSessionConfigurationTest, theSameNamesTakeTheHelperAnewButRefreshNoStates) {
  givenStorebag();
  const auto client = startSession();
  Dictionary same = userInfo();
  same.set("extra", 1);
  client->fetchStates(same);
  EXPECT_EQ(session()->userInfo(), Value(same));
  EXPECT_TRUE(hasLines(log(), 2, "Incrementing usage of shared connectivity helper"));
  EXPECT_TRUE(hasLines(log(), 1, "Decrementing usage count of shared connectivity helper"));
  EXPECT_TRUE(hasNoLine(log(), "receivedUserInfo: Received new user info"));
  client->send(7);
  client->flush();
  EXPECT_THAT(postedEvents(7, 1).at(0), HasEntry("extra", 1));
}

TEST_F(TelvanedSessionConfigurationTest, anotherNameRefreshesTheStates) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryClient, "other")));
  const auto client = openSession();
  EXPECT_EQ(client->start()[0], Value(Array()));
  EXPECT_EQ(client->fetchStates(userInfo("other"))[0], Value(Array{"splunk"}));
  EXPECT_TRUE(hasLines(log(), 1, "receivedUserInfo: Received new user info for session 42"));
}

TEST_F(TelvanedSessionConfigurationTest, aMissingNameAlwaysCountsAsChanged) {
  const auto client = openSession();
  const Dictionary halfNamed{{kTelvaneUserInfoClientName, "player"}};
  client->fetchStates(halfNamed);
  client->fetchStates(halfNamed);
  EXPECT_TRUE(hasLines(log(), 2, "receivedUserInfo: Received new user info for session 42"));
}

TEST_F(TelvanedSessionConfigurationTest, noUserInfoKeepsTheOldOneWhereItIsRequired) {
  const auto client = openSession();
  client->fetchStates();
  EXPECT_EQ(session()->userInfo(), Value(userInfo()));
  EXPECT_TRUE(hasNoLine(log(), "Releasing shared connectivity helper"));
}

TEST_F(TelvanedSessionConfigurationTest, noUserInfoTakesTheOldOneAwayWhereItIsNotRequired) {
  log().expectError("user info provided without requiring it");
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoRequireUserInfo, false);
  const auto client = openSession(info);
  client->fetchStates();
  EXPECT_EQ(session()->userInfo(), Value());
  EXPECT_TRUE(hasLine(log(), "Releasing shared connectivity helper for userInfoKey player:movies"));
}

TEST_F(TelvanedSessionConfigurationTest, withoutAnyUserInfoNothingHappens) {
  const auto client = openSession(sessionInfo(), Value());
  client->fetchStates();
  EXPECT_TRUE(hasNoLine(log(), "receivedUserInfo"));
  EXPECT_TRUE(hasNoLine(log(), "shared connectivity helper"));
}

TEST_F(TelvanedSessionConfigurationTest, withoutAnEnabledBackendTheHelperStaysInactive) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntrySamplingThreshold, Value())));
  const auto disabled = startSession();
  EXPECT_TRUE(hasNoLine(log(), "NSURLSession created and activated"));
}

}  // namespace
}  // namespace telvane::testing
