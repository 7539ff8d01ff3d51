#include <stdexcept>

#include "tests/client/ClientFixture.h"

namespace telvane::testing {
namespace {

class ClientSessionConfigurationTest : public ClientFixture {};

TEST_F(ClientSessionConfigurationTest, asksForTheConfigurationAndThenForTheDisplayURL) {
  log().allowErrors();
  const auto session = open();
  session->startConfigurationWithCompletionHandler({});
  run();
  EXPECT_EQ(daemon().operations(),
            (Operations{Operation::SetSessionInfo, Operation::StartConfig, Operation::FetchDisplayURL}));
}

TEST_F(ClientSessionConfigurationTest, givesTheEnabledBackendsToTheCompletionAndCachesAllThree) {
  daemon().answer(Operation::StartConfig, Array{Array{"splunk", "upload_server"}, Array{7}, Array{9, 10}});
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  std::vector<Value> answers;
  const auto session = open();
  EXPECT_FALSE(session->serverSupportsFileUpload());
  session->startConfigurationWithCompletionHandler([&](const Value& names) { answers.push_back(names); });
  run();
  EXPECT_EQ(answers, std::vector<Value>{Array({"splunk", "upload_server"})});
  EXPECT_TRUE(session->isWhitelistedEvent(7));
  EXPECT_FALSE(session->isWhitelistedEvent(8));
  EXPECT_TRUE(session->isBlacklistedEvent(10));
  EXPECT_TRUE(session->serverSupportsFileUpload());
  EXPECT_TRUE(hasLines(
      log(), 1,
      "Cached 2 enabled backends, (" + description(Array{7}) + ", " + description(Array{9, 10}) + ") listed events"));
}

TEST_F(ClientSessionConfigurationTest, cachesAbsentAnswersAsAbsent) {
  daemon().answer(Operation::StartConfig, Array{Value(), Value(), Value()});
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  std::vector<Value> answers;
  const auto session = open();
  session->startConfigurationWithCompletionHandler([&](const Value& names) { answers.push_back(names); });
  run();
  EXPECT_EQ(answers, std::vector<Value>{Value()});
  EXPECT_TRUE(hasLines(log(), 1, "Cached 0 enabled backends, ((null), (null)) listed events"));
}

TEST_F(ClientSessionConfigurationTest, survivesAnAnswerOfAWrongShape) {
  daemon().answer(Operation::StartConfig, Array{17, "7", Dictionary()});
  daemon().answer(Operation::FetchDisplayURL, Array{Array{1}});
  std::vector<String> texts;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String& text) { texts.push_back(text); });
  session->startConfigurationWithCompletionHandler({});
  run();
  EXPECT_TRUE(session->isWhitelistedEvent(8));
  EXPECT_FALSE(session->serverSupportsFileUpload());
  EXPECT_TRUE(texts.empty()) << "an answer that is no text is no URL";
  EXPECT_TRUE(hasLine(log(), "display URL is (null)"));
}

TEST_F(ClientSessionConfigurationTest, givesTheDisplayURLToTheLoggingBlock) {
  daemon().answer(Operation::StartConfig, Array{});
  daemon().answer(Operation::FetchDisplayURL, Array{"https://show.example/1"});
  std::vector<String> texts;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String& text) { texts.push_back(text); });
  session->startConfigurationWithCompletionHandler({});
  run();
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  session->startConfigurationWithCompletionHandler({});
  run();
  EXPECT_EQ(texts, (std::vector<String>{"URL for the session is: https://show.example/1", "URL not available"}));
}

TEST_F(ClientSessionConfigurationTest, givesNoAbsentDisplayURLToTheLoggingBlock) {
  daemon().answer(Operation::StartConfig, Array{});
  daemon().answer(Operation::FetchDisplayURL, Array{Value()});
  bool isCalled = false;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String&) { isCalled = true; });
  session->startConfigurationWithCompletionHandler({});
  run();
  EXPECT_FALSE(isCalled);
  EXPECT_TRUE(hasLine(log(), "display URL is (null)"));
}

TEST_F(ClientSessionConfigurationTest, doesNotCallTheCompletionOfAConfigurationThatIsLost) {
  bool isCalled = false;
  log().expectError("startConfigurationWithCompletionHandler: Failed to get remote object proxy: ");
  const auto session = open();
  session->startConfigurationWithCompletionHandler([&](const Value&) { isCalled = true; });
  run();
  daemon().dropReplies();
  run();
  EXPECT_FALSE(isCalled);
}

TEST_F(ClientSessionConfigurationTest, fetchesTheStatesForNewUserInfo) {
  daemon().answer(Operation::FetchStates, Array{Array{"gonzo"}, Array{3}, Value()});
  std::vector<Value> answers;
  const auto session = open();
  const Dictionary userInfo{{kTelvaneUserInfoServiceName, "s"}};
  session->fetchReportingStatesWithUserInfo(userInfo, [&](const Value& names) { answers.push_back(names); });
  session->fetchReportingStatesWithUserInfo({}, {});
  run();
  EXPECT_EQ(daemon().calls()[1].arguments, Array{userInfo});
  EXPECT_FALSE(daemon().calls()[2].arguments[0].isPresent());
  EXPECT_EQ(answers, std::vector<Value>{Array({"gonzo"})});
  EXPECT_FALSE(session->isWhitelistedEvent(4));
}

TEST_F(ClientSessionConfigurationTest, tellsTheCompletionOfAFetchThatIsLost) {
  std::vector<Value> answers;
  log().expectError("fetchReportingStatesWithUserInfo: Failed to get remote object proxy: ");
  const auto session = open();
  session->fetchReportingStatesWithUserInfo({}, [&](const Value& names) { answers.push_back(names); });
  session->fetchReportingStatesWithUserInfo({}, {});
  run();
  daemon().dropReplies();
  run();
  EXPECT_EQ(answers, std::vector<Value>{Value()});
}

TEST_F(ClientSessionConfigurationTest, survivesACompletionThatThrows) {
  log().expectError("startConfigurationWithCompletionHandler: Exception in a block of the client");
  daemon().answer(Operation::StartConfig, Array{Array{"splunk"}, Array{7}, Value()});
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  const auto session = open();
  session->startConfigurationWithCompletionHandler([](const Value&) { throw 1; });
  run();
  EXPECT_FALSE(session->isWhitelistedEvent(8)) << "the answer is cached all the same";
}

TEST_F(ClientSessionConfigurationTest, saysWhetherFilesMayBeUploaded) {
  const auto session = openConfigured(Array{"splunk", "gonzo"});
  EXPECT_FALSE(session->serverSupportsFileUpload());
  EXPECT_TRUE(hasLine(log(), "serverSupportsFileUpload:NO (2 backends)"));
  const auto other = openConfigured(Array{"upload_server"});
  EXPECT_TRUE(other->serverSupportsFileUpload());
  EXPECT_TRUE(hasLine(log(), "serverSupportsFileUpload:YES (1 backends)"));
}

}  // namespace
}  // namespace telvane::testing
