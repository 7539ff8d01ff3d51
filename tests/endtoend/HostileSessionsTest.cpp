// Clients of a hierarchy that stop, die, lie or call back at the wrong moment: nobody else waits for them or loses
// anything by them.
#include <gmock/gmock.h>
#include <signal.h>

#include <cmath>
#include <limits>

#include "interfaces/AgentKeys.h"
#include "interfaces/SessionKeys.h"
#include "tests/endtoend/HierarchyFixture.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class HostileSessionsTest : public HierarchyFixture {
 protected:
  // A top session that aggregates, and waits.
  void startRoot(const std::string& name, const char* reaction = "") {
    ClientScript script;
    script.openAggregating(infoIn("t", 0), userInfo(name.c_str()), reaction).configure().wait();
    startUntilWaiting(script, name);
  }
  // A session below it that sends so many events each time when it is told to go on.
  void startChild(const std::string& name, int level, int rounds, int count) {
    ClientScript script;
    script.open(infoIn("t", level), userInfo(name.c_str())).configure().wait();
    for (int round = 0; round < rounds; ++round) {
      script.sendMany(kCategory, name, count, round * count).flush().wait();
    }
    startUntilWaiting(script, name);
  }
  void goOn(const std::string& name) {
    const size_t flushed = timesSaid(name, "flushed: ok");
    client(name).writeLine();
    EXPECT_TRUE(says(name, "flushed: ok", flushed + 1)) << output(name) << instance().daemonLog();
  }
};

// 30 MB for a client that reads nothing, of which the daemon keeps 24 MiB.
TEST_F(HostileSessionsTest, anAggregatorThatIsStoppedHoldsNobodyUp) {
  constexpr int kRounds = 15;
  constexpr int kPerRound = 100;
  constexpr int kLast = kRounds * kPerRound;
  constexpr int kTextSize = 20'000;
  startDaemon();
  startRoot("root");
  ClientScript script;
  script.open(infoIn("t", 1), userInfo("child")).configure().wait();
  for (int round = 0; round < kRounds; ++round) {
    script.sendMany(kCategory, "child", kPerRound, round * kPerRound, kTextSize).flush();
  }
  script.wait().sendMany(kCategory, "child", 1, kLast).flush().wait();
  startUntilWaiting(script, "child");

  client("root").stop();
  client("child").writeLine();
  EXPECT_TRUE(says("child", "waiting", 2)) << output("child");
  EXPECT_EQ(timesSaid("child", "flushed: ok"), static_cast<size_t>(kRounds));
  expectEachOnce("child", kLast);
  startChild("bystander", 1, 1, 5);
  goOn("bystander");
  expectEachOnce("bystander", 5);
  EXPECT_EQ(status()[kStatusSessions], Value(4));

  client("root").signal(SIGCONT);
  EXPECT_TRUE(eventually([this] {
    return instance().daemonLogHas("were dropped, because 24 MiB waited for it already");
  })) << instance().daemonLog();
  client("child").writeLine();
  EXPECT_TRUE(eventually([this] {
    const Numbers numbers = heard("root", "child");
    return !numbers.empty() && numbers.back() == kLast;
  }));
  const Numbers numbers = heard("root", "child");
  EXPECT_TRUE(std::is_sorted(numbers.begin(), numbers.end()));
  EXPECT_EQ(std::adjacent_find(numbers.begin(), numbers.end()), numbers.end()) << "heard twice";
  EXPECT_LT(numbers.size(), static_cast<size_t>(kLast)) << "what waits is bounded";
  EXPECT_GT(numbers.size(), static_cast<size_t>(kLast / 2)) << "but not needlessly";
  endAll();
  stopDaemon();
}

TEST_F(HostileSessionsTest, aDaemonThatEndsDoesNotWaitForAStoppedAggregator) {
  startDaemon();
  startRoot("root");
  startChild("child", 1, 1, 10);
  client("root").stop();
  goOn("child");
  stopDaemon();
  EXPECT_EQ(numbersFrom("child"), upTo(10));
  killClient("root");
}

TEST_F(HostileSessionsTest, whenAnAggregatorDiesItsChildrenGoOnAndTheNextOneTakesOver) {
  startDaemon();
  startRoot("root");
  startChild("child", 1, 3, 20);
  startChild("grandchild", 2, 3, 20);
  for (const char* name : {"child", "grandchild"}) goOn(name);
  for (const char* name : {"child", "grandchild"}) EXPECT_TRUE(hears("root", name, 20)) << name;
  client("child").writeLine();
  client("grandchild").writeLine();
  killClient("root");
  for (const char* name : {"child", "grandchild"}) EXPECT_TRUE(says(name, "flushed: ok", 2)) << instance().daemonLog();
  EXPECT_TRUE(comesToHave(2, 1));
  startRoot("heir");
  for (const char* name : {"child", "grandchild"}) {
    goOn(name);
    EXPECT_TRUE(hears("heir", name, 20)) << name;
    expectEachOnce(name, 60);
  }
  endAll();
  stopDaemon();
  for (const char* name : {"child", "grandchild"}) {
    EXPECT_EQ(numbersFrom(name), upTo(60)) << name;
    const Numbers numbers = heard("heir", name);
    EXPECT_EQ(numbers.size(), 20u) << name;
    EXPECT_EQ(numbers.front(), 40) << name;
  }
}

TEST_F(HostileSessionsTest, anAggregationBlockMaySendAndFlush) {
  constexpr int kCount = 30;
  startDaemon();
  startRoot("root", "send");
  startChild("child", 1, 1, kCount);
  goOn("child");
  EXPECT_TRUE(hears("root", "child", kCount));
  EXPECT_TRUE(hears("root", "child", kCount, 30)) << "its own aggregator is the topmost, so it hears itself";
  expectEachOnce("child", kCount);
  endAll();
  stopDaemon();
  EXPECT_EQ(eventsFrom("child", 30).size(), static_cast<size_t>(kCount));
  EXPECT_EQ(heard("root", "child", 30), upTo(kCount));
}

TEST_F(HostileSessionsTest, anAggregationBlockMayLetItsSessionGo) {
  startDaemon();
  startRoot("root", "let go");
  startChild("child", 1, 2, 10);
  goOn("child");
  EXPECT_TRUE(comesToHave(1, 1)) << instance().daemonLog();
  goOn("child");
  expectEachOnce("child", 20);
  endAll();
  stopDaemon();
}

TEST_F(HostileSessionsTest, anAggregationBlockThatThrowsHearsNoMore) {
  startDaemon();
  startRoot("root", "throw");
  startChild("child", 1, 2, 10);
  for (int round = 0; round < 2; ++round) goOn("child");
  expectEachOnce("child", 20);
  EXPECT_THAT(heard("root", "child"), ElementsAre(0));
  endAll();
  stopDaemon();
}

TEST_F(HostileSessionsTest, aClientThatEndsAndGoesOnAllTheSameHarmsNobody) {
  startDaemon();
  startRoot("root");
  ClientScript script;
  const auto info = [](int level) { return infoIn("t", level, kOtherClientType); };
  script.open(info(1), userInfo("odd")).flush().fetchStates(Value(7)).configure().configure();
  script.sendMany(kCategory, "odd", 5).fetchStates(Value());
  script.sendOneShot(info(-1), userInfo("odd"), kCategory, 1, Dictionary{{"from", "shot"}}).flush().letGo();
  script.open(info(1), userInfo("again")).configure().openAggregating(info(0), userInfo("again")).configure();
  startUntilWaiting(script.sendMany(kCategory, "again", 5).flush().wait(), "odd");
  startChild("child", 1, 1, 10);
  goOn("child");
  EXPECT_TRUE(hears("root", "child", 10));
  for (const auto& [from, count] : {std::pair("odd", 5), std::pair("again", 5), std::pair("child", 10)}) {
    expectEachOnce(from, count);
  }
  EXPECT_TRUE(eventually([this] { return eventsFrom("shot").size() == 1; })) << instance().daemonLog();
  endAll();
  EXPECT_TRUE(comesToHave(0, 0));
  stopDaemon();
}

TEST_F(HostileSessionsTest, hierarchyTokensOfAnyShapeHarmNobody) {
  startDaemon();
  startRoot("root");
  startChild("child", 1, 2, 5);
  goOn("child");
  const auto levelled = [](Value level) {
    Dictionary token{{kTelvaneHierarchyTokenTokenID, "t"}};
    token.set(kTelvaneHierarchyTokenLevel, std::move(level));
    return Value(token);
  };
  const auto named = [](Value name) {
    Dictionary token{{kTelvaneHierarchyTokenLevel, 1}};
    token.set(kTelvaneHierarchyTokenTokenID, std::move(name));
    return Value(token);
  };
  const std::vector<Value> tokens = {levelled(std::numeric_limits<int32_t>::max()),
                                     levelled(std::numeric_limits<int32_t>::min()),
                                     levelled(std::numeric_limits<int64_t>::max()),
                                     levelled(std::numeric_limits<uint64_t>::max()),
                                     levelled(-1),
                                     levelled(std::nan("")),
                                     levelled(1e300),
                                     levelled("one"),
                                     levelled(Value()),
                                     named(7),
                                     named(Array{"t"}),
                                     named(Data::copyOf("t")),
                                     named(""),
                                     named(std::string(100'000, 't')),
                                     named(Value()),
                                     Value("t"),
                                     Value(Array{levelled(1)})};
  int number = 0;
  for (const Value& token : tokens) {
    // Types in turn, because what has ended may still be counted for a moment.
    constexpr std::array kTypes = {11, 13, 20};
    const std::string from = "odd" + std::to_string(number);
    ClientScript script;
    script.openAggregating(infoWithToken(token, kTypes[static_cast<size_t>(number++) % kTypes.size()]), userInfo());
    script.configure().sendMany(kCategory, from, 1);
    EXPECT_THAT(run(script.flush()), HasSubstr("flushed: ok")) << number << instance().daemonLog();
    expectEachOnce(from, 1);
  }
  goOn("child");
  expectEachOnce("child", 10);
  EXPECT_TRUE(hears("root", "child", 10));
  EXPECT_TRUE(comesToHave(2, 1));
  endAll();
  stopDaemon();
}

// Each victim is killed when it has said so many lines, which falls into any step of what it does meanwhile.
TEST_F(HostileSessionsTest, clientsKilledAtRandomMomentsLeaveNothingBehind) {
  constexpr uint64_t kSeed = 20261121;
  constexpr int kVictims = 16;
  constexpr int kRounds = 6;
  SeededGenerator chance(kSeed);
  startDaemon();
  ClientScript bystander;
  bystander.open(infoIn("b", 0, kOtherClientType), userInfo("bystander")).configure().wait();
  for (int n = 0; n < kVictims; ++n) {
    bystander.sendMany(kCategory, "bystander", 1, n).flush().wait();
  }
  startUntilWaiting(bystander, "bystander");
  for (int n = 0; n < kVictims; ++n) {
    constexpr std::array kTypes = {7, 11, 13, 20};
    const int type = kTypes[static_cast<size_t>(n) % kTypes.size()];
    const std::string name = "victim" + std::to_string(n);
    ClientScript script;
    script.openAggregating(infoIn("v", 0, type), userInfo("v"), "send").configure().share(Dictionary{{"v", n}});
    script.open(infoIn("v", 1, type), userInfo("w")).configure();
    for (int round = 0; round < kRounds; ++round) {
      script.sendMany(kCategory, name, 20, round * 20).flush();
    }
    const auto victim = start(script.wait(), name);
    const size_t lines = chance.below(160);
    EXPECT_TRUE(eventually([&] {
      const std::string said = output(name);
      return static_cast<size_t>(std::count(said.begin(), said.end(), '\n')) >= lines || timesSaid(name, "waiting") > 0;
    }));
    victim->signal(SIGKILL);
    EXPECT_EQ(victim->wait(), -SIGKILL);
    goOn("bystander");
  }
  expectEachOnce("bystander", kVictims);
  EXPECT_TRUE(comesToHave(1, 1)) << instance().daemonLog();
  EXPECT_EQ(status()[kStatusClientTypes].dictionary()->contains("8 AUDIO"), true);
  for (const Dictionary& event : eventsFrom("bystander")) EXPECT_FALSE(event.contains("v"));
  endAll();
  stopDaemon();
  for (int n = 0; n < kVictims; ++n) {
    const Numbers numbers = numbersFrom("victim" + std::to_string(n));
    EXPECT_EQ(std::adjacent_find(numbers.begin(), numbers.end()), numbers.end()) << "twice, of victim " << n;
  }
}

}  // namespace
}  // namespace telvane::testing
