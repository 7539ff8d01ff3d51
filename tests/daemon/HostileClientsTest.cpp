// Clients that call whatever they like whenever they like: nothing of them is left behind, and nobody else notices.
#include "interfaces/AgentKeys.h"
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"
#include "tests/support/SeededGenerator.h"
#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

using Operation = ClientSessionOperation;

class HostileClientsTest : public DaemonFixture {
 protected:
  HostileClientsTest() {
    log().allowErrors();
    givenStorebag();
  }
  // Makes some call, right or wrong, without waiting for what comes of it.
  static void callAnything(DaemonClient& client, SeededGenerator& chance) {
    const char* token = std::array{"a", "b", "victim"}[chance.below(3)];
    const auto info = sessionInfoIn(token, static_cast<int>(chance.below(4)) - 1, 666);
    const Dictionary message{{kTelvaneMessageParametersCategory, 666}, {kTelvaneMessageParametersType, 1}};
    switch (chance.below(9)) {
      case 0:
        client.askInPassing(Operation::SetSessionInfo, {info, userInfo(), Value(), chance.below(2) == 0});
        break;
      case 1:
        client.askInPassing(Operation::SetSessionInfo, {sessionInfo(), Value(), Value(), false});
        break;
      case 2:
        client.askInPassing(Operation::StartConfig);
        break;
      case 3:
        client.askInPassing(Operation::FetchStates, {userInfo(chance.below(2) == 0 ? "one" : "other")});
        break;
      case 4:
        client.askInPassing(Operation::SendMessageWithDictionary, {message});
        break;
      case 5:
        client.askInPassing(Operation::FlushMessages);
        break;
      case 6:
        client.askInPassing(Operation::UpdateSharedDataForKey, {"evil", 1});
        break;
      case 7:
        client.askInPassing(Operation::SendMessageWithSessionInfo, {info, userInfo(), 666, 1, Value()});
        break;
      default:
        client.askInPassing(Operation::FinishSessionGracefully);
        break;
    }
  }
  Value status(const Key& key) { return agent().daemonStatus()[key]; }
};

TEST_F(HostileClientsTest, callsInAnyOrderLeaveNothingBehindAndHarmNobody) {
  constexpr int kCalls = 40;
  forEachSeed(40, [this](uint64_t seed) {
    SeededGenerator chance(seed);
    Dictionary info = sessionInfoIn("bystander", 0, 1);
    info.set(kTelvaneSessionInfoClientType, 14);
    const auto bystander = startSession(info);
    const size_t before = postedEvents(7, 1).size();
    {
      std::vector<std::unique_ptr<DaemonClient>> hostile;
      for (int i = 0; i < 3; ++i) hostile.push_back(connect());
      for (int i = 0; i < kCalls; ++i) {
        callAnything(*hostile[chance.below(hostile.size())], chance);
        if (chance.below(4) == 0) world.runUntilIdle();
      }
      bystander->send(7);
    }
    bystander->flush();
    EXPECT_EQ(postedEvents(7, 1).size(), before + 1);
    EXPECT_FALSE(postedEvents(7, 1).back().contains("evil"));
    EXPECT_EQ(postedEvents(7, 1).back()[kEventSessionID], Value(sessions().at(0)->sessionIDString()));
    EXPECT_EQ(status(kStatusSessions), Value(1));
    EXPECT_EQ(status(kStatusHierarchies), Value(1));
    EXPECT_EQ(status(kStatusClientTypes), Value(Dictionary{{Key("14 STREAMING"), 1}}));
  });
  EXPECT_EQ(status(kStatusSessions), Value(0));
  world.advance(std::chrono::seconds(31));
  EXPECT_EQ(status(kStatusConnectivityHelpers), Value(0));
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_EQ(process.transactions().surplusEnds(), 0);
}

}  // namespace
}  // namespace telvane::testing
