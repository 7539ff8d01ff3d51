// How many sessions a client type may have, and what the sessions of a hierarchy share.
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedAgentLimitsTest : public DaemonFixture {
 protected:
  std::vector<std::unique_ptr<DaemonClient>> openMany(int count, int clientType) {
    std::vector<std::unique_ptr<DaemonClient>> clients;
    for (int i = 0; i < count; ++i) clients.push_back(openSession(sessionInfo(clientType)));
    return clients;
  }
  static constexpr auto kShare = ClientSessionOperation::UpdateSharedDataForKey;
};

TEST_F(TelvanedAgentLimitsTest, fiveSessionsOfATypeAreAcceptedAndTheSixthIsCutOff) {
  auto five = openMany(5, 7);
  for (const auto& client : five) EXPECT_FALSE(client->isInvalidated());
  log().expectError(
      "isActiveClientLimitReachedForSession: session 0 exceeds number of allowed active connections for clientType 7. "
      "Session terminated...");
  const auto sixth = openSession(sessionInfo(7));
  EXPECT_TRUE(sixth->isInvalidated());
  EXPECT_TRUE(hasLine(log(),
                      "isActiveClientLimitReachedForSession: active session count for clientType 7 got "
                      "incremented to 6"));
  EXPECT_TRUE(hasLine(log(), "invalidateReportingSession: active session count for clientType 7 got decremented to 5"));
  EXPECT_TRUE(hasLines(log(), 5, "setSessionInfo: Configuring session 42"));
  five.pop_back();
  EXPECT_FALSE(openSession(sessionInfo(7))->isInvalidated());
}

TEST_F(TelvanedAgentLimitsTest, clientTypesDoNotCountAgainstEachOther) {
  const auto sevens = openMany(5, 7);
  EXPECT_FALSE(openSession(sessionInfo(11))->isInvalidated());
}

TEST_F(TelvanedAgentLimitsTest, aSessionIsCountedOnce) {
  const auto client = openSession();
  const auto session = sessions()[0];
  EXPECT_FALSE(agent().isActiveClientLimitReachedForSession(*session, session->sessionInfo()));
  client->setSessionInfo(sessionInfo());
  EXPECT_TRUE(hasLines(log(), 1, "got incremented to"));
}

// The refused ones are counted until they have gone, which none has here.
TEST_F(TelvanedAgentLimitsTest, aCrowdOfRefusedSessionsLetsNobodyInAndLeavesTheCountRight) {
  constexpr size_t kCrowd = 600;
  std::vector<std::unique_ptr<DaemonClient>> crowd;
  for (size_t i = 0; i < kCrowd; ++i) crowd.push_back(connect());
  log().expectError("exceeds number of allowed active connections for clientType 7");
  size_t accepted = 0;
  for (const auto& session : sessions()) {
    if (!agent().isActiveClientLimitReachedForSession(*session, sessionInfo(7))) ++accepted;
  }
  EXPECT_EQ(accepted, 5u);
  world.runUntilIdle();
  ASSERT_EQ(sessions().size(), 5u);
  EXPECT_TRUE(openSession(sessionInfo(7))->isInvalidated());
  crowd.clear();
  const auto five = openMany(5, 7);
  for (const auto& client : five) EXPECT_FALSE(client->isInvalidated());
}

TEST_F(TelvanedAgentLimitsTest, whatARefusedSessionSentBehindItsInfoIsNotServed) {
  givenStorebag();
  const auto five = openMany(5, kClientType);
  log().expectError("exceeds number of allowed active connections for clientType 6");
  const auto sixth = connect();
  sixth->askInPassing(ClientSessionOperation::SetSessionInfo, {sessionInfo(), userInfo(), Value(), false});
  const auto start = sixth->askInPassing(ClientSessionOperation::StartConfig);
  world.runUntilIdle();
  EXPECT_FALSE(start->values.has_value());
  EXPECT_TRUE(hasNoLine(log(), "createBackendsWithStorebag"));
}

TEST_F(TelvanedAgentLimitsTest, aSessionInfoWithoutAClientTypeEndsTheSession) {
  log().expectError("isActiveClientLimitReachedForSession: session 0 missing clientType in its sessionInfo ");
  Dictionary info = sessionInfo();
  info.remove(kTelvaneSessionInfoClientType.view());
  EXPECT_TRUE(openSession(info)->isInvalidated());
  EXPECT_TRUE(hasNoLine(log(), "setSessionInfo: Configuring session"));
}

TEST_F(TelvanedAgentLimitsTest, aSessionThatSkipsItsInfoEndsAtItsFirstQuestionForStates) {
  log().expectError("missing clientType in its sessionInfo ");
  const auto client = connect();
  const Answer answer = client->fetchStates(userInfo());
  ASSERT_TRUE(answer.values.has_value());
  EXPECT_EQ(answer[0], Value());
  EXPECT_TRUE(client->isInvalidated());
}

TEST_F(TelvanedAgentLimitsTest, sharedDataIsMergedAndItsKeysCanBeRemoved) {
  const auto parent = openSession(sessionInfoIn("a", 0));
  const auto child = openSession(sessionInfoIn("a", 1));
  const auto other = openSession(sessionInfoIn("b", 0));
  parent->tell(ClientSessionOperation::UpdateSharedDataWithDictionary, {Dictionary{{Key("x"), 1}, {Key("y"), 1}}});
  child->tell(kShare, {"y", 2});
  child->tell(kShare, {"z", 3});
  parent->tell(kShare, {"x", Value()});
  const auto kept = sessions();
  const Dictionary expected{{Key("y"), 2}, {Key("z"), 3}};
  EXPECT_EQ(agent().sharedDataForSession(*kept[0]), expected);
  EXPECT_EQ(agent().sharedDataForSession(*kept[1]), expected);
  EXPECT_EQ(agent().sharedDataForSession(*kept[2]), std::nullopt);
}

TEST_F(TelvanedAgentLimitsTest, removingAKeyThatNobodySharesMakesNothing) {
  const auto client = openSession(sessionInfoIn("a", 0));
  client->tell(kShare, {"x", Value()});
  EXPECT_EQ(agent().sharedDataForSession(*sessions()[0]), std::nullopt);
}

// All of it stands in every event.
TEST_F(TelvanedAgentLimitsTest, whatAHierarchySharesIsBounded) {
  const char* line = "updateSharedDataForSession: session 42 would share more than 1048576 bytes with its hierarchy";
  log().expectError(line);
  const std::string most(900 << 10, 'x');
  const auto client = openSession(sessionInfoIn("a", 0));
  const auto keys = [this] {
    const std::optional<Dictionary> shared = agent().sharedDataForSession(*sessions()[0]);
    std::string text;
    for (const DictionaryEntry& entry : shared.value_or(Dictionary())) text += entry.key.view();
    return text;
  };
  client->tell(kShare, {"a", Value(most)});
  client->tell(kShare, {"b", Value(most)});
  client->tell(ClientSessionOperation::UpdateSharedDataWithDictionary,
               {Dictionary{{Key("c"), 1}, {Key("d"), Array{Value(Dictionary{{Key("e"), Value(most)}})}}}});
  EXPECT_EQ(keys(), "a") << "all of an update, or nothing";
  EXPECT_TRUE(hasLines(log(), 1, line)) << "one line per burst";
  client->tell(kShare, {"a", Value(most.substr(1))});
  client->tell(kShare, {"a", 1});
  client->tell(kShare, {"b", Value(Data::copyOf(most))});
  EXPECT_EQ(keys(), "ab") << "what is replaced gives way";
  client->tell(kShare, {"c", Value(most)});
  EXPECT_TRUE(hasLines(log(), 2, line));
  client->tell(kShare, {"b", Value()});
  client->tell(kShare, {"c", Value(most)});
  EXPECT_EQ(keys(), "ac") << "and so does what is removed";
  const auto other = openSession(sessionInfoIn("b", 0));
  other->tell(kShare, {"own", Value(most)});
  EXPECT_TRUE(agent().sharedDataForSession(*sessions()[1])->contains("own")) << "each hierarchy has room of its own";
}

// Small entries count too, and so do their keys.
TEST_F(TelvanedAgentLimitsTest, noNumberOfSmallEntriesIsSharedWithoutABound) {
  log().expectError("would share more than 1048576 bytes with its hierarchy");
  const auto client = openSession(sessionInfoIn("a", 0));
  constexpr int kUpdates = 300;
  for (int update = 0; update < kUpdates; ++update) {
    Dictionary entries;
    for (int n = 0; n < 100; ++n) entries.set(String(fmt::format("a key of its own {} {}", update, n)), n);
    client->tell(ClientSessionOperation::UpdateSharedDataWithDictionary, {entries});
  }
  const size_t shared = agent().sharedDataForSession(*sessions()[0])->size();
  EXPECT_GT(shared, 10000u);
  EXPECT_LT(shared, 30000u);
}

TEST_F(TelvanedAgentLimitsTest, aSessionWithoutAHierarchySharesNothing) {
  givenStorebag();
  const auto client = startSession();
  client->tell(kShare, {"shared", 1});
  EXPECT_EQ(agent().sharedDataForSession(*sessions()[0]), std::nullopt);
  client->send(7);
  client->flush();
  ASSERT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_FALSE(postedEvents(7, 1)[0].contains("shared"));
}

TEST_F(TelvanedAgentLimitsTest, sharedDataTravelsInEveryEventOfTheHierarchy) {
  givenStorebag();
  const auto parent = startSession(sessionInfoIn("a", 0));
  const auto child = startSession(sessionInfoIn("a", 1));
  parent->tell(kShare, {"shared", 1});
  child->send(7);
  child->flush();
  ASSERT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_THAT(postedEvents(7, 1)[0], HasEntry("shared", 1));
}

}  // namespace
}  // namespace telvane::testing
