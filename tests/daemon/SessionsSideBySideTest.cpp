// What sessions of one daemon must not do to each other, and what a parent owes those below it while they run.
#include "interfaces/AgentKeys.h"
#include "interfaces/HealthKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class SessionsSideBySideTest : public DaemonFixture {
 protected:
  // From now on bags leave their sessions disabled, unless a parent enables them.
  void givenDisablingStorebag() {
    world.advance(1s);
    givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntrySamplingThreshold, Value())));
  }
  std::unique_ptr<DaemonClient> parent;
  std::unique_ptr<DaemonClient> child;

  void TearDown() override {
    child.reset();
    parent.reset();
  }
};

TEST_F(SessionsSideBySideTest, aChildThatItsParentEnablesReportsUnderNamesOfItsOwn) {
  givenStorebag();
  parent = startSession(sessionInfoIn("a", 0, 1), userInfo("player", "movies"));
  givenDisablingStorebag();
  child = openSession(sessionInfoIn("a", 1, 2), userInfo("other", "movies"));
  EXPECT_EQ(child->start()[0], Value(Array{"splunk"}));
  child->send(7);
  const Answer flushed = child->flush();
  EXPECT_EQ(flushed.error, std::nullopt);
  EXPECT_EQ(flushed[1], Value()) << "an error of the flush";
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
}

TEST_F(SessionsSideBySideTest, aRunningChildFollowsItsParentWhenThatIsEnabledLater) {
  givenDisablingStorebag();
  child = startSession(sessionInfoIn("a", 1, 2), userInfo("other", "movies"));
  child->send(7, 1);
  child->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 0u);
  world.advance(1s);
  givenStorebag();
  parent = startSession(sessionInfoIn("a", 0, 1));
  child->send(7, 2);
  child->flush();
  EXPECT_EQ(postedEvents(7, 2).size(), 1u);
  EXPECT_EQ(postedEvents(7, 1).size(), 0u);
}

TEST_F(SessionsSideBySideTest, aRunningChildFollowsItsParentWhenThatIsDisabledLater) {
  givenStorebag();
  child = startSession(sessionInfoIn("a", 1, 2));
  child->send(7, 1);
  child->flush();
  ASSERT_EQ(postedEvents(7, 1).size(), 1u);
  givenDisablingStorebag();
  parent = startSession(sessionInfoIn("a", 0, 1));
  child->send(7, 2);
  child->flush();
  EXPECT_EQ(postedEvents(7, 2).size(), 0u);
}

TEST_F(SessionsSideBySideTest, userInfoWithoutANameGivesUpNoHelperOfOthers) {
  givenStorebag();
  for (const Value& name : {Value(""), Value(7)}) {
    auto nameless = startSession(sessionInfo(), Dictionary{{kTelvaneUserInfoClientName, name}});
    for (int i = 0; i < 3; ++i) openSession(sessionInfo(), Dictionary{{Key("other"), "x"}})->close();
    world.advance(1min);
    EXPECT_EQ(process.transactions().open(), 1) << "one session is there, " << fmt::format("{}", name);
    nameless->send(7);
    EXPECT_EQ(nameless->flush()[1], Value()) << "an error of the flush";
    nameless->close();
    world.advance(1min);
    EXPECT_EQ(process.transactions().open(), 0) << fmt::format("{}", name);
  }
  EXPECT_EQ(postedEvents(7, 1).size(), 2u);
}

TEST_F(SessionsSideBySideTest, aSessionThatIsFiledAnewKeepsItsSharedDataWhateverOthersLeaveBehind) {
  parent = openSession(sessionInfoIn("a", 0, 1));
  parent->tell(ClientSessionOperation::UpdateSharedDataForKey, {"k", 1});
  const auto mover = openSession(sessionInfoIn("0", 0, 2));
  for (int i = 1; agent().daemonStatus()[kStatusHierarchies].integerValue() < 66; ++i) {
    ASSERT_LT(i, 100);
    mover->setSessionInfo(sessionInfoIn(std::to_string(i).c_str(), 0, 2), userInfo());
  }
  parent->setSessionInfo(sessionInfoIn("a", 0, 1), userInfo());
  EXPECT_EQ(agent().sharedDataForSession(*sessions()[0]), (Dictionary{{Key("k"), 1}}));
}

TEST_F(SessionsSideBySideTest, theStopMessageCountsTheMemoryOfOtherSessionsToo) {
  givenStorebag();
  child = startSession();
  child->send(7, 1, {{Key("k"), std::string(5000, 'x')}});
  const uint64_t waiting = sessions()[0]->batchedEventsSize();
  EXPECT_GT(waiting, 5000u);
  startSession()->close();
  const std::vector<Dictionary> stops = postedEvents(0, 1);
  ASSERT_EQ(stops.size(), 1u);
  EXPECT_GE(stops[0][kHealthCalculatedMemoryUsage].integerValue(),
            stops[0][kHealthStorebagsSize].integerValue() + static_cast<int64_t>(waiting));
}

}  // namespace
}  // namespace telvane::testing
