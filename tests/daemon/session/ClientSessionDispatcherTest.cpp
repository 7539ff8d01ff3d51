// Calls as a hostile or broken client makes them: every argument and every key absent and of every wrong type. The
// daemon stays up and the next session works.
#include "interfaces/AgentKeys.h"
#include "interfaces/EventKeys.h"
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

const Array& oneOfEachKind() {
  static const Array values{Value(),
                            true,
                            int64_t{-1},
                            UINT64_MAX,
                            1.5,
                            "text",
                            Data::copyOf("data"),
                            SimulatedClock::kCalendarStart,
                            Value(Array{1, "two"}),
                            Value(Dictionary{{Key("k"), 1}})};
  return values;
}

class ClientSessionDispatcherTest : public DaemonFixture {
 protected:
  void SetUp() override {
    givenStorebag();
    log().allowErrors();
  }
  void TearDown() override {
    const auto next = startSession(sessionInfo(6, 4711), userInfo("after", "all"));
    EXPECT_EQ(next->fetchStates(userInfo("after", "all"))[0], Value(Array{"splunk"}));
    next->send(12345, 1);
    next->flush();
    EXPECT_EQ(postedEvents(12345, 1).size(), 1u) << "the next session does not work";
  }
  // Opens, starts, sends and ends a session whose session info, user info or message has one key changed.
  void runSession(const Value& info, const Value& user, const Value& sent) {
    const auto client = openSession();
    client->setSessionInfo(info, user);
    client->start();
    client->sendMessage(sent);
    client->flush();
    const auto fresh = connect();
    fresh->setSessionInfo(info, user);
    fresh->start();
    fresh->fetchStates(user);
    fresh->sendMessage(sent);
    fresh->flush();
    connect()->sendOneMessage(info, user);
  }
  static Dictionary with(Dictionary dictionary, const Key& key, const Value& value) {
    dictionary.set(key, value);
    return dictionary;
  }
  const Dictionary message{{kTelvaneMessageParametersCategory, 7},
                           {kTelvaneMessageParametersType, 1},
                           {kTelvaneMessageParametersPayload, Dictionary{{Key("k"), 1}}}};
};

TEST_F(ClientSessionDispatcherTest, survivesEveryKindUnderEverySessionInfoKey) {
  for (const Key& key : {kTelvaneSessionInfoEnableFlag, kTelvaneSessionInfoClientType, kTelvaneSessionInfoClientVersion,
                         kTelvaneSessionInfoSessionID, kTelvaneSessionInfoBatchEvent,
                         kTelvaneSessionInfoRequireUserInfo, kTelvaneSessionInfoHierarchyToken}) {
    for (const Value& value : oneOfEachKind()) runSession(with(sessionInfo(), key, value), userInfo(), message);
  }
  EXPECT_TRUE(sessions().empty());
}

TEST_F(ClientSessionDispatcherTest, survivesEveryKindUnderEveryHierarchyKey) {
  for (const Key& key : {kTelvaneHierarchyTokenTokenID, kTelvaneHierarchyTokenLevel}) {
    for (const Value& value : oneOfEachKind()) {
      const Dictionary token =
          with({{kTelvaneHierarchyTokenTokenID, "a"}, {kTelvaneHierarchyTokenLevel, 1}}, key, value);
      runSession(with(sessionInfo(), kTelvaneSessionInfoHierarchyToken, token), userInfo(), message);
    }
  }
  EXPECT_TRUE(sessions().empty());
}

TEST_F(ClientSessionDispatcherTest, survivesEveryKindUnderEveryUserInfoKey) {
  for (const Key& key : {kTelvaneUserInfoClientName, kTelvaneUserInfoServiceName, Key("other")}) {
    for (const Value& value : oneOfEachKind()) runSession(sessionInfo(), with(userInfo(), key, value), message);
  }
}

TEST_F(ClientSessionDispatcherTest, survivesEveryKindUnderEveryMessageKey) {
  for (const Key& key : {kTelvaneMessageParametersCategory, kTelvaneMessageParametersType,
                         kTelvaneMessageParametersPayload, kTelvaneMessageParametersFlag}) {
    for (const Value& value : oneOfEachKind()) runSession(sessionInfo(), userInfo(), with(message, key, value));
  }
}

TEST_F(ClientSessionDispatcherTest, survivesEveryKindInPlaceOfEveryDictionary) {
  for (const Value& value : oneOfEachKind()) {
    runSession(value, userInfo(), message);
    runSession(sessionInfo(), value, message);
    runSession(sessionInfo(), userInfo(), value);
  }
}

TEST_F(ClientSessionDispatcherTest, survivesEveryOperationWithEveryKindOfArgument) {
  const auto client = startSession();
  for (uint16_t operation = 0; operation <= 40; ++operation) {
    for (const Value& value : oneOfEachKind()) {
      client->ask(static_cast<ClientSessionOperation>(operation), {value, value, value, value, value});
    }
    client->ask(static_cast<ClientSessionOperation>(operation), {});
  }
  EXPECT_TRUE(hasLine(log(), LogLevel::Error, "ClientSessionDispatcher(invoke): there is no operation 0"));
  EXPECT_TRUE(hasLine(log(), LogLevel::Error, "ClientSessionDispatcher(invoke): there is no operation 40"));
}

TEST_F(ClientSessionDispatcherTest, anOperationThatDoesNotExistFailsForItsCaller) {
  const auto client = startSession();
  const Answer answer = client->ask(static_cast<ClientSessionOperation>(99));
  EXPECT_FALSE(answer.values.has_value());
  EXPECT_TRUE(answer.error.has_value());
  EXPECT_EQ(client->fetchStates(userInfo())[0], Value(Array{"splunk"}));
}

TEST_F(ClientSessionDispatcherTest, aPayloadOfAnotherKindCountsAsNone) {
  const auto client = startSession();
  client->sendMessage(with(message, kTelvaneMessageParametersPayload, "text"));
  client->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
}

TEST_F(ClientSessionDispatcherTest, tellsWhatTheDaemonHoldsButNoEvent) {
  const auto client = startSession(sessionInfoIn("a", 0));
  client->send(7, 1, {{Key("secret"), "hidden"}});
  const Answer answer = client->ask(ClientSessionOperation::DaemonStatus);
  ASSERT_TRUE(answer[0].isDictionary());
  const Dictionary& status = *answer[0].dictionary();
  EXPECT_THAT(status, HasEntry("version", "1.0"));
  EXPECT_THAT(status, HasEntry("sessions", 1));
  EXPECT_THAT(status, HasEntry("hierarchies", 1));
  EXPECT_THAT(status, HasEntry("transactions", 1));
  EXPECT_THAT(status, HasEntry("connectivityHelpers", 1));
  EXPECT_THAT(status, HasEntry("clientTypes", Dictionary{{Key("6 MEDIA"), 1}}));
  const std::string text(description(answer[0]));
  EXPECT_EQ(text.find("hidden"), std::string::npos) << text;
  const Dictionary& bag = *(*status[kStatusStorebags].dictionary())[kBagName].dictionary();
  EXPECT_THAT(bag, HasEntry("version", "3.1"));
  EXPECT_THAT(bag, HasEntry("state", "Fetch Successful"));
}

}  // namespace
}  // namespace telvane::testing
