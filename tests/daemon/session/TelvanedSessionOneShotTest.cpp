// Messages sent without a configured session.
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedSessionOneShotTest : public DaemonFixture {
 protected:
  std::string statusOf(const Answer& answer) { return std::string(answer[0].text()); }
  // Sends on a connection that has told nothing else.
  Answer sendOne(Value info, Value user, Value payload = {}) {
    client = connect();
    return client->sendOneMessage(std::move(info), std::move(user), std::move(payload));
  }
  void TearDown() override { client.reset(); }

  std::unique_ptr<DaemonClient> client;
};

TEST_F(TelvanedSessionOneShotTest, isSentAndFlushedWhenTheConnectionGoes) {
  givenStorebag();
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo(), Dictionary{{Key("k"), 1}})), "finished");
  EXPECT_TRUE(postedEvents().empty());
  client->close();
  ASSERT_EQ(postedEvents(7, 2).size(), 1u);
  EXPECT_THAT(postedEvents(7, 2)[0], HasEntry("k", 1));
  EXPECT_TRUE(postedEvents(0, 0).empty());
  EXPECT_EQ(postedEvents(0, 1).size(), 1u);
  EXPECT_TRUE(hasLine(log(), "sendMessageWithSessionInfo: Sending message with session info for session 42"));
  EXPECT_TRUE(hasLine(log(), "sendOneMessageWithSessionInfo: Sending single message with sessionID 42"));
}

TEST_F(TelvanedSessionOneShotTest, withoutAPayloadIsSentEmpty) {
  givenStorebag();
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "finished");
  client->close();
  ASSERT_EQ(postedEvents(7, 2).size(), 1u);
  EXPECT_FALSE(postedEvents(7, 2)[0].contains(kEventSerialNum));
}

TEST_F(TelvanedSessionOneShotTest, onInternalBuildsCarriesTheSerialNumber) {
  givenInternalBuild();
  givenStorebag(StorebagBuilder().set(kEnvironmentInternal, StorebagBuilder::section("splunk")));
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "finished");
  client->close();
  ASSERT_EQ(postedEvents(7, 2).size(), 1u) << log().text();
  EXPECT_THAT(postedEvents(7, 2)[0], HasEntry("SerialNum", "SIM0001"));
}

TEST_F(TelvanedSessionOneShotTest, onInternalBuildsWithoutASerialNumberSaysSo) {
  givenInternalBuild();
  process.deviceAnswers().remove(DeviceAnswers::kSerialNumber.view());
  givenStorebag(StorebagBuilder().set(kEnvironmentInternal, StorebagBuilder::section("splunk")));
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "finished");
  client->close();
  ASSERT_EQ(postedEvents(7, 2).size(), 1u) << log().text();
  EXPECT_THAT(postedEvents(7, 2)[0], HasEntry("SerialNum", "Unknown"));
}

TEST_F(TelvanedSessionOneShotTest, withoutAUserInfoFinishesAndSendsNothing) {
  givenStorebag();
  log().expectError("sendOneMessageWithSessionInfo: userInfo must be present and valid!!! Aborting method...");
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), Value())), "finished");
  client->close();
  EXPECT_TRUE(postedEvents().empty());
}

TEST_F(TelvanedSessionOneShotTest, withoutASessionIDIsRefused) {
  log().expectError("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
  Dictionary info = sessionInfo();
  info.remove(kTelvaneSessionInfoSessionID.view());
  EXPECT_EQ(statusOf(sendOne(info, userInfo())), "Could not retrieve identifiers from sessionInfo");
}

TEST_F(TelvanedSessionOneShotTest, withoutAClientTypeIsCutOff) {
  log().expectError("missing clientType in its sessionInfo ");
  Dictionary info = sessionInfo();
  info.remove(kTelvaneSessionInfoClientType.view());
  const std::string status = statusOf(sendOne(info, userInfo()));
  EXPECT_TRUE(status.starts_with("Exceeded maximum active reporting session limit for userInfo='{")) << status;
  EXPECT_TRUE(client->isInvalidated());
}

TEST_F(TelvanedSessionOneShotTest, isFiledInItsHierarchyButNeitherAggregatedNorGivenWhatThatShares) {
  givenStorebag();
  const auto root = startSession(sessionInfoIn("a", 0, 1), userInfo(), true);
  root->tell(ClientSessionOperation::UpdateSharedDataForKey, {"shared", 1});
  const size_t before = root->aggregated().size();
  EXPECT_EQ(statusOf(sendOne(sessionInfoIn("a", 1, 2), userInfo(), Dictionary{{Key("k"), 1}})), "finished");
  EXPECT_EQ(root->aggregated().size(), before);
  EXPECT_TRUE(
      hasLine(log(), "updateCorrelatedSessions: Adding session 2 to list for hierarchyToken a with hierarchyLevel 1"));
  client->close();
  ASSERT_EQ(postedEvents(7, 2).size(), 1u);
  EXPECT_THAT(postedEvents(7, 2)[0], HasEntry("k", 1));
  EXPECT_FALSE(postedEvents(7, 2)[0].contains("shared"));
  EXPECT_EQ(sessions().size(), 1u);
}

TEST_F(TelvanedSessionOneShotTest, withATokenThatIsNoDictionaryIsSentOnItsOwn) {
  givenStorebag();
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoHierarchyToken, "a");
  EXPECT_EQ(statusOf(sendOne(info, userInfo())), "finished");
  EXPECT_EQ(sessions()[0]->hierarchyToken(), std::nullopt);
  client->close();
  EXPECT_EQ(postedEvents(7, 2).size(), 1u);
}

TEST_F(TelvanedSessionOneShotTest, inTheMidstOfASessionLosesNothingThatWaits) {
  givenStorebag();
  client = startSession();
  client->send(8);
  EXPECT_EQ(statusOf(client->sendOneMessage(sessionInfo(), userInfo())), "finished");
  EXPECT_EQ(statusOf(client->sendOneMessage(sessionInfo(), userInfo())), "finished");
  client->close();
  EXPECT_EQ(postedEvents(8, 1).size(), 1u);
  EXPECT_EQ(postedEvents(7, 2).size(), 2u);
  EXPECT_TRUE(hasLines(log(), 1, "got incremented to")) << "a session counts once";
}

TEST_F(TelvanedSessionOneShotTest, withoutAStorebagIsRefused) {
  log().allowErrors();
  givenDefault(kTelvaneDefaultsSuite, kDefaultsStorebagURL, "https://bags.example");
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "storebag not available");
}

TEST_F(TelvanedSessionOneShotTest, withoutBackendsFinishesWithAnErrorLine) {
  givenSection(Dictionary());
  log().expectError("sendOneMessageWithSessionInfo: No backends available to send single message");
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "finished");
}

TEST_F(TelvanedSessionOneShotTest, overTheLimitIsRefusedAndCutOff) {
  std::vector<std::unique_ptr<DaemonClient>> five;
  givenStorebag();
  for (int i = 0; i < 5; ++i) five.push_back(openSession());
  log().expectError("exceeds number of allowed active connections for clientType 6");
  const std::string status = statusOf(sendOne(sessionInfo(), userInfo()));
  EXPECT_TRUE(status.starts_with("Exceeded maximum active reporting session limit for userInfo='{")) << status;
  EXPECT_TRUE(client->isInvalidated());
  EXPECT_TRUE(postedEvents(7, 2).empty());
}

TEST_F(TelvanedSessionOneShotTest, respectsTheEventLists) {
  givenSection(sectionOf({{"splunk", clientWith(kClientEntryEventWhitelist, Array{0, 8})},
                          {"gonzo", clientWith(kClientEntryEventBlacklist, Array{7})}}));
  EXPECT_EQ(statusOf(sendOne(sessionInfo(), userInfo())), "finished");
  client->close();
  EXPECT_TRUE(postedEvents(7, 2).empty());
  EXPECT_TRUE(hasLine(log(),
                      "sendOneMessageWithSessionInfo: Dropping event with category 7 as it is not whitelisted "
                      "for backend splunk"));
  EXPECT_TRUE(hasLine(log(),
                      "sendOneMessageWithSessionInfo: Dropping event with category 7 as it is blacklisted for "
                      "backend gonzo"));
}

}  // namespace
}  // namespace telvane::testing
