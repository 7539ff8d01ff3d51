#include "client/include/telvane/TelvaneAPI.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "client/include/telvane/TelvaneConstants.h"
#include "client/include/telvane/TelvaneSession.h"
#include "platform/PropertyList.h"
#include "tests/client/RealDaemon.h"
#include "tests/support/Matchers.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

// The library reads its surroundings on first use, so they are set before any test runs.
const ScratchFolder& root() {
  static const ScratchFolder folder;
  return folder;
}
const bool kHasSurroundings =
    ::setenv("TELVANE_ROOT", root().path().c_str(), 1) == 0 && ::setenv("HOME", root().path().c_str(), 1) == 0;

struct FreePlist {
  void operator()(void* node) const { plist_free(node); }
};
using Plist = std::unique_ptr<void, FreePlist>;
Plist plist(const Value& value) { return Plist(propertylist::newNode(value)); }

Value valueOf(plist_t node) {
  if (node == nullptr) return {};
  const Result<Value> value = propertylist::fromNode(node);
  return value ? *value : Value("not readable");
}

struct ReleaseSession {
  void operator()(TelvaneRef session) const { TelvaneRelease(session); }
};
using Session = std::unique_ptr<TelvaneOpaque, ReleaseSession>;
struct ReleaseError {
  void operator()(TelvaneErrorRef error) const { TelvaneErrorRelease(error); }
};
using OwnedError = std::unique_ptr<TelvaneErrorOpaque, ReleaseError>;

// An error that is there before a call, so that a test sees whether it is still there afterwards.
TelvaneErrorRef someError() {
  static char place;
  return reinterpret_cast<TelvaneErrorRef>(&place);
}

// A C callback's context: keeps the first thing it is called with. Shared with the callback, which lets go last.
template <class T>
class Received {
 public:
  // Returns the context, for one callback that is called once.
  void* context() { return new std::shared_ptr<std::promise<T>>(_promise); }
  static void receive(void* context, T value) {
    const std::unique_ptr<std::shared_ptr<std::promise<T>>> promise(
        static_cast<std::shared_ptr<std::promise<T>>*>(context));
    (*promise)->set_value(std::move(value));
  }
  T get() {
    if (_future.wait_for(std::chrono::seconds(30)) != std::future_status::ready) throw std::runtime_error("not called");
    return _future.get();
  }

 private:
  const std::shared_ptr<std::promise<T>> _promise = std::make_shared<std::promise<T>>();
  std::future<T> _future = _promise->get_future();
};

void receiveBackends(plist_t names, void* context) { Received<Value>::receive(context, valueOf(names)); }
void receiveText(const char* text, void* context) { Received<std::string>::receive(context, text); }
struct EndOfFlush {
  bool hasError = false;
  std::string domain, text;
  int64_t code = 0;
  Value userInfo;
};
void receiveEnd(TelvaneErrorRef error, void* context) {
  EndOfFlush end;
  if (error != nullptr) {
    end = {true, TelvaneErrorGetDomain(error), TelvaneErrorGetDescription(error), TelvaneErrorGetCode(error), {}};
    const Plist userInfo(TelvaneErrorCopyUserInfo(error));
    end.userInfo = valueOf(userInfo.get());
  }
  Received<EndOfFlush>::receive(context, end);
}

class TelvaneAPITest : public ::testing::Test {
 protected:
  using Operation = ClientSessionOperation;

  TelvaneAPITest() {
    script().answer(Operation::StartConfig, Array{Array{"splunk"}, Array{1, 7}, Value()});
    script().answer(Operation::FetchStates, Array{Array{"gonzo"}, Value(), Value()});
    script().answer(Operation::FetchDisplayURL, Array{"URL not available"});
    script().answer(Operation::SendMessageWithDictionary, Array{"taken"});
    script().answer(Operation::FlushMessages, Array{Value(), Value()});
    script().answer(Operation::UploadLogData, Array{true, Value()});
  }
  ScriptedDaemon& script() { return _daemon.script(); }
  static Plist sessionInfo() { return plist(Dictionary{{Key("ComponentType"), 7}}); }
  static Session open() { return Session(TelvaneCreateSession(sessionInfo().get(), nullptr, nullptr)); }
  // Waits until the daemon has taken everything before.
  static EndOfFlush flush(const Session& session) {
    Received<EndOfFlush> received;
    TelvaneFlushMessagesWithCompletion(session.get(), receiveEnd, received.context());
    return received.get();
  }
  static void configure(const Session& session) {
    Received<Value> names;
    TelvaneStartConfiguration(session.get(), receiveBackends, names.context());
    EXPECT_EQ(names.get(), Value(Array{"splunk"}));
  }
  Dictionary lastMessage() { return *script().last(Operation::SendMessageWithDictionary).arguments[0].dictionary(); }

  RealDaemon _daemon{root().path()};
};

TEST_F(TelvaneAPITest, doesNothingForANullSession) {
  const auto backends = [](plist_t, void*) { ADD_FAILURE() << "no callback may be called"; };
  const auto text = [](const char*, void*) { ADD_FAILURE() << "no callback may be called"; };
  const auto end = [](TelvaneErrorRef, void*) { ADD_FAILURE() << "no callback may be called"; };
  const Plist dictionary = plist(Dictionary{{Key("a"), 1}});
  const TelvaneErrorRef untouched = someError();
  TelvaneErrorRef error = untouched;
  TelvaneRelease(nullptr);
  TelvaneStartConfiguration(nullptr, backends, nullptr);
  TelvaneFetchStatesWithUserInfo(nullptr, dictionary.get(), backends, nullptr);
  TelvaneSetMessageBlock(nullptr, text, nullptr);
  TelvaneUpdateSharedDataWithDictionary(nullptr, dictionary.get());
  TelvaneUpdateSharedDataForKey(nullptr, "key", dictionary.get());
  EXPECT_FALSE(TelvaneSendMessageWithError(nullptr, 1, 1, nullptr, &error));
  EXPECT_FALSE(TelvaneSendMessageWithDictionary(nullptr, dictionary.get(), &error));
  EXPECT_EQ(error, untouched) << "the error must be left alone";
  TelvaneFlushMessages(nullptr);
  TelvaneFlushMessagesWithCompletion(nullptr, end, nullptr);
  EXPECT_FALSE(TelvaneUploadLogWithArray(nullptr, dictionary.get()));
  EXPECT_FALSE(TelvaneRegisterPeriodicTaskForModule(nullptr, 1, true, true, backends, nullptr));
  EXPECT_FALSE(TelvaneUnregisterPeriodTaskForModule(nullptr, 1));
  TelvaneStartLogTimerWithInterval(nullptr, 1, 1, 5, 6);
  TelvaneStopLogTimer(nullptr);
}

TEST_F(TelvaneAPITest, opensASessionWithWhatItIsGiven) {
  const Plist userInfo = plist(Dictionary{{Key("_clientName"), "app"}});
  const Plist frameworks = plist(Array{"A"});
  const Session session(TelvaneCreateSession(sessionInfo().get(), userInfo.get(), frameworks.get()));
  ASSERT_NE(session, nullptr);
  flush(session);
  EXPECT_EQ(script().calls()[0].arguments,
            (Array{Dictionary{{Key("ComponentType"), 7}}, Dictionary{{Key("_clientName"), "app"}}, Array{"A"}, false}));
}

TEST_F(TelvaneAPITest, refusesASessionThatIsNotValid) {
  EXPECT_EQ(TelvaneCreateSession(nullptr, nullptr, nullptr), nullptr);
  EXPECT_EQ(TelvaneCreateSession(plist(Dictionary{{Key("ComponentType"), 31}}).get(), nullptr, nullptr), nullptr);
  EXPECT_EQ(TelvaneCreateSession(plist("text").get(), nullptr, nullptr), nullptr);
}

TEST_F(TelvaneAPITest, passesAllFiveArgumentsToTheAggregationCallback) {
  Received<Array> received;
  const Session session(TelvaneCreateSessionWithAggregationBlock(
      sessionInfo().get(), nullptr, nullptr,
      [](plist_t client, double timestamp, uint16_t category, uint16_t type, plist_t payload, void* context) {
        Received<Array>::receive(context, {valueOf(client), timestamp, category, type, valueOf(payload)});
      },
      received.context()));
  flush(session);
  EXPECT_EQ(script().calls()[0].arguments[3], Value(true));
  const Array message{Dictionary{{Key("ComponentType"), 9}}, 12.5, 40000, 3, Value()};
  script().connection().send({static_cast<uint16_t>(ClientSessionReplyOperation::SendMessageToClient), message, {}},
                             {});
  EXPECT_EQ(received.get(), message);
}

TEST_F(TelvaneAPITest, opensNoAggregationForANullCallback) {
  const Session session(
      TelvaneCreateSessionWithAggregationBlock(sessionInfo().get(), nullptr, nullptr, nullptr, nullptr));
  flush(session);
  EXPECT_EQ(script().calls()[0].arguments[3], Value(false));
}

TEST_F(TelvaneAPITest, sendsAnEventAndSetsTheErrorToNull) {
  const Session session = open();
  const Plist payload = plist(Dictionary{{Key("a"), Array{1, 2.5, true, "x", Data::copyOf("d")}}});
  TelvaneErrorRef error = someError();
  EXPECT_TRUE(TelvaneSendMessageWithError(session.get(), 40000, 3, payload.get(), &error));
  EXPECT_EQ(error, nullptr);
  flush(session);
  EXPECT_EQ(lastMessage(), (Dictionary{{Key("ParametersCategory"), 40000},
                                       {Key("ParametersType"), 3},
                                       {Key("ParametersPayload"), valueOf(payload.get())},
                                       {Key("ParametersFlag"), 0}}));
}

TEST_F(TelvaneAPITest, sendsAMessageDictionary) {
  const Session session = open();
  const Dictionary message{{Key("ParametersCategory"), 7}, {Key("ParametersType"), 1}, {Key("ParametersFlag"), 2}};
  EXPECT_TRUE(TelvaneSendMessageWithDictionary(session.get(), plist(message).get(), nullptr));
  flush(session);
  EXPECT_EQ(lastMessage(), message);
}

TEST_F(TelvaneAPITest, reportsEveryErrorInTheOneDomain) {
  const Session session = open();
  TelvaneErrorRef error = nullptr;
  EXPECT_FALSE(TelvaneSendMessageWithDictionary(session.get(), plist(Dictionary()).get(), &error));
  const OwnedError missing(error);
  ASSERT_NE(missing, nullptr);
  EXPECT_STREQ(TelvaneErrorGetDomain(missing.get()), "TelvaneErrorDomain");
  EXPECT_EQ(TelvaneErrorGetCode(missing.get()), 7);
  EXPECT_FALSE(TelvaneSendMessageWithDictionary(session.get(), nullptr, nullptr));
  EXPECT_FALSE(TelvaneSendMessageWithError(session.get(), 0, 1, nullptr, &error));
  const OwnedError refused(error);
  ASSERT_NE(refused, nullptr);
  EXPECT_STREQ(TelvaneErrorGetDomain(refused.get()), "TelvaneErrorDomain");
  EXPECT_EQ(TelvaneErrorGetCode(refused.get()), 4);
  const Plist userInfo(TelvaneErrorCopyUserInfo(refused.get()));
  EXPECT_EQ(valueOf(userInfo.get()),
            Value(Dictionary{{Key("LocalizedDescription"), TelvaneErrorGetDescription(refused.get())}}));
}

TEST_F(TelvaneAPITest, takesNullErrors) {
  TelvaneErrorRelease(nullptr);
  EXPECT_EQ(TelvaneErrorGetDomain(nullptr), nullptr);
  EXPECT_EQ(TelvaneErrorGetDescription(nullptr), nullptr);
  EXPECT_EQ(TelvaneErrorGetCode(nullptr), 0);
  EXPECT_EQ(TelvaneErrorCopyUserInfo(nullptr), nullptr);
}

Plist tooDeepDictionary() {
  plist_t dictionary = plist_new_dict();
  for (int i = 0; i < 1000; ++i) {
    plist_t outer = plist_new_dict();
    plist_dict_set_item(outer, "d", dictionary);
    dictionary = outer;
  }
  return Plist(dictionary);
}

TEST_F(TelvaneAPITest, opensNoSessionWithWhatCannotBeCarried) {
  const Plist bad = tooDeepDictionary();
  EXPECT_EQ(Session(TelvaneCreateSession(bad.get(), nullptr, nullptr)), nullptr);
  EXPECT_EQ(Session(TelvaneCreateSession(sessionInfo().get(), bad.get(), nullptr)), nullptr);
  EXPECT_EQ(Session(TelvaneCreateSession(sessionInfo().get(), nullptr, bad.get())), nullptr);
}

TEST_F(TelvaneAPITest, doesNothingWithWhatCannotBeCarried) {
  const Session session = open();
  const Plist bad = tooDeepDictionary();
  TelvaneUpdateSharedDataForKey(session.get(), "k", bad.get());
  TelvaneUpdateSharedDataWithDictionary(session.get(), bad.get());
  TelvaneUpdateSharedDataWithDictionary(session.get(), plist(Array{1}).get());
  EXPECT_FALSE(TelvaneUploadLogWithArray(session.get(), bad.get()));
  EXPECT_EQ(TelvaneNewHierarchyTokenFromParentToken(bad.get()), nullptr);
  Received<Value> names;
  TelvaneFetchStatesWithUserInfo(session.get(), bad.get(), receiveBackends, names.context());
  EXPECT_FALSE(names.get().isPresent());
  flush(session);
  EXPECT_EQ(script().operations(), (std::vector<Operation>{Operation::SetSessionInfo, Operation::FlushMessages}));
}

TEST_F(TelvaneAPITest, refusesAPayloadThatIsTooDeep) {
  const Session session = open();
  const Plist payload = tooDeepDictionary();
  TelvaneErrorRef error = nullptr;
  EXPECT_FALSE(TelvaneSendMessageWithError(session.get(), 1, 1, payload.get(), &error));
  const OwnedError refused(error);
  EXPECT_EQ(TelvaneErrorGetCode(refused.get()), 4);
  EXPECT_STREQ(TelvaneErrorGetDomain(refused.get()), "TelvaneErrorDomain");
}

TEST_F(TelvaneAPITest, filtersAfterTheConfiguration) {
  const Session session = open();
  configure(session);
  TelvaneErrorRef error = someError();
  const Plist filtered = plist(Dictionary{{Key("ParametersCategory"), 8}, {Key("ParametersType"), 1}});
  EXPECT_FALSE(TelvaneSendMessageWithDictionary(session.get(), filtered.get(), &error));
  EXPECT_EQ(error, nullptr);
  EXPECT_TRUE(TelvaneSendMessageWithError(session.get(), 8, 1, nullptr, nullptr));
  flush(session);
  EXPECT_EQ(script().count(Operation::SendMessageWithDictionary), 0u);
}

TEST_F(TelvaneAPITest, fetchesStates) {
  const Session session = open();
  Received<Value> names;
  const Dictionary userInfo{{Key("_serviceName"), "s"}};
  TelvaneFetchStatesWithUserInfo(session.get(), plist(userInfo).get(), receiveBackends, names.context());
  EXPECT_EQ(names.get(), Value(Array{"gonzo"}));
  EXPECT_EQ(script().last(Operation::FetchStates).arguments, Array{userInfo});
}

TEST_F(TelvaneAPITest, givesTheDaemonsTextsToTheMessageCallback) {
  const Session session = open();
  Received<std::string> text;
  TelvaneSetMessageBlock(session.get(), receiveText, text.context());
  EXPECT_TRUE(TelvaneSendMessageWithError(session.get(), 1, 1, nullptr, nullptr));
  EXPECT_EQ(text.get(), "taken");
}

TEST_F(TelvaneAPITest, takesNullCallbacks) {
  const Session session = open();
  TelvaneSetMessageBlock(session.get(), nullptr, nullptr);
  TelvaneStartConfiguration(session.get(), nullptr, nullptr);
  TelvaneFetchStatesWithUserInfo(session.get(), nullptr, nullptr, nullptr);
  EXPECT_TRUE(TelvaneSendMessageWithError(session.get(), 1, 1, nullptr, nullptr));
  TelvaneFlushMessagesWithCompletion(session.get(), nullptr, nullptr);
  TelvaneFlushMessages(session.get());
  EXPECT_FALSE(flush(session).hasError);
  EXPECT_EQ(script().count(Operation::FlushMessages), 3u);
}

TEST_F(TelvaneAPITest, tellsHowAFlushFailed) {
  script().answer(Operation::FlushMessages,
                  Array{Value(), Dictionary{{Key("domain"), "TelvaneErrorDomain"},
                                            {Key("code"), -1},
                                            {Key("userInfo"), Dictionary{{Key("LocalizedDescription"), "no"}}}}});
  const EndOfFlush end = flush(open());
  EXPECT_TRUE(end.hasError);
  EXPECT_EQ(end.domain, "TelvaneErrorDomain");
  EXPECT_EQ(end.code, -1);
  EXPECT_EQ(end.text, "no");
  EXPECT_EQ(end.userInfo, Value(Dictionary{{Key("LocalizedDescription"), "no"}}));
}

TEST_F(TelvaneAPITest, forwardsSharedDataAndLogData) {
  const Session session = open();
  TelvaneUpdateSharedDataWithDictionary(session.get(), plist(Dictionary{{Key("a"), 1}}).get());
  TelvaneUpdateSharedDataForKey(session.get(), "k", plist(2).get());
  TelvaneUpdateSharedDataForKey(session.get(), "k", nullptr);
  const Array logData{Dictionary{{Key("LogData"), "text"}}};
  EXPECT_TRUE(TelvaneUploadLogWithArray(session.get(), plist(logData).get()));
  EXPECT_FALSE(TelvaneUploadLogWithArray(session.get(), nullptr));
  EXPECT_FALSE(TelvaneUploadLogWithArray(session.get(), plist(Array()).get()));
  flush(session);
  EXPECT_EQ(script().calls()[1].arguments, Array{Dictionary({{Key("a"), 1}})});
  EXPECT_EQ(script().calls()[2].arguments, (Array{"k", 2}));
  EXPECT_FALSE(script().calls()[3].arguments[1].isPresent());
  EXPECT_EQ(script().last(Operation::UploadLogData).arguments, Array{logData});
}

TEST_F(TelvaneAPITest, makesTokensOfEqualShapeUnderBothNames) {
  const Plist root(TelvaneNewHierarchyTokenFromParentToken(nullptr));
  const Plist child(TelvaneCreateHierarchyTokenFromParentToken(root.get()));
  const Dictionary parent = *valueOf(root.get()).dictionary();
  EXPECT_EQ(parent["level"], Value(0));
  EXPECT_EQ(valueOf(child.get()), Value(Dictionary{{Key("token"), parent["token"]}, {Key("level"), 1}}));
  EXPECT_EQ(TelvaneNewHierarchyTokenFromParentToken(plist(Array{1}).get()), nullptr);
  EXPECT_EQ(TelvaneCreateHierarchyTokenFromParentToken(plist(Dictionary()).get()), nullptr);
}

TEST_F(TelvaneAPITest, spellsTheConstantsAsTheDaemonReadsThem) {
  EXPECT_STREQ(kTelvaneSessionInfoClientType, "ComponentType");
  EXPECT_STREQ(kTelvaneMessageParametersCategory, "ParametersCategory");
  EXPECT_STREQ(kTelvaneMessageBlobClientData, "ClientData");
  EXPECT_STREQ(kTelvaneHierarchyTokenTokenID, "token");
  EXPECT_STREQ(kTelvaneBackendHTTPPost, "splunk");
  EXPECT_STREQ(kTelvaneErrorDomain, "TelvaneErrorDomain");
}

// What a module's callback was called with, and what it does then.
struct Module {
  TelvaneRef session = nullptr;
  std::function<void(plist_t metrics)> act = {};
  std::atomic<int> updates = 0;
  std::atomic<int> reports = 0;
  std::atomic<bool> wasEmpty = true;

  static void call(plist_t metrics, void* context) {
    Module& module = *static_cast<Module*>(context);
    if (metrics == nullptr) {
      ++module.updates;
      return;
    }
    if (plist_get_node_type(metrics) != PLIST_DICT || plist_dict_get_size(metrics) != 0) module.wasEmpty = false;
    if (module.act) module.act(metrics);
    ++module.reports;
  }
};

TEST_F(TelvaneAPITest, reportsThePeriodicMetricsOfItsModules) {
  Module first{.act = [](plist_t metrics) { plist_dict_set_item(metrics, "frames", plist_new_uint(30)); }};
  Module second{.act = [](plist_t metrics) { plist_dict_set_item(metrics, "drops", plist_new_uint(2)); }};
  const Session session = open();
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, true, true, Module::call, &first));
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 2, false, true, Module::call, &second));
  TelvaneStartLogTimerWithInterval(session.get(), 1, 1, 40000, 65535);
  ASSERT_TRUE(script().waitFor(Operation::SendMessageWithDictionary, 1));
  TelvaneStopLogTimer(session.get());
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 2));
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 2)) << "although it is gone";
  EXPECT_EQ(lastMessage(), (Dictionary{{Key("ParametersCategory"), 40000},
                                       {Key("ParametersType"), 65535},
                                       {Key("ParametersPayload"), Dictionary{{Key("frames"), 30}, {Key("drops"), 2}}},
                                       {Key("ParametersFlag"), 1}}));
  EXPECT_TRUE(first.wasEmpty && second.wasEmpty);
  EXPECT_GE(first.reports, 1);
  EXPECT_EQ(first.updates, 0);
}

TEST_F(TelvaneAPITest, updatesWithoutADictionary) {
  Module module;
  const Session session = open();
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, true, true, Module::call, &module));
  TelvaneStartLogTimerWithInterval(session.get(), 1000, 0, 5, 6);
  while (module.updates == 0) std::this_thread::yield();
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
  EXPECT_EQ(module.updates, 1);
  EXPECT_EQ(module.reports, 0);
}

TEST_F(TelvaneAPITest, refusesANullModuleCallback) {
  const Session session = open();
  EXPECT_FALSE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, true, true, nullptr, nullptr));
}

TEST_F(TelvaneAPITest, reportsWithoutMetricsThatCannotBeCarried) {
  Module bad{.act = [](plist_t metrics) { plist_dict_set_item(metrics, "deep", tooDeepDictionary().release()); }};
  Module good{.act = [](plist_t metrics) { plist_dict_set_item(metrics, "a", plist_new_uint(1)); }};
  const Session session = open();
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, false, true, Module::call, &bad));
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 2, false, true, Module::call, &good));
  TelvaneStartLogTimerWithInterval(session.get(), 1000, 1, 5, 6);
  ASSERT_TRUE(script().waitFor(Operation::SendMessageWithDictionary, 1));
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 2));
  EXPECT_EQ(bad.reports, 1);
  EXPECT_EQ(lastMessage()["ParametersPayload"], Value(Dictionary{{Key("a"), 1}}));
}

TEST_F(TelvaneAPITest, unregistersAModuleInItsOwnCallback) {
  Module module;
  const Session session = open();
  module.act = [&](plist_t metrics) {
    plist_dict_set_item(metrics, "a", plist_new_uint(1));
    EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
    TelvaneStopLogTimer(session.get());
  };
  EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, true, true, Module::call, &module));
  TelvaneStartLogTimerWithInterval(session.get(), 1, 1, 5, 6);
  ASSERT_TRUE(script().waitFor(Operation::SendMessageWithDictionary, 1));
  flush(session);
  EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
  EXPECT_EQ(module.reports, 1);
}

// The context of a module goes as soon as the call returns, while its timer runs.
TEST_F(TelvaneAPITest, callsNoModuleThatIsUnregistered) {
  const Session session = open();
  for (int round = 0; round < 40; ++round) {
    std::atomic<bool> isGone = false;
    auto module = std::make_unique<Module>();
    module->act = [&](plist_t) {
      for (int i = 0; i < 100; ++i) std::this_thread::yield();
      EXPECT_FALSE(isGone);
    };
    EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1, true, true, Module::call, module.get()));
    TelvaneStartLogTimerWithInterval(session.get(), 1000, 1, 5, 6);
    if (round % 2 == 0) {
      while (module->reports == 0) std::this_thread::yield();
    }
    TelvaneStopLogTimer(session.get());
    EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1));
    isGone = true;
    module.reset();
  }
}

// Threads register and unregister, start and stop, all at once; a context goes as soon as its module is unregistered.
TEST_F(TelvaneAPITest, keepsThePromiseOfUnregisteringHoweverThreadsMeet) {
  const Session session = open();
  std::atomic<bool> isDone = false;
  std::thread timer([&] {
    Module pulse;
    EXPECT_TRUE(TelvaneRegisterPeriodicTaskForModule(session.get(), 1000, true, true, Module::call, &pulse));
    while (!isDone) {
      const int before = pulse.updates;
      TelvaneStartLogTimerWithInterval(session.get(), 1, 2, 5, 6);
      while (pulse.updates == before) std::this_thread::yield();
      TelvaneStopLogTimer(session.get());
    }
    EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), 1000));
  });
  std::vector<std::thread> threads;
  std::atomic<int> calls = 0;
  for (uint32_t number = 1; number <= 3; ++number) {
    threads.emplace_back([&, number] {
      for (int round = 0; round < 100; ++round) {
        auto module = std::make_unique<Module>();
        module->act = [&calls](plist_t metrics) {
          ++calls;
          plist_dict_set_item(metrics, "a", plist_new_uint(1));
        };
        EXPECT_TRUE(
            TelvaneRegisterPeriodicTaskForModule(session.get(), number, true, true, Module::call, module.get()));
        while (round % 10 == 0 && module->updates == 0) std::this_thread::yield();
        EXPECT_TRUE(TelvaneUnregisterPeriodTaskForModule(session.get(), number));
        calls += module->updates;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  isDone = true;
  timer.join();
  EXPECT_GE(calls, 30);
  EXPECT_FALSE(flush(session).hasError);
}

TEST_F(TelvaneAPITest, finishesASessionThatIsReleased) {
  Session session = open();
  EXPECT_TRUE(TelvaneSendMessageWithError(session.get(), 1, 1, nullptr, nullptr));
  session.reset();
  EXPECT_TRUE(script().waitFor(Operation::FinishSessionGracefully, 1));
  EXPECT_EQ(script().operations(),
            (std::vector<Operation>{Operation::SetSessionInfo, Operation::SendMessageWithDictionary,
                                    Operation::FinishSessionGracefully}));
}

}  // namespace
}  // namespace telvane::testing
