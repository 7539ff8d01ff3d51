#include <gmock/gmock.h>

#include <functional>
#include <stdexcept>

#include "client/ClientSession.h"
#include "tests/client/ClientFixture.h"
#include "tests/support/NotedTimers.h"
#include "tests/support/PassingDispatch.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

constexpr Key kA{"a"};

// Dispatch without timers; everything else is another one's.
class NoTimers final : public PassingDispatch {
 public:
  using PassingDispatch::PassingDispatch;
  bool refuses = true;
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    if (refuses) return nullptr;
    return PassingDispatch::newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
  }
};

// A session whose log timer runs under virtual time, and a daemon that takes what it sends.
class ClientSessionPeriodicTasksTest : public ClientFixture {
 protected:
  using Block = Telvane::PeriodicTaskBlock;

  ClientSessionPeriodicTasksTest() { daemon().answer(Operation::SendMessageWithDictionary, Array{Value()}); }
  ~ClientSessionPeriodicTasksTest() override {
    if (_session != nullptr) _session->stopLogTimer();
    run();
    // Its last steps run while the process still does.
    _session.reset();
    run();
  }

  // A block that notes when it is called, in milliseconds since the start, and then does what the test says.
  Block noting(std::vector<int64_t>& calls, std::function<void(Dictionary* metrics)> act = {}) {
    return [this, &calls, act = std::move(act)](Dictionary* metrics) {
      calls.push_back(elapsed());
      if (act) act(metrics);
    };
  }
  // The same for a module that is called with each tick, whatever it is.
  void addModule(uint32_t number, std::function<void(Dictionary* metrics)> act = {}) {
    EXPECT_TRUE(_session->registerPeriodicTaskForModule(number, true, true, noting(_calls, std::move(act))));
  }
  void startTimer(uint32_t interval = 1, uint32_t multiplier = 1) {
    _session->startLogTimerWithInterval(interval, multiplier, 5, 6);
  }
  static std::function<void(Dictionary*)> reporting(Value value) {
    return [value = std::move(value)](Dictionary* metrics) {
      if (metrics != nullptr) metrics->set(kA, value);
    };
  }
  int64_t elapsed() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(_world.scheduler().now() - SimulatedScheduler::kStart)
        .count();
  }
  void sleep(std::chrono::nanoseconds duration) { _world.scheduler().sleep(duration); }
  size_t sentCount() { return daemon().count(Operation::SendMessageWithDictionary); }
  // The types of the messages that came, in order.
  std::vector<int64_t> sentTypes() {
    std::vector<int64_t> types;
    for (const ScriptedDaemon::Call& call : daemon().calls()) {
      if (call.operation != Operation::SendMessageWithDictionary) continue;
      types.push_back((*call.arguments[0].dictionary())[kTelvaneMessageParametersType].integerValue());
    }
    return types;
  }

  std::shared_ptr<Telvane> _session = open();
  std::vector<int64_t> _calls;
};

TEST_F(ClientSessionPeriodicTasksTest, refusesAnEmptyBlock) {
  EXPECT_FALSE(_session->registerPeriodicTaskForModule(7, true, true, {}));
  startTimer();
  _world.advance(1s);
  EXPECT_TRUE(hasNoLine(log(), "registerPeriodicTaskForModule"));
  EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
  EXPECT_TRUE(hasLine(log(), LogLevel::Default, "unregisterPeriodTaskForModule: 7 doesn't exist"));
}

TEST_F(ClientSessionPeriodicTasksTest, logsWhatIsRegistered) {
  uint32_t number = 4294967292;
  for (const bool needToUpdate : {true, false}) {
    for (const bool needToReport : {true, false}) {
      EXPECT_TRUE(_session->registerPeriodicTaskForModule(number++, needToUpdate, needToReport, noting(_calls)));
    }
  }
  run();
  for (const char* line : {"registerPeriodicTaskForModule: 4294967292, update, reporting",
                           "registerPeriodicTaskForModule: 4294967293, update, no reporting",
                           "registerPeriodicTaskForModule: 4294967294, no update, reporting",
                           "registerPeriodicTaskForModule: 4294967295, no update, no reporting"}) {
    EXPECT_TRUE(hasLine(log(), LogLevel::Default, line)) << line;
  }
}

TEST_F(ClientSessionPeriodicTasksTest, keepsTheSecondOfTwoModulesOfOneNumber) {
  std::vector<int64_t> first;
  EXPECT_TRUE(_session->registerPeriodicTaskForModule(7, true, true, noting(first)));
  addModule(7);
  startTimer();
  _world.advance(1s);
  EXPECT_TRUE(first.empty());
  EXPECT_THAT(_calls, ElementsAre(0, 1000));
}

TEST_F(ClientSessionPeriodicTasksTest, updatesTwiceAndReportsWithEveryThirdTick) {
  std::vector<std::string> calls;
  addModule(7, [&](Dictionary* metrics) {
    calls.push_back(metrics == nullptr ? "update" : "report");
    if (metrics != nullptr) metrics->set(kA, 1);
  });
  startTimer(1, 3);
  _world.advance(2s);
  EXPECT_THAT(calls, ElementsAre("update", "update", "report"));
  EXPECT_THAT(_calls, ElementsAre(0, 1000, 2000));
  ASSERT_EQ(sentCount(), 1u);
  EXPECT_EQ(daemon().last(Operation::SendMessageWithDictionary).arguments[0],
            Value(Dictionary{{kTelvaneMessageParametersFlag, 1},
                             {kTelvaneMessageParametersCategory, 5},
                             {kTelvaneMessageParametersType, 6},
                             {kTelvaneMessageParametersPayload, Dictionary{{kA, 1}}}}));
  _world.advance(4s);
  EXPECT_THAT(calls, ElementsAre("update", "update", "report", "update", "update", "report", "update"));
  EXPECT_EQ(sentCount(), 2u);
  EXPECT_TRUE(hasLines(log(), 1, "startLogTimerWithInterval: 1, 3"));
}

TEST_F(ClientSessionPeriodicTasksTest, neverReportsWithAMultiplierOfZero) {
  addModule(7, reporting(1));
  startTimer(1, 0);
  _world.advance(100s);
  EXPECT_EQ(_calls.size(), 101u);
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionPeriodicTasksTest, logsItsNumbersAsSigned) {
  _session->startLogTimerWithInterval(4294967295, 2147483648, 5, 6);
  run();
  EXPECT_TRUE(hasLines(log(), 1, "startLogTimerWithInterval: -1, -2147483648"));
  _world.advance(std::chrono::hours(24 * 365));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Started RT periodic task"));
}

TEST_F(ClientSessionPeriodicTasksTest, sendsNothingWhenNoModuleAddsAnything) {
  addModule(7);
  startTimer();
  _world.advance(3s);
  EXPECT_EQ(_calls.size(), 4u);
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionPeriodicTasksTest, mergesWhatModulesReport) {
  addModule(1, reporting(Array{1}));
  addModule(2, reporting(Array{2}));
  startTimer();
  _world.advance(1ms);
  const Value event = daemon().last(Operation::SendMessageWithDictionary).arguments[0];
  const Value metrics = (*event.dictionary())[kTelvaneMessageParametersPayload];
  EXPECT_THAT(metrics, ::testing::AnyOf(Value(Dictionary{{kA, Array{1, 2}}}), Value(Dictionary{{kA, Array{2, 1}}})));
}

TEST_F(ClientSessionPeriodicTasksTest, keepsTheFirstOfTwoTimers) {
  addModule(7, reporting(1));
  startTimer(2, 1);
  _session->startLogTimerWithInterval(1, 5, 50, 60);
  _world.advance(4s);
  EXPECT_THAT(_calls, ElementsAre(0, 2000, 4000));
  EXPECT_THAT(sentTypes(), ElementsAre(6, 6, 6));
  EXPECT_TRUE(hasLines(log(), 1, "startLogTimerWithInterval"));
}

TEST_F(ClientSessionPeriodicTasksTest, stopsAndStartsAnew) {
  addModule(7, reporting(1));
  startTimer(1, 3);
  _world.advance(1500ms);
  _session->stopLogTimer();
  _world.advance(10s);
  EXPECT_THAT(_calls, ElementsAre(0, 1000));
  startTimer(1, 3);
  _world.advance(1500ms);
  EXPECT_EQ(sentCount(), 0u) << "it must count from the beginning";
  _world.advance(500ms);
  EXPECT_EQ(sentCount(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "stopLogTimer."));
}

TEST_F(ClientSessionPeriodicTasksTest, onlyLogsWhenThereIsNoTimerToStop) {
  _session->stopLogTimer();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "stopLogTimer: No timer is present."));
  startTimer();
  _session->stopLogTimer();
  _session->stopLogTimer();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "stopLogTimer."));
  EXPECT_TRUE(hasLines(log(), 2, "stopLogTimer: No timer is present."));
}

TEST_F(ClientSessionPeriodicTasksTest, doesNothingWithoutATimerToBeHad) {
  NoTimers none(client().platform().dispatch);
  const Platform& platform = client().platform();
  ClientContext context{ClientPlatform(platform.clock, none, platform.log, platform.random, platform.userDefaults,
                                       platform.localService)};
  std::shared_ptr<Telvane> session = TelvaneFactory::initWithSessionInfo(context, sessionInfo());
  session->startLogTimerWithInterval(1, 1, 5, 6);
  session->stopLogTimer();
  run();
  EXPECT_TRUE(hasNoLine(log(), "startLogTimerWithInterval"));
  EXPECT_TRUE(hasLines(log(), 1, "stopLogTimer: No timer is present."));
  none.refuses = false;
  session->startLogTimerWithInterval(1, 1, 5, 6);
  run();
  EXPECT_TRUE(hasLines(log(), 1, "startLogTimerWithInterval: 1, 1"));
  session.reset();
  run();
}

// So that a device with many such timers wakes up for several of them at once.
TEST_F(ClientSessionPeriodicTasksTest, letsEachTickComeUpTo100MillisecondsLate) {
  NotedTimers noted(client().platform().dispatch);
  const Platform& platform = client().platform();
  ClientContext context{ClientPlatform(platform.clock, noted, platform.log, platform.random, platform.userDefaults,
                                       platform.localService)};
  std::shared_ptr<Telvane> session = TelvaneFactory::initWithSessionInfo(context, sessionInfo());
  session->startLogTimerWithInterval(1, 1, 5, 6);
  _world.advance(2500ms);
  EXPECT_THAT(noted.leeways(), ElementsAre(100ms, 100ms, 100ms, 100ms)) << "at 0, 1, 2 and 3 seconds";
  session->stopLogTimer();
  session.reset();
  run();
}

TEST_F(ClientSessionPeriodicTasksTest, saysThatItsTimerIsLostAndStartsAnotherOne) {
  NoTimers fading(client().platform().dispatch);
  fading.refuses = false;
  const Platform& platform = client().platform();
  ClientContext context{ClientPlatform(platform.clock, fading, platform.log, platform.random, platform.userDefaults,
                                       platform.localService)};
  const char* line = "_myPeriodicTask: No timer for the next tick. The log timer is stopped";
  log().expectError(line);
  std::shared_ptr<Telvane> session = TelvaneFactory::initWithSessionInfo(context, sessionInfo());
  EXPECT_TRUE(session->registerPeriodicTaskForModule(7, true, true, noting(_calls)));
  session->startLogTimerWithInterval(1, 1, 5, 6);
  _world.advance(1500ms);
  fading.refuses = true;
  _world.advance(10s);
  EXPECT_THAT(_calls, ElementsAre(0, 1000, 2000)) << "the last one had its timer already";
  EXPECT_TRUE(hasLines(log(), 1, line));
  fading.refuses = false;
  session->startLogTimerWithInterval(1, 1, 5, 6);
  _world.advance(1s);
  EXPECT_THAT(_calls, ElementsAre(0, 1000, 2000, 11500, 12500));
  session->stopLogTimer();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "stopLogTimer."));
  session.reset();
  run();
}

TEST_F(ClientSessionPeriodicTasksTest, filtersTheEventLikeAnyOther) {
  _session = openConfigured({}, Array{7});
  addModule(7, reporting(1));
  startTimer();
  _world.advance(1ms);
  EXPECT_EQ(sentCount(), 0u);
  EXPECT_TRUE(hasLines(log(), 1, "Event 5 is filtered by storebag"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Sent realtime event after collection all RT metrics"));
}

TEST_F(ClientSessionPeriodicTasksTest, sendsNothingWithACategoryOfZero) {
  addModule(7, reporting(1));
  _session->startLogTimerWithInterval(1, 1, 0, 6);
  _world.advance(1s);
  EXPECT_EQ(_calls.size(), 2u);
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionPeriodicTasksTest, takesAndForgetsModulesWhileItsTimerRuns) {
  startTimer();
  _world.advance(1500ms);
  addModule(7);
  _world.advance(2s);
  EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
  EXPECT_TRUE(hasLines(log(), 1, "unregisterPeriodTaskForModule: 7 removed")) << "it is done when the call returns";
  _world.advance(2s);
  EXPECT_THAT(_calls, ElementsAre(2000, 3000));
}

TEST_F(ClientSessionPeriodicTasksTest, aTickMakesOtherCallsOfItsSessionWait) {
  addModule(7, [&](Dictionary* metrics) {
    metrics->set(kA, 1);
    EXPECT_TRUE(_session->sendMessageWithCategory(1, 1));
    sleep(500ms);
  });
  startTimer(10);
  std::vector<size_t> sent;
  client().spawn("other", [&] {
    sleep(100ms);
    EXPECT_TRUE(_session->sendMessageWithCategory(1, 2));
    sleep(399ms);
    sent.push_back(sentCount());
  });
  _world.advance(1s);
  EXPECT_THAT(sent, ElementsAre(0u)) << "nothing overtakes the tick";
  EXPECT_THAT(sentTypes(), ElementsAre(1, 2, 6)) << "nor the event what was sent before it";
}

TEST_F(ClientSessionPeriodicTasksTest, leavesOutTicksThatComeTooLate) {
  addModule(7, [&](Dictionary*) {
    if (_calls.size() == 1) sleep(3500ms);
  });
  startTimer();
  _world.advance(6s);
  EXPECT_THAT(_calls, ElementsAre(0, 3500, 4000, 5000, 6000));
}

TEST_F(ClientSessionPeriodicTasksTest, waitsPracticallyWithoutAnEndForABlock) {
  addModule(7, [&](Dictionary* metrics) {
    metrics->set(kA, 1);
    if (_calls.size() == 1) sleep(std::chrono::hours(24 * 30));
  });
  startTimer();
  _world.advance(std::chrono::hours(24 * 30) - 1s);
  EXPECT_EQ(sentCount(), 0u);
  _world.advance(1s);
  EXPECT_GE(sentCount(), 1u);
}

TEST_F(ClientSessionPeriodicTasksTest, goesOnAfterBlocksThatThrow) {
  log().expectError("_myPeriodicTask: Exception in a block of the client: no");
  for (uint32_t number = 1; number <= 5; ++number) {
    addModule(number, [](Dictionary*) { throw std::runtime_error("no"); });
  }
  addModule(6, reporting(1));
  startTimer();
  _world.advance(2s);
  EXPECT_EQ(_calls.size(), 18u);
  EXPECT_EQ(sentCount(), 3u);
}

TEST_F(ClientSessionPeriodicTasksTest, removingWaitsForTheTickThatCallsTheModule) {
  bool isRunning = false;
  addModule(7, [&](Dictionary*) {
    isRunning = true;
    sleep(500ms);
    isRunning = false;
  });
  startTimer(10);
  int64_t removedAt = -1;
  client().spawn("other", [&] {
    sleep(100ms);
    EXPECT_TRUE(isRunning);
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
    EXPECT_FALSE(isRunning);
    removedAt = elapsed();
  });
  _world.advance(30s);
  EXPECT_EQ(removedAt, 500);
  EXPECT_EQ(_calls.size(), 1u);
}

TEST_F(ClientSessionPeriodicTasksTest, aBlockMayUnregisterItself) {
  int64_t returnedAt = -1;
  addModule(7, [&](Dictionary*) {
    sleep(100ms);
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
    returnedAt = elapsed();
    EXPECT_TRUE(hasNoLine(log(), "7 removed")) << "the tick must be over before";
  });
  startTimer();
  _world.advance(5s);
  EXPECT_EQ(returnedAt, 100);
  EXPECT_EQ(_calls.size(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "unregisterPeriodTaskForModule: 7 removed"));
}

TEST_F(ClientSessionPeriodicTasksTest, aBlockMayRegisterOthersAndReplaceItself) {
  std::vector<int64_t> others;
  addModule(7, [&](Dictionary*) {
    EXPECT_TRUE(_session->registerPeriodicTaskForModule(7, true, true, noting(others)));
    EXPECT_TRUE(_session->registerPeriodicTaskForModule(8, true, true, noting(others)));
  });
  startTimer();
  _world.advance(2s);
  EXPECT_EQ(_calls.size(), 1u);
  EXPECT_THAT(others, ElementsAre(1000, 1000, 2000, 2000));
}

TEST_F(ClientSessionPeriodicTasksTest, keepsTheOrderOfCallsMadeInABlock) {
  std::vector<int64_t> others;
  addModule(7, [&](Dictionary*) {
    if (_calls.size() > 1) return;
    EXPECT_TRUE(_session->registerPeriodicTaskForModule(8, true, true, noting(others)));
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(8));
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(9));
    EXPECT_TRUE(_session->registerPeriodicTaskForModule(9, true, true, noting(others)));
  });
  startTimer();
  _world.advance(2s);
  EXPECT_THAT(others, ElementsAre(1000, 2000)) << "8 is gone again, 9 stays";
}

TEST_F(ClientSessionPeriodicTasksTest, aBlockMayStopAndStartTheTimer) {
  addModule(7, [&](Dictionary*) {
    _session->stopLogTimer();
    if (_calls.size() < 3) startTimer(5);
  });
  startTimer();
  _world.advance(1s);
  EXPECT_THAT(_calls, ElementsAre(0, 0, 0));
  _world.advance(20s);
  EXPECT_EQ(_calls.size(), 3u);
  EXPECT_TRUE(hasLines(log(), 3, "stopLogTimer."));
}

TEST_F(ClientSessionPeriodicTasksTest, blocksOfTwoSessionsMayUnregisterEachOther) {
  const std::shared_ptr<Telvane> other = open();
  int calls = 0;
  EXPECT_TRUE(other->registerPeriodicTaskForModule(7, true, true, [&](Dictionary*) {
    ++calls;
    sleep(100ms);
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
  }));
  addModule(7, [&](Dictionary*) {
    sleep(100ms);
    EXPECT_TRUE(other->unregisterPeriodTaskForModule(7));
  });
  startTimer();
  other->startLogTimerWithInterval(1, 1, 5, 6);
  _world.advance(3s);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(_calls.size(), 1u);
  other->stopLogTimer();
  run();
}

// Told on the very queue on which modules are removed.
class UnregisteringDelegate final : public TelvaneMessageSentDelegate {
 public:
  void didSendMessageForReportingClient(const std::shared_ptr<Telvane>& client, const Dictionary&) override {
    EXPECT_TRUE(client->unregisterPeriodTaskForModule(7));
    ++count;
  }
  int count = 0;
};

TEST_F(ClientSessionPeriodicTasksTest, theDelegateMayUnregister) {
  const auto delegate = std::make_shared<UnregisteringDelegate>();
  _session->setMessageSentDelegate(delegate);
  addModule(7, reporting(1));
  startTimer();
  _world.advance(5s);
  EXPECT_EQ(delegate->count, 1) << "it is told of the event";
  EXPECT_EQ(_calls.size(), 1u);
}

// Told of one session's messages while it takes a module away from another one.
class DelegateOfOneForTheOther final : public TelvaneMessageSentDelegate {
 public:
  DelegateOfOneForTheOther(std::shared_ptr<Telvane> other, std::function<void()> beforehand)
      : _other(std::move(other)), _beforehand(std::move(beforehand)) {}
  void didSendMessageForReportingClient(const std::shared_ptr<Telvane>&, const Dictionary&) override {
    _beforehand();
    EXPECT_TRUE(_other->unregisterPeriodTaskForModule(7));
    ++count;
  }
  int count = 0;

 private:
  const std::shared_ptr<Telvane> _other;
  const std::function<void()> _beforehand;
};

// Each would wait for the step that calls the other.
TEST_F(ClientSessionPeriodicTasksTest, delegatesOfTwoSessionsMayUnregisterEachOthersModules) {
  const std::shared_ptr<Telvane> other = open();
  const auto first = std::make_shared<DelegateOfOneForTheOther>(other, [this] { sleep(100ms); });
  const auto second = std::make_shared<DelegateOfOneForTheOther>(_session, [this] { sleep(100ms); });
  _session->setMessageSentDelegate(first);
  other->setMessageSentDelegate(second);
  for (Telvane* session : {_session.get(), other.get()}) {
    EXPECT_TRUE(session->registerPeriodicTaskForModule(7, true, true, noting(_calls)));
    EXPECT_TRUE(session->sendMessageWithCategory(5, 6));
  }
  _world.advance(1s);
  EXPECT_EQ(first->count, 1);
  EXPECT_EQ(second->count, 1);
  EXPECT_TRUE(hasLines(log(), 2, "unregisterPeriodTaskForModule: 7 removed"));
  startTimer();
  other->startLogTimerWithInterval(1, 1, 5, 6);
  _world.advance(1s);
  EXPECT_TRUE(_calls.empty());
  other->stopLogTimer();
  other->setMessageSentDelegate({});
  _session->setMessageSentDelegate({});
  run();
}

// Elsewhere, the wait is kept: behind it the module's block does not run, whatever other sessions do.
TEST_F(ClientSessionPeriodicTasksTest, removingWaitsAlsoWhileADelegateOfAnotherSessionIsTold) {
  const std::shared_ptr<Telvane> other = open();
  const auto delegate = std::make_shared<DelegateOfOneForTheOther>(_session, [this] { sleep(2s); });
  other->setMessageSentDelegate(delegate);
  EXPECT_TRUE(other->sendMessageWithCategory(5, 6));
  addModule(8, [&](Dictionary*) { sleep(500ms); });
  startTimer(10);
  int64_t removedAt = -1;
  client().spawn("other", [&] {
    sleep(100ms);
    EXPECT_TRUE(_session->unregisterPeriodTaskForModule(8));
    removedAt = elapsed();
  });
  _world.advance(5s);
  EXPECT_EQ(removedAt, 500);
  EXPECT_EQ(delegate->count, 1);
  other->setMessageSentDelegate({});
  run();
}

// What a block holds goes with it, and may call the session from there.
TEST_F(ClientSessionPeriodicTasksTest, whatABlockHoldsMayUnregisterWhenItGoes) {
  int ends = 0;
  const auto newHeld = [&] {
    return std::shared_ptr<int>(new int(0), [&](int* number) {
      const std::unique_ptr<int> owned(number);
      if (_session != nullptr) {
        EXPECT_TRUE(_session->unregisterPeriodTaskForModule(8));
      }
      ++ends;
    });
  };
  addModule(7, [held = newHeld()](Dictionary*) {});
  addModule(7, [held = newHeld()](Dictionary*) {});
  run();
  EXPECT_EQ(ends, 1) << "replaced";
  EXPECT_TRUE(_session->unregisterPeriodTaskForModule(7));
  run();
  EXPECT_EQ(ends, 2) << "removed";
  addModule(7, [held = newHeld()](Dictionary*) {});
  startTimer();
  _world.advance(1s);
  _session.reset();
  run();
  EXPECT_EQ(ends, 3) << "let go with its session";
}

TEST_F(ClientSessionPeriodicTasksTest, endsWithItsSessionWhenNobodyHasStoppedTheTimer) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> heldByBlock = held;
  const std::weak_ptr<ClientSession> inside = TelvaneFactory::session(*_session);
  addModule(7, [held = std::move(held)](Dictionary* metrics) { metrics->set(kA, 1); });
  startTimer();
  _world.advance(1500ms);
  _session.reset();
  run();
  EXPECT_TRUE(inside.expired());
  EXPECT_TRUE(heldByBlock.expired());
  _world.advance(10s);
  EXPECT_THAT(_calls, ElementsAre(0, 1000));
  EXPECT_EQ(daemon().count(Operation::FinishSessionGracefully), 1u);
  EXPECT_EQ(sentCount(), 2u);
}

// Answers that are out hold a session; its own reports must not do so one after the other.
TEST_F(ClientSessionPeriodicTasksTest, endsWithItsSessionAlsoWhenTheDaemonDoesNotAnswer) {
  auto kept = std::make_shared<std::vector<ipc::ReplyBlock>>();
  daemon().answer(Operation::SendMessageWithDictionary,
                  [kept](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) { kept->push_back(std::move(reply)); });
  addModule(7, reporting(1));
  startTimer();
  _world.advance(1500ms);
  _session.reset();
  _world.advance(10s);
  EXPECT_THAT(_calls, ElementsAre(0, 1000));
  EXPECT_EQ(kept->size(), 2u);
  log().allowErrors();
}

TEST_F(ClientSessionPeriodicTasksTest, sendsTheEventOfATickThatIsUnderWayWhenItsSessionIsLetGo) {
  addModule(7, [&](Dictionary* metrics) {
    metrics->set(kA, 1);
    sleep(500ms);
  });
  startTimer();
  _world.advance(100ms);
  _session.reset();
  _world.advance(10s);
  EXPECT_EQ(_calls.size(), 1u);
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::SendMessageWithDictionary,
                                               Operation::FinishSessionGracefully}));
}

TEST_F(ClientSessionPeriodicTasksTest, theLastPointerMayGoInABlock) {
  addModule(7, [&](Dictionary* metrics) {
    metrics->set(kA, 1);
    _session.reset();
    sleep(500ms);
  });
  startTimer();
  _world.advance(10s);
  EXPECT_EQ(_calls.size(), 1u);
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::SendMessageWithDictionary,
                                               Operation::FinishSessionGracefully}));
}

TEST_F(ClientSessionPeriodicTasksTest, aBlockThatNeverReturnsDoesNotHoldUpWhoLetsTheSessionGo) {
  const std::shared_ptr<Semaphore> never = client().platform().dispatch.newSemaphore(0);
  addModule(7, [never](Dictionary*) { never->wait(); });
  startTimer();
  _world.advance(5s);
  EXPECT_TRUE(_session->sendMessageWithCategory(1, 1));
  _session->stopLogTimer();
  _session.reset();
  _world.advance(5s);
  EXPECT_EQ(sentCount(), 0u);
  EXPECT_EQ(_calls.size(), 1u);
  never->signal();
  run();
  EXPECT_EQ(sentCount(), 1u);
  EXPECT_EQ(daemon().count(Operation::FinishSessionGracefully), 1u);
}

TEST_F(ClientSessionPeriodicTasksTest, startsNothingThatWasCalledJustBeforeTheSessionWasLetGo) {
  addModule(7, reporting(1));
  startTimer();
  _session.reset();
  _world.advance(10s);
  EXPECT_TRUE(_calls.empty());
  EXPECT_EQ(daemon().count(Operation::FinishSessionGracefully), 1u);
}

// Whatever the order in which threads overtake each other: no call is lost, nothing is called behind a removal, and
// everything ends.
TEST_F(ClientSessionPeriodicTasksTest, keepsItsPromisesHoweverThreadsOvertakeEachOther) {
  for (uint64_t seed = 1; seed <= 30; ++seed) {
    SimulatedWorld world(seed);
    world.scheduler().setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
    world.scheduler().setTimerLeeway(SimulatedScheduler::TimerLeeway::BySeed);
    SimulatedPlatform& daemonProcess = world.makeProcess("telvaned");
    SimulatedPlatform& clientProcess = world.makeProcess("client");
    ScriptedDaemon scripted(daemonProcess.platform().localService);
    scripted.answer(Operation::SendMessageWithDictionary, Array{Value()});
    ClientContext context{clientProcess.platform()};
    std::shared_ptr<Telvane> session = TelvaneFactory::initWithSessionInfo(context, sessionInfo());
    std::vector<bool> mayBeCalled(3, true);
    int done = 0;
    for (uint32_t number = 0; number < 3; ++number) {
      clientProcess.spawn("module", [&, number] {
        for (int round = 0; round < 5; ++round) {
          mayBeCalled[number] = true;
          EXPECT_TRUE(session->registerPeriodicTaskForModule(number, true, true, [&, number](Dictionary* metrics) {
            EXPECT_TRUE(mayBeCalled[number]) << "seed " << seed;
            world.scheduler().sleep(30ms);
            if (metrics != nullptr) metrics->set(kA, 1);
            EXPECT_TRUE(session->sendMessageWithCategory(1, 1));
          }));
          world.scheduler().sleep(700ms);
          EXPECT_TRUE(session->unregisterPeriodTaskForModule(number));
          mayBeCalled[number] = false;
        }
        ++done;
      });
    }
    clientProcess.spawn("timer", [&] {
      for (int round = 0; round < 4; ++round) {
        session->startLogTimerWithInterval(1, 2, 5, 6);
        world.scheduler().sleep(1300ms);
        session->stopLogTimer();
      }
      ++done;
    });
    EXPECT_TRUE(world.runUntil([&] { return done == 4; })) << "seed " << seed;
    session.reset();
    world.runUntilIdle();
    EXPECT_EQ(scripted.count(Operation::FinishSessionGracefully), 1u) << "seed " << seed;
    world.end();
  }
}

}  // namespace
}  // namespace telvane::testing
