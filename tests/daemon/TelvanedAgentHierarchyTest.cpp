// Sessions that belong together.
#include "interfaces/AgentKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedAgentHierarchyTest : public DaemonFixture {
 protected:
  // Opens one session per level in the hierarchy "a"; session IDs count from 1.
  void givenLevels(std::initializer_list<int> levels, std::initializer_list<size_t> aggregating = {}) {
    for (const int level : levels) {
      const size_t index = clients.size();
      const bool aggregates = std::find(aggregating.begin(), aggregating.end(), index) != aggregating.end();
      clients.push_back(
          openSession(sessionInfoIn("a", level, static_cast<uint32_t>(index + 1)), userInfo(), aggregates));
    }
    kept = sessions();
  }
  // Which of the kept sessions it is, counted from 1; 0 for none.
  size_t numberOf(const TelvanedSession* session) const {
    for (size_t i = 0; i < kept.size(); ++i) {
      if (kept[i].get() == session) return i + 1;
    }
    return 0;
  }
  size_t parentOf(size_t number) { return numberOf(agent().parentSessionForChild(*kept[number - 1])); }
  std::string idOf(size_t number) const { return kept[number - 1]->sessionIDString().str(); }
  std::string chainOf(size_t number) {
    const auto chain = agent().parentSessionIDStringForSession(*kept[number - 1]);
    return chain.has_value() ? chain->str() : "none";
  }
  size_t aggregatorOf(size_t number) {
    return numberOf(agent().getAncestorWithAggregatorForSession(*kept[number - 1]));
  }
  void close(size_t number) { clients[number - 1]->close(); }

  std::vector<std::unique_ptr<DaemonClient>> clients;
  std::vector<std::shared_ptr<TelvanedSession>> kept;

  void TearDown() override {
    kept.clear();
    clients.clear();
  }
};

TEST_F(TelvanedAgentHierarchyTest, theFirstSessionOfALevelStandsForItsSiblings) {
  givenLevels({0, 1, 1, 2});
  EXPECT_EQ(parentOf(2), 1u);
  EXPECT_EQ(parentOf(3), 1u);
  EXPECT_EQ(parentOf(4), 2u);
  EXPECT_TRUE(hasLine(log(), "parentSessionForChild: Checking hierarchyToken 'a' for session 4"));
}

TEST_F(TelvanedAgentHierarchyTest, aTopSessionHasNeitherParentNorChain) {
  givenLevels({0, 1});
  EXPECT_EQ(parentOf(1), 0u);
  EXPECT_EQ(chainOf(1), "none");
  EXPECT_TRUE(hasNoLine(log(), "hierarchyToken 'a' for session 1"));
}

TEST_F(TelvanedAgentHierarchyTest, aSessionWithoutAHierarchyHasNeither) {
  const auto client = openSession();
  EXPECT_TRUE(hasLine(log(),
                      "updateCorrelatedSessions: Session 42 has no correlated sessions as it is a standalone "
                      "session"));
  EXPECT_EQ(agent().parentSessionForChild(*sessions()[0]), nullptr);
  EXPECT_EQ(agent().parentSessionIDStringForSession(*sessions()[0]), std::nullopt);
}

TEST_F(TelvanedAgentHierarchyTest, aTokenOfMoreThanAKilobyteCountsAsNone) {
  constexpr size_t kMost = 1024;
  log().expectError(
      "setSessionInfo: the hierarchy token of session 42 has more than 1024 bytes. It counts as standalone");
  const auto longest = openSession(sessionInfoIn(std::string(kMost, 't').c_str(), 0));
  const auto tooLong = openSession(sessionInfoIn(std::string(kMost + 1, 't').c_str(), 0));
  EXPECT_EQ(sessions()[0]->hierarchyToken()->size(), kMost);
  EXPECT_EQ(sessions()[1]->hierarchyToken(), std::nullopt);
  EXPECT_EQ(agent().daemonStatus()[kStatusHierarchies], Value(1));
}

TEST_F(TelvanedAgentHierarchyTest, aChainNamesAllAncestorsFromTheTop) {
  givenLevels({0, 1, 2, 3});
  EXPECT_EQ(chainOf(2), idOf(1));
  EXPECT_EQ(chainOf(4), idOf(1) + "." + idOf(2) + "." + idOf(3));
  EXPECT_TRUE(hasLine(log(), "parentSessionIDStringForSession: Checking hierarchyToken 'a' for session 4"));
}

TEST_F(TelvanedAgentHierarchyTest, withoutItsParentASessionHasNoChain) {
  givenLevels({0, 1, 2});
  close(2);
  EXPECT_EQ(parentOf(3), 0u);
  EXPECT_EQ(chainOf(3), "none");
  EXPECT_TRUE(
      hasLine(log(), "parentSessionForChild: Unable to find session with hierarchy of 1 for hierarchyToken 'a'"));
  EXPECT_TRUE(hasLine(log(),
                      "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): "
                      "incomplete parentSessionID is '(null)'"));
}

TEST_F(TelvanedAgentHierarchyTest, aGapFurtherUpLeavesThePartialChain) {
  givenLevels({0, 1, 2});
  close(1);
  EXPECT_EQ(parentOf(3), 2u);
  EXPECT_EQ(chainOf(3), idOf(2));
  EXPECT_TRUE(hasLine(log(), "incomplete parentSessionID is '" + idOf(2) + "'"));
}

TEST_F(TelvanedAgentHierarchyTest, anUnfiledSessionIsAnErrorOfItsParentLookUp) {
  givenLevels({0, 1});
  close(2);
  log().expectError("parentSessionForChild: ERROR: Session 2 not found for hierarchyToken a");
  EXPECT_EQ(parentOf(2), 0u);
  EXPECT_EQ(chainOf(2), "none");
  EXPECT_TRUE(hasLine(log(), "parentSessionIDStringForSession: Session 2 not found for hierarchyToken a"));
}

TEST_F(TelvanedAgentHierarchyTest, aHierarchyWithoutSessionsIsAnError) {
  givenLevels({1});
  close(1);
  log().expectError("parentSessionForChild: ERROR: No sessions found for hierarchyToken a");
  log().expectError("parentSessionIDStringForSession: ERROR: No sessions found for hierarchyToken a");
  EXPECT_EQ(parentOf(1), 0u);
  EXPECT_EQ(chainOf(1), "none");
}

TEST_F(TelvanedAgentHierarchyTest, filingTwiceAddsOnce) {
  givenLevels({0, 1});
  agent().updateCorrelatedSessions(*kept[1]);
  log().clear();
  agent().updateDownstreamSessions(*kept[0]);
  EXPECT_TRUE(hasLines(
      log(), 1, "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session 2"));
}

TEST_F(TelvanedAgentHierarchyTest, aSessionThatIsFiledAgainStandsBehindItsSiblings) {
  givenLevels({0, 1, 1, 2});
  EXPECT_EQ(parentOf(4), 2u);
  agent().updateCorrelatedSessions(*kept[1]);
  EXPECT_EQ(parentOf(4), 3u);
}

TEST_F(TelvanedAgentHierarchyTest, aSessionThatChangesItsTokenLeavesTheOldOne) {
  givenLevels({0, 1});
  clients[0]->setSessionInfo(sessionInfoIn("b", 0, 1), userInfo());
  EXPECT_EQ(parentOf(2), 0u);
  EXPECT_TRUE(hasLine(log(),
                      "updateCorrelatedSessions: Adding session 1 to list for hierarchyToken b with "
                      "hierarchyLevel 0"));
}

TEST_F(TelvanedAgentHierarchyTest, theEmptyOldHierarchyStaysInTheRegistry) {
  givenLevels({0});
  clients[0]->setSessionInfo(sessionInfoIn("b", 0, 1), userInfo());
  const auto next = connect();
  EXPECT_TRUE(hasLine(log(), "as it has proper entitlement, 1(2) connections."));
}

TEST_F(TelvanedAgentHierarchyTest, aHierarchyThatWasLeftGoesWithItsSharedDataWhenItsSessionEnds) {
  givenLevels({0});
  clients[0]->tell(ClientSessionOperation::UpdateSharedDataForKey, {"k", 1});
  clients[0]->setSessionInfo(sessionInfoIn("b", 0, 1), userInfo());
  close(1);
  givenLevels({0});
  EXPECT_EQ(agent().sharedDataForSession(*kept[0]), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 2, "as it has proper entitlement, 0(0) connections."));
}

TEST_F(TelvanedAgentHierarchyTest, aSessionThatGivesItsHierarchyUpLeavesNothingBehind) {
  givenLevels({0});
  clients[0]->tell(ClientSessionOperation::UpdateSharedDataForKey, {"k", 1});
  clients[0]->setSessionInfo(sessionInfo(), userInfo());
  close(1);
  givenLevels({0});
  EXPECT_EQ(agent().sharedDataForSession(*kept[0]), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 2, "as it has proper entitlement, 0(0) connections."));
}

TEST_F(TelvanedAgentHierarchyTest, aSessionThatKeepsMovingFillsNoRegistry) {
  givenLevels({0, 1});
  constexpr int kMoves = 1000;
  for (int i = 0; i < kMoves; ++i) {
    clients[1]->setSessionInfo(sessionInfoIn(std::to_string(i).c_str(), 1, 2), userInfo());
  }
  EXPECT_LT(agent().daemonStatus()["hierarchies"].integerValue(), 100);
  EXPECT_EQ(parentOf(2), 0u);
  clients[1]->setSessionInfo(sessionInfoIn("a", 1, 2), userInfo());
  EXPECT_EQ(parentOf(2), 1u) << "a hierarchy with a session stays";
}

TEST_F(TelvanedAgentHierarchyTest, aThousandSessionsOfOneHierarchyLeaveOnlyItsRoot) {
  givenStorebag();
  givenLevels({0}, {0});
  clients[0]->start();
  constexpr int kSessions = 1000;
  for (int i = 1; i <= kSessions; ++i) {
    auto child = startSession(sessionInfoIn("a", 1 + i % 3, static_cast<uint32_t>(i)), userInfo(), true);
    child->tell(ClientSessionOperation::UpdateSharedDataForKey, {"last", i});
    child->send(7);
  }
  EXPECT_EQ(sessions().size(), 1u);
  EXPECT_EQ(agent().sharedDataForSession(*kept[0]), (Dictionary{{Key("last"), kSessions}}));
  EXPECT_EQ(agent().daemonStatus()["hierarchies"], Value(1));
  const auto isEvent = [](const Array& call) { return call[2] == Value(7); };
  EXPECT_EQ(std::count_if(clients[0]->aggregated().begin(), clients[0]->aggregated().end(), isEvent), kSessions);
  EXPECT_EQ(postedEvents(7, 1).size(), static_cast<size_t>(kSessions));
  kept.clear();
  close(1);
  EXPECT_EQ(agent().daemonStatus()["hierarchies"], Value(0));
}

TEST_F(TelvanedAgentHierarchyTest, theHighestAggregatingAncestorWins) {
  givenLevels({0, 1, 2, 3}, {1, 2});
  EXPECT_EQ(aggregatorOf(4), 2u);
  EXPECT_EQ(aggregatorOf(3), 2u);
  EXPECT_EQ(aggregatorOf(2), 0u);
  EXPECT_EQ(aggregatorOf(1), 0u);
}

TEST_F(TelvanedAgentHierarchyTest, aSiblingThatDoesNotStandForItsLevelDoesNotAggregate) {
  givenLevels({0, 1, 1, 2}, {2});
  EXPECT_EQ(aggregatorOf(4), 0u);
}

TEST_F(TelvanedAgentHierarchyTest, aSkippedLevelBreaksTheChainButNotTheAggregation) {
  givenLevels({0, 2}, {0});
  EXPECT_EQ(parentOf(2), 0u);
  EXPECT_EQ(chainOf(2), "none");
  EXPECT_EQ(aggregatorOf(2), 1u);
}

TEST_F(TelvanedAgentHierarchyTest, anAncestorThatComesLaterJoinsTheChainsBelow) {
  givenStorebag();
  givenLevels({1, 0, 2});
  clients[2]->start();
  clients[2]->send(7);
  clients[1]->start();
  clients[2]->flush();
  EXPECT_EQ(postedEvents(7, 1).at(0)["_sessionID"], Value(idOf(2) + "." + idOf(1) + "." + idOf(3)));
}

TEST_F(TelvanedAgentHierarchyTest, anAggregatorThatClosesLetsItsOwnClientHearOfNothingMore) {
  givenStorebag();
  givenLevels({1, 2}, {0});
  clients[0]->start();
  clients[1]->start();
  clients[1]->send(7);
  const size_t before = clients[0]->aggregated().size();
  EXPECT_EQ(clients[0]->aggregated().back()[2], Value(7));
  clients.push_back(startSession(sessionInfoIn("a", 0, 3), userInfo(), true));
  clients[1]->send(7);
  EXPECT_EQ(clients[0]->aggregated().size(), before + 1) << "the end of aggregation";
  EXPECT_EQ(clients[2]->aggregated().back()[2], Value(7));
}

TEST_F(TelvanedAgentHierarchyTest, onlyTheTopmostAggregatorStaysOpenAfterARefresh) {
  givenStorebag();
  givenLevels({0, 1, 2}, {0, 1, 2});
  clients[0]->start();
  EXPECT_TRUE(kept[0]->hasAggregator());
  EXPECT_FALSE(kept[1]->hasAggregator());
  EXPECT_FALSE(kept[2]->hasAggregator());
  EXPECT_TRUE(hasLine(log(),
                      "updateDownstreamSessions: Updating combined session ID and syncing reporting states for "
                      "session 3"));
  const Array theEnd{Value(), 0.0, 0, 0, Value()};
  ASSERT_EQ(clients[1]->aggregated().size(), 1u);
  EXPECT_EQ(clients[1]->aggregated()[0], theEnd);
}

TEST_F(TelvanedAgentHierarchyTest, aTopSessionWithAnAggregatorHearsItsDescendantsAndItself) {
  givenStorebag();
  givenLevels({0, 1, 2}, {0});
  for (const auto& client : clients) client->start();
  const size_t before = clients[0]->aggregated().size();
  clients[1]->send(7);
  clients[2]->send(8);
  clients[0]->send(9);
  std::vector<int64_t> heard;
  for (const Array& call : clients[0]->aggregated()) heard.push_back(call[2].integerValue());
  heard.erase(heard.begin(), heard.begin() + static_cast<std::ptrdiff_t>(before));
  EXPECT_THAT(heard, ::testing::ElementsAre(7, 8, 9));
}

TEST_F(TelvanedAgentHierarchyTest, anAggregatorStaysOpenWhereNobodyAboveAggregates) {
  givenStorebag();
  givenLevels({0, 1, 2}, {2});
  for (const auto& client : clients) client->start();
  EXPECT_TRUE(kept[2]->hasAggregator());
  clients[2]->send(7);
  EXPECT_EQ(clients[2]->aggregated().back()[2], Value(7));
  const Array theEnd{Value(), 0.0, 0, 0, Value()};
  EXPECT_THAT(clients[2]->aggregated(), ::testing::Not(::testing::Contains(theEnd)));
}

TEST_F(TelvanedAgentHierarchyTest, aRefreshReachesThoseBelowAlone) {
  givenStorebag();
  givenLevels({0, 1, 1, 2});
  clients[1]->start();
  EXPECT_TRUE(hasLines(log(), 1, "updateDownstreamSessions: Updating combined session ID"));
  EXPECT_TRUE(hasLine(log(), "and syncing reporting states for session 4"));
}

TEST_F(TelvanedAgentHierarchyTest, aRefreshBelowAnAggregatingAncestorClosesItsOwnAggregator) {
  givenStorebag();
  givenLevels({0, 1, 2}, {0, 1, 2});
  clients[1]->start();
  EXPECT_TRUE(kept[0]->hasAggregator());
  EXPECT_FALSE(kept[1]->hasAggregator());
  EXPECT_FALSE(kept[2]->hasAggregator());
}

TEST_F(TelvanedAgentHierarchyTest, aTokenThatIsNoDictionaryMakesNoHierarchy) {
  for (const Value& token : {Value("a"), Value(1), Value(Array{"a"}), Value(true)}) {
    Dictionary info = sessionInfo();
    info.set(kTelvaneSessionInfoHierarchyToken, token);
    const auto client = openSession(info);
    EXPECT_EQ(sessions().back()->hierarchyToken(), std::nullopt) << description(token);
    EXPECT_EQ(sessions().back()->hierarchyLevel(), 0) << description(token);
  }
}

TEST_F(TelvanedAgentHierarchyTest, aTokenWhoseTextIsMissingMakesNoHierarchy) {
  for (const Value& text : {Value(), Value(5), Value(Array())}) {
    Dictionary token{{kTelvaneHierarchyTokenLevel, 1}};
    token.set(kTelvaneHierarchyTokenTokenID, text);
    Dictionary info = sessionInfo();
    info.set(kTelvaneSessionInfoHierarchyToken, token);
    const auto client = openSession(info);
    EXPECT_EQ(sessions().back()->hierarchyToken(), std::nullopt) << description(text);
    EXPECT_EQ(agent().parentSessionForChild(*sessions().back()), nullptr) << description(text);
  }
}

TEST_F(TelvanedAgentHierarchyTest, anAbsurdLevelCostsNoMoreThanTheSessionsThereAre) {
  givenLevels({INT32_MAX, 0, INT32_MIN});
  EXPECT_EQ(chainOf(1), "none");
  EXPECT_EQ(aggregatorOf(1), 0u);
  EXPECT_EQ(parentOf(3), 0u);
  EXPECT_EQ(chainOf(3), "none");
  EXPECT_EQ(aggregatorOf(3), 0u);
}

TEST_F(TelvanedAgentHierarchyTest, anAggregatorBelowLevel0SilencesNobody) {
  givenStorebag();
  givenLevels({0, 1, -1}, {0, 2});
  for (const auto& client : clients) client->start();
  EXPECT_TRUE(kept[0]->hasAggregator());
  clients[1]->send(7);
  EXPECT_EQ(clients[0]->aggregated().back()[2], Value(7));
}

TEST_F(TelvanedAgentHierarchyTest, anAbsurdLevelReportsAndAggregatesLikeAnyOther) {
  givenStorebag();
  givenLevels({INT32_MIN, 0, INT32_MAX, INT32_MAX - 1}, {1, 2});
  for (const auto& client : clients) EXPECT_EQ(client->start()[0], Value(Array{"splunk"}));
  for (const auto& client : clients) client->send(7);
  for (const auto& client : clients) client->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 4u);
  EXPECT_EQ(aggregatorOf(3), 2u);
  EXPECT_EQ(parentOf(3), 4u);
  EXPECT_EQ(chainOf(3), idOf(4));
  EXPECT_FALSE(kept[2]->hasAggregator());
}

}  // namespace
}  // namespace telvane::testing
