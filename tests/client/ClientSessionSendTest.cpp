#include <stdexcept>

#include "client/ClientSession.h"
#include "tests/client/ClientFixture.h"

namespace telvane::testing {
namespace {

class Listener final : public TelvaneMessageSentDelegate {
 public:
  void didSendMessageForReportingClient(const std::shared_ptr<Telvane>& client, const Dictionary& event) override {
    clients.push_back(client.get());
    events.push_back(event);
    if (throws) throw std::runtime_error("no");
  }
  std::vector<const Telvane*> clients;
  std::vector<Dictionary> events;
  bool throws = false;
};

class ClientSessionSendTest : public ClientFixture {
 protected:
  ClientSessionSendTest() { daemon().answer(Operation::SendMessageWithDictionary, Array{Value()}); }
  Dictionary lastMessage() {
    const Value& sent = daemon().last(Operation::SendMessageWithDictionary).arguments[0];
    return sent.isDictionary() ? *sent.dictionary() : Dictionary();
  }
  size_t sentCount() { return daemon().count(Operation::SendMessageWithDictionary); }
};

TEST_F(ClientSessionSendTest, forwardsTheDictionaryUnchanged) {
  const auto session = open();
  Dictionary event = message(7, 70000);
  event.set(kTelvaneMessageParametersFlag, 3);
  event.set(kTelvaneMessageParametersPayload, Dictionary{{Key("a"), Array{1, 2.5, true}}});
  std::optional<Error> error = Error("old", 1);
  EXPECT_TRUE(session->sendMessageWithDictionary(event, &error));
  EXPECT_EQ(error, std::nullopt);
  run();
  EXPECT_EQ(lastMessage(), event);
}

TEST_F(ClientSessionSendTest, refusesAMessageWithoutCategoryOrType) {
  const auto session = open();
  std::optional<Error> error;
  EXPECT_FALSE(session->sendMessageWithDictionary({{kTelvaneMessageParametersType, 1}}, &error));
  EXPECT_EQ(error, Error("Missing mandatory parameter 'category'", 7));
  EXPECT_FALSE(session->sendMessageWithDictionary({{kTelvaneMessageParametersCategory, 1}}, &error));
  EXPECT_EQ(error, Error("Missing mandatory parameter 'type'", 7));
  EXPECT_FALSE(session->sendMessageWithDictionary({}, nullptr));
  run();
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionSendTest, refusesACategoryWhoseLow16BitsAreZero) {
  const auto session = open();
  for (int category : {0, 65536}) {
    std::optional<Error> error;
    EXPECT_FALSE(session->sendMessageWithDictionary(message(category), &error)) << category;
    ASSERT_THAT(error, HasCode(4)) << category;
    EXPECT_EQ(error->domain(), "TelvaneErrorDomain");
  }
  std::optional<Error> error;
  EXPECT_FALSE(session->sendMessageWithCategory(0, 1, {}, &error));
  EXPECT_THAT(error, HasCode(4));
  run();
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionSendTest, buildsTheDictionaryOfACategoryAndAType) {
  const auto session = open();
  std::optional<Error> error = Error("old", 1);
  EXPECT_TRUE(session->sendMessageWithCategory(40000, 65535, Dictionary{{Key("a"), 1}}, &error));
  EXPECT_EQ(error, std::nullopt);
  run();
  EXPECT_EQ(lastMessage(), (Dictionary{{kTelvaneMessageParametersCategory, 40000},
                                       {kTelvaneMessageParametersType, 65535},
                                       {kTelvaneMessageParametersPayload, Dictionary{{Key("a"), 1}}},
                                       {kTelvaneMessageParametersFlag, 0}}));
  EXPECT_TRUE(session->sendMessageWithCategory(1, 0));
  run();
  EXPECT_FALSE(lastMessage().contains(kTelvaneMessageParametersPayload));
}

TEST_F(ClientSessionSendTest, forwardsEveryCategoryBeforeTheConfigurationHasAnswered) {
  daemon().answer(Operation::StartConfig, [](const ScriptedDaemon::Call&, ipc::ReplyBlock) {});
  log().allowErrors();
  const auto session = open();
  session->startConfigurationWithCompletionHandler({});
  for (int category : {1, 8, 65535}) EXPECT_TRUE(session->sendMessageWithDictionary(message(category)));
  run();
  EXPECT_EQ(sentCount(), 3u);
}

TEST_F(ClientSessionSendTest, filtersWhatTheWhiteListDoesNotName) {
  const auto session = openConfigured(Array{"splunk"}, Array{7});
  std::optional<Error> error = Error("old", 1);
  EXPECT_FALSE(session->sendMessageWithDictionary(message(8), &error));
  EXPECT_EQ(error, std::nullopt) << "a filtered message is no error";
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  EXPECT_TRUE(session->isWhitelistedEvent(7));
  EXPECT_FALSE(session->isWhitelistedEvent(8));
  run();
  EXPECT_EQ(sentCount(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "Event 8 is filtered by storebag"));
}

TEST_F(ClientSessionSendTest, filtersWhatTheBlackListNames) {
  const auto session = openConfigured(Array{"splunk"}, Array{7}, Array{7});
  EXPECT_FALSE(session->sendMessageWithDictionary(message(7)));
  EXPECT_TRUE(session->isBlacklistedEvent(7));
  run();
  EXPECT_EQ(sentCount(), 0u);
  EXPECT_TRUE(hasLines(log(), 1, "Event 7 is filtered by storebag"));
}

TEST_F(ClientSessionSendTest, filtersByTheLow16BitsOfTheCategory) {
  const auto session = openConfigured({}, Array{7});
  EXPECT_TRUE(session->sendMessageWithDictionary(message(65536 + 7)));
  run();
  EXPECT_EQ(sentCount(), 1u);
}

TEST_F(ClientSessionSendTest, takesAFilteredCategoryForASuccessInTheShortForm) {
  const auto session = openConfigured({}, Array{7});
  std::optional<Error> error;
  EXPECT_TRUE(session->sendMessageWithCategory(8, 1, {}, &error));
  EXPECT_EQ(error, std::nullopt);
  run();
  EXPECT_EQ(sentCount(), 0u);
}

TEST_F(ClientSessionSendTest, logsTheAnswerAndGivesItToTheLoggingBlock) {
  daemon().answer(Operation::SendMessageWithDictionary, Array{"event 1"});
  std::vector<String> texts;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String& text) { texts.push_back(text); });
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  run();
  EXPECT_EQ(texts, std::vector<String>{"event 1"});
  EXPECT_TRUE(hasLines(log(), 1, "sendMessageWithDictionary: event 1"));
  EXPECT_TRUE(hasLines(log(), 1, "setMessageLoggingBlock: called"));
}

TEST_F(ClientSessionSendTest, doesNotGiveAnAbsentAnswerToTheLoggingBlock) {
  bool isCalled = false;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String&) { isCalled = true; });
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  run();
  EXPECT_FALSE(isCalled);
  EXPECT_TRUE(hasLines(log(), 1, "sendMessageWithDictionary: (null)"));
}

TEST_F(ClientSessionSendTest, returnsAndTakesAwayTheLoggingBlock) {
  const auto session = open();
  EXPECT_FALSE(session->messageLoggingBlock());
  session->setMessageLoggingBlock([](const String&) {});
  run();
  EXPECT_TRUE(session->messageLoggingBlock());
  session->setMessageLoggingBlock({});
  run();
  EXPECT_FALSE(session->messageLoggingBlock());
}

TEST_F(ClientSessionSendTest, survivesALoggingBlockThatThrows) {
  daemon().answer(Operation::SendMessageWithDictionary, Array{"text"});
  log().expectError("sendMessageWithDictionary: Exception in a block of the client: no");
  const auto session = open();
  session->setMessageLoggingBlock([](const String&) { throw std::runtime_error("no"); });
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  EXPECT_TRUE(session->sendMessageWithDictionary(message(8)));
  run();
  EXPECT_EQ(sentCount(), 2u);
}

TEST_F(ClientSessionSendTest, logsAMessageThatIsLostOnTheWay) {
  log().expectError("sendMessageWithDictionary: Failed to get remote object proxy: ");
  daemon().answer(Operation::SendMessageWithDictionary, [](const ScriptedDaemon::Call&, ipc::ReplyBlock) {});
  const auto session = open();
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  run();
}

TEST_F(ClientSessionSendTest, tellsTheDelegateAlsoOfFilteredMessages) {
  const auto listener = std::make_shared<Listener>();
  const auto session = openConfigured({}, Array{7});
  session->setMessageSentDelegate(listener);
  run();
  EXPECT_EQ(session->messageSentDelegate(), listener);
  EXPECT_FALSE(session->sendMessageWithDictionary(message(8)));
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  EXPECT_TRUE(listener->events.empty()) << "the delegate is told on the reporting queue, not on the caller's thread";
  run();
  EXPECT_EQ(listener->events, (std::vector<Dictionary>{message(8), message(7)}));
  EXPECT_EQ(listener->clients, (std::vector<const Telvane*>{session.get(), session.get()}));
  EXPECT_TRUE(hasLines(log(), 2, "notifyMessageWasSent: called"));
  EXPECT_EQ(sentCount(), 1u);
}

TEST_F(ClientSessionSendTest, doesNotTellTheDelegateOfMalformedMessages) {
  const auto listener = std::make_shared<Listener>();
  const auto session = open();
  session->setMessageSentDelegate(listener);
  EXPECT_FALSE(session->sendMessageWithDictionary(message(0)));
  EXPECT_FALSE(session->sendMessageWithDictionary({}));
  run();
  EXPECT_TRUE(listener->events.empty());
}

TEST_F(ClientSessionSendTest, logsTheLow32BitsOfTheDelegatesAddress) {
  const auto listener = std::make_shared<Listener>();
  const auto address = fmt::format(
      "{:x}:",
      static_cast<uint32_t>(reinterpret_cast<uintptr_t>(static_cast<TelvaneMessageSentDelegate*>(listener.get()))));
  const auto session = open();
  EXPECT_EQ(session->messageSentDelegate(), nullptr);
  EXPECT_TRUE(hasLines(log(), 1, "Message Sent Delegate reads 0:"));
  session->setMessageSentDelegate(listener);
  run();
  EXPECT_NE(session->messageSentDelegate(), nullptr);
  EXPECT_TRUE(hasLines(log(), 1, "Message Sent Delegate is set to " + address));
  EXPECT_TRUE(hasLines(log(), 1, "Message Sent Delegate reads " + address));
}

TEST_F(ClientSessionSendTest, holdsTheDelegateWeaklyButThroughAMessageThatWaits) {
  auto listener = std::make_shared<Listener>();
  const std::weak_ptr<Listener> weak = listener;
  const auto session = open();
  session->setMessageSentDelegate(listener);
  run();
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  listener.reset();
  EXPECT_FALSE(weak.expired()) << "a message that waits holds the delegate";
  run();
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(session->messageSentDelegate(), nullptr);
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  run();
  EXPECT_EQ(sentCount(), 2u);
}

TEST_F(ClientSessionSendTest, survivesADelegateThatThrows) {
  const auto listener = std::make_shared<Listener>();
  listener->throws = true;
  log().expectError("notifyMessageWasSent: Exception in a block of the client: no");
  const auto session = open();
  session->setMessageSentDelegate(listener);
  EXPECT_TRUE(session->sendMessageWithDictionary(message(7)));
  run();
  EXPECT_EQ(sentCount(), 1u);
}

TEST_F(ClientSessionSendTest, anEventAndItsNoticeCountOnceAndAreDroppedTogether) {
  log().expectError("Dropped 1 events");
  const auto listener = std::make_shared<Listener>();
  const auto session = open();
  session->setMessageSentDelegate(listener);
  run();
  const Dictionary payload{{Key("text"), std::string(ReportingQueue::kMaximumWaitingBytes / 5 * 2, 'x')}};
  for (uint16_t category : {1, 2, 3}) EXPECT_TRUE(session->sendMessageWithCategory(category, 1, payload));
  run();
  EXPECT_EQ(listener->events.size(), 2u);
  EXPECT_EQ(sentCount(), 2u);
  EXPECT_TRUE(hasNoLine(log(), "notices"));
}

TEST_F(ClientSessionSendTest, keepsTheOrderOfCalls) {
  daemon().answer(Operation::FlushMessages, Array{Value(), Value()});
  const auto listener = std::make_shared<Listener>();
  const auto session = open();
  session->setMessageSentDelegate(listener);
  Operations expected{Operation::SetSessionInfo};
  for (int i = 1; i <= 20; ++i) {
    EXPECT_TRUE(session->sendMessageWithCategory(static_cast<uint16_t>(i), 1));
    session->updateSharedDataForKey("key", i);
    session->flushMessages();
    expected.insert(expected.end(), {Operation::SendMessageWithDictionary, Operation::UpdateSharedDataForKey,
                                     Operation::FlushMessages});
  }
  run();
  EXPECT_EQ(daemon().operations(), expected);
  int category = 0;
  for (const ScriptedDaemon::Call& call : daemon().calls()) {
    if (call.operation != Operation::SendMessageWithDictionary) continue;
    EXPECT_EQ((*call.arguments[0].dictionary())[kTelvaneMessageParametersCategory], Value(++category));
  }
}

}  // namespace
}  // namespace telvane::testing
