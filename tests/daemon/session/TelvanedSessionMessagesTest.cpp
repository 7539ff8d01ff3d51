// The road of a message through a session.
#include "interfaces/ErrorCoding.h"
#include "tests/daemon/DaemonFixture.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

class TelvanedSessionMessagesTest : public DaemonFixture {
 protected:
  static Dictionary message(Value category, Value type, Value payload = {}, Value flag = {}) {
    Dictionary result;
    result.set(kTelvaneMessageParametersCategory, std::move(category));
    result.set(kTelvaneMessageParametersType, std::move(type));
    result.set(kTelvaneMessageParametersPayload, std::move(payload));
    result.set(kTelvaneMessageParametersFlag, std::move(flag));
    return result;
  }
  // A session whose backends tell the client what they post, event by event.
  std::unique_ptr<DaemonClient> startTalkativeSession() {
    givenDefault(kTelvaneDefaultsSuite, kDefaultsForceEventLogging, true);
    Dictionary info = sessionInfo();
    info.set(kTelvaneSessionInfoBatchEvent, false);
    return startSession(info);
  }
  static Error errorOf(const Answer& answer) {
    const auto error = errorcoding::decode(answer[1]);
    return error.has_value() ? *error : Error("none", 0);
  }
};

TEST_F(TelvanedSessionMessagesTest, category0IsSent) {
  givenStorebag();
  const auto client = startSession();
  client->send(0, 9);
  client->flush();
  EXPECT_EQ(postedEvents(0, 9).size(), 1u);
  EXPECT_TRUE(hasLine(log(), "sendMessageWithDictionary: Sending message for session 42"));
}

TEST_F(TelvanedSessionMessagesTest, onlyTheLow16BitsOfNumbersCount) {
  givenStorebag();
  const auto client = startSession();
  client->sendMessage(message(70000, 65537, Dictionary{{Key("k"), 1}}));
  client->flush();
  ASSERT_EQ(postedEvents(4464, 1).size(), 1u);
  EXPECT_THAT(postedEvents(4464, 1)[0], HasEntry("k", 1));
}

TEST_F(TelvanedSessionMessagesTest, aMissingCategoryOrTypeDropsTheMessage) {
  givenStorebag();
  const auto client = startSession();
  for (const Dictionary& incomplete : {message(Value(), 1), message(1, Value()), Dictionary()}) {
    const Answer answer = client->sendMessage(incomplete);
    ASSERT_TRUE(answer.values.has_value());
    EXPECT_EQ(answer[0], Value());
  }
  EXPECT_TRUE(hasLines(log(), 2, "sendMessageWithDictionary: Missing mandatory parameter 'category'"));
  EXPECT_TRUE(hasLines(log(), 1, "sendMessageWithDictionary: Missing mandatory parameter 'type'"));
}

TEST_F(TelvanedSessionMessagesTest, withoutBackendsNothingIsSent) {
  const auto client = openSession();
  EXPECT_EQ(client->send(7)[0], Value());
  EXPECT_TRUE(hasLine(log(), "sendMessageWithDictionary: No backends available to send message"));
}

TEST_F(TelvanedSessionMessagesTest, aMissingFlagIsOrdinaryAndARealtimeOneGoesAtOnce) {
  givenStorebag();
  const auto client = startSession();
  client->flush();
  const size_t before = world.network().countTo(StorebagBuilder::kPostURL);
  client->sendMessage(message(7, 1));
  EXPECT_EQ(world.network().countTo(StorebagBuilder::kPostURL), before);
  client->sendMessage(message(7, 2, Value(), 1));
  EXPECT_EQ(postedEvents(7, 2).size(), 1u);
}

TEST_F(TelvanedSessionMessagesTest, aCategoryThatIsNotWhitelistedIsDroppedWithoutAReply) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryEventWhitelist, Array{5})));
  const auto client = startTalkativeSession();
  EXPECT_EQ(client->send(7)[0], Value());
  EXPECT_TRUE(hasLine(log(),
                      "sendMessageWithDictionary: Dropping event with category 7 as it is not whitelisted for "
                      "backend splunk"));
  EXPECT_TRUE(client->send(5)[0].isString());
  EXPECT_EQ(postedEvents(7, 1).size(), 0u);
  EXPECT_EQ(postedEvents(5, 1).size(), 1u);
}

TEST_F(TelvanedSessionMessagesTest, aBlacklistedCategoryIsDroppedForThatBackendAlone) {
  givenSection(sectionOf(
      {{"splunk", clientWith(kClientEntryEventBlacklist, Array{7})}, {"gonzo", StorebagBuilder::permissiveClient()}}));
  const auto client = startTalkativeSession();
  client->send(7);
  EXPECT_TRUE(hasLine(log(),
                      "sendMessageWithDictionary: Dropping event with category 7 as it is blacklisted for "
                      "backend splunk"));
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
}

TEST_F(TelvanedSessionMessagesTest, theLastCollectorWithAResultAnswers) {
  Dictionary second = clientWith(kClientEntryEventBlacklist, Array{8});
  second.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterKey, "mark"}, {kFilterAction, "sha256"}})});
  givenSection(sectionOf({{"splunk", StorebagBuilder::permissiveClient()}, {"my_splunk_2", second}}));
  const auto client = startTalkativeSession();
  const Dictionary payload{{Key("mark"), "plain"}};
  const Answer ofTheSecond = client->send(7, 1, payload);
  EXPECT_THAT(std::string(ofTheSecond[0].text()), ::testing::HasSubstr("\"mark\": \"a116c9"));
  const Answer ofTheFirst = client->send(8, 1, payload);
  EXPECT_THAT(std::string(ofTheFirst[0].text()), ::testing::HasSubstr("\"mark\": \"plain\""))
      << "the second takes no such events, so it has no result";
}

TEST_F(TelvanedSessionMessagesTest, onlyCollectorsAnswerOfWhomClientsMayHear) {
  givenSection(StorebagBuilder::section("qrs"));
  const auto client = startTalkativeSession();
  const Answer answer = client->send(7);
  ASSERT_TRUE(answer.values.has_value());
  EXPECT_EQ(answer[0], Value());
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
}

TEST_F(TelvanedSessionMessagesTest, sendsToEveryBackend) {
  givenSection(
      sectionOf({{"splunk", StorebagBuilder::permissiveClient()}, {"gonzo", StorebagBuilder::permissiveClient()}}));
  const auto client = startSession();
  client->send(7);
  client->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 2u);
}

TEST_F(TelvanedSessionMessagesTest, flushingWithoutBackendsIsAnError) {
  const auto client = openSession();
  const Answer answer = client->flush();
  EXPECT_EQ(answer[0], Value());
  EXPECT_EQ(errorOf(answer).code(), -1);
  EXPECT_EQ(errorOf(answer).description(), "No backends available to send message");
  EXPECT_TRUE(hasLine(log(), "internalFlushMessagesWithCompletion: No backends available to send message"));
}

TEST_F(TelvanedSessionMessagesTest, aFlushAnswersOnceWithTheFirstError) {
  givenSection(sectionOf({{"splunk", StorebagBuilder::permissiveClient()},
                          {"splunk2", clientWith(kClientEntryEventWhitelist, Array{99})},
                          {"gonzo", StorebagBuilder::permissiveClient()}}));
  const auto client = startSession();
  client->flush();
  client->send(7);
  const Answer answer = client->flush();
  EXPECT_EQ(errorOf(answer).description(), "Nothing to flush");
  world.advance(std::chrono::seconds(1));
  EXPECT_TRUE(hasLines(log(), 2, "internalFlushMessagesWithCompletion: gonzo"));
  EXPECT_EQ(postedEvents(7, 1).size(), 2u);
}

TEST_F(TelvanedSessionMessagesTest, aFlushAnswersWhenTheLastBackendIsDone) {
  givenSection(sectionOf({{"splunk", StorebagBuilder::permissiveClient()},
                          {"gonzo", clientWith(kClientEntryPostURL, "https://slow.example/")}}));
  world.network().answer("https://slow.example/", NetworkAnswer::ok().after(std::chrono::seconds(5)));
  const auto client = startSession();
  const auto answer = client->askInPassing(ClientSessionOperation::FlushMessages);
  world.advance(std::chrono::seconds(4));
  EXPECT_FALSE(answer->values.has_value());
  world.advance(std::chrono::seconds(2));
  ASSERT_TRUE(answer->values.has_value());
  EXPECT_EQ((*answer)[1], Value()) << errorOf(*answer).description();
}

TEST_F(TelvanedSessionMessagesTest, aServerErrorOfAFlushReachesTheClientAndDisablesTheBackend) {
  givenStorebag();
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::status(503));
  log().allowErrors();
  const auto client = startSession();
  EXPECT_EQ(errorOf(client->flush()).code(), 503);
  EXPECT_EQ(client->fetchStates(userInfo())[0], Value(Array()));
}

TEST_F(TelvanedSessionMessagesTest, uploadsThatNoBackendTakesFail) {
  givenStorebag();
  const auto client = startSession();
  log().expectError("uploadFileWithURL: File upload failed for /tmp/log");
  log().expectError("uploadLogData: Log data array upload failed");
  EXPECT_EQ(client->ask(ClientSessionOperation::UploadFileAtPath, {"file:///tmp/log"})[0], Value(false));
  const Answer answer = client->ask(ClientSessionOperation::UploadLogData, {Array{Value(Dictionary())}});
  EXPECT_EQ(answer[0], Value(false));
  EXPECT_EQ(answer[1], Value());
  EXPECT_TRUE(hasLine(log(), "uploadFileAtPath: Uploading file for session 42"));
}

// A bag with an upload server beside the collector, and what the server says.
class TelvanedSessionUploadTest : public TelvanedSessionMessagesTest {
 protected:
  static constexpr char kUploadURL[] = "https://uploads.example/upload";
  TelvanedSessionUploadTest() {
    Dictionary section = sectionOf({{"splunk", StorebagBuilder::permissiveClient()}});
    section.set(kTelvaneBackendUploadServer, Dictionary{{kProfilePostURL, kUploadURL}});
    givenSection(section);
    givenAnswer("success");
    process.files().place("/tmp/a log", "one line");
  }
  void givenAnswer(const std::string& text) { world.network().answer(kUploadURL, NetworkAnswer::ok(text)); }
  ExtensionToken token() { return process.sandboxExtensions().newToken("/tmp/a log"); }
};

TEST_F(TelvanedSessionUploadTest, theFileGoesToTheUploadServerAndTheClientHearsOfIt) {
  const auto client = startSession();
  EXPECT_EQ(client->upload("file:///tmp/a%20log", token())[0], Value(true));
  EXPECT_TRUE(hasLine(log(), "uploadFileAtPath: Uploading file for session 42"));
  EXPECT_TRUE(hasLine(log(), "uploadFileWithURL: File upload successful for /tmp/a log"));
  const auto requests = world.network().requestsTo(kUploadURL);
  ASSERT_EQ(requests.size(), 1u);
  EXPECT_THAT(requests[0].request.url, ::testing::HasSubstr("&filename=a%20log.gz&raw=true"));
  EXPECT_EQ(RecordingConnectivity::bodyText(requests[0].request), "one line");
  EXPECT_TRUE(requests[0].isUpload);
  EXPECT_FALSE(process.files().exists("/tmp/a log"));
}

TEST_F(TelvanedSessionUploadTest, aServerThatDoesNotSaySuccessKeepsTheFileAndTheClientHearsNothingOfIt) {
  givenAnswer("no room");
  const auto client = startSession();
  EXPECT_EQ(client->upload("file:///tmp/a%20log", token())[0], Value(true));
  EXPECT_TRUE(process.files().exists("/tmp/a log"));
}

TEST_F(TelvanedSessionUploadTest, aFileWithoutATokenIsRefused) {
  const auto client = startSession();
  log().expectError("UploadBackend(uploadFileAtPath): Only upload a regular file.");
  log().expectError("uploadFileWithURL: File upload failed for /tmp/a log");
  EXPECT_EQ(client->upload("file:///tmp/a%20log", ExtensionToken())[0], Value(false));
  EXPECT_EQ(world.network().countTo(kUploadURL), 0u);
}

TEST_F(TelvanedSessionUploadTest, otherSessionsGoOnWhileOneWaitsForItsServer) {
  world.network().answer(kUploadURL, NetworkAnswer::ok().after(std::chrono::seconds(50)));
  const auto waiting = startSession();
  const auto other = startSession(sessionInfo(kClientType, 43));
  const auto upload = waiting->uploadInPassing("file:///tmp/a%20log", token());
  world.runUntilIdle();
  EXPECT_FALSE(upload->values.has_value());
  EXPECT_TRUE(other->send(7).values.has_value());
  EXPECT_EQ(errorOf(other->flush()).code(), 0);
  world.advance(std::chrono::seconds(51));
  EXPECT_EQ((*upload)[0], Value(true));
}

TEST_F(TelvanedSessionUploadTest, clientsThatAreGoneDoNotLockTheirTypeOutWhileTheirUploadsRun) {
  world.network().answer(kUploadURL, NetworkAnswer::silence());
  constexpr int kMost = 5;
  for (int i = 0; i < kMost; ++i) {
    const auto client = startSession();
    client->uploadInPassing("file:///tmp/a%20log", token());
    world.runUntilIdle();
  }
  EXPECT_EQ(world.network().countTo(kUploadURL), static_cast<size_t>(kMost));
  EXPECT_EQ(sessions().size(), static_cast<size_t>(kMost)) << "they wait for their servers";
  EXPECT_FALSE(openSession()->isInvalidated());
  service->shutDown();
  log().expectError("UploadBackend(uploadFileAtPath): post (null)");
  world.advance(std::chrono::minutes(2));
  EXPECT_EQ(sessions().size(), 0u);
  EXPECT_TRUE(hasNoLine(log(), "got decremented to 255"));
}

TEST_F(TelvanedSessionUploadTest, theDaemonsEndWaitsForNoServerAndStillSendsTheSessionsEvents) {
  world.network().answer(kUploadURL, NetworkAnswer::silence());
  const auto client = startSession();
  client->send(7);
  const auto upload = client->uploadInPassing("file:///tmp/a%20log", token());
  world.runUntilIdle();
  ASSERT_FALSE(upload->values.has_value());
  log().expectError("UploadBackend(uploadFileAtPath): post (null)");
  service->shutDown();
  world.advance(std::chrono::seconds(1));
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_EQ(sessions().size(), 0u);
  EXPECT_TRUE(process.files().exists("/tmp/a log"));
}

TEST_F(TelvanedSessionUploadTest, moreUploadsAtOnceThanThereArePlacesAreRefused) {
  world.network().answer(kUploadURL, NetworkAnswer::silence());
  std::vector<std::unique_ptr<DaemonClient>> clients;
  std::vector<std::shared_ptr<Answer>> answers;
  for (size_t i = 0; i <= RunningUploads::kMostAtOnce; ++i) {
    clients.push_back(startSession(sessionInfo(kClientType, static_cast<uint32_t>(i))));
    answers.push_back(clients.back()->uploadInPassing("file:///tmp/a%20log", token()));
    if (i == RunningUploads::kMostAtOnce) {
      log().expectError("UploadBackend(uploadFileAtPath): Too much is being uploaded already");
      log().expectError("uploadFileWithURL: File upload failed for /tmp/a log");
    }
    world.runUntilIdle();
    clients.back()->close();
  }
  EXPECT_EQ(world.network().countTo(kUploadURL), RunningUploads::kMostAtOnce);
  EXPECT_TRUE(hasLines(log(), 1, "Too much is being uploaded already"));
  log().expectError("UploadBackend(uploadFileAtPath): post (null)");
  service->shutDown();
  world.advance(std::chrono::seconds(1));
}

TEST_F(TelvanedSessionMessagesTest, anUploadIsOfThePathThatTheURLNames) {
  const auto client = openSession();
  for (const char* url : {"file:///tmp/a%20log", "file://localhost/tmp/a%20log", "file:///tmp/a%20log?x#y"}) {
    log().clear();
    log().expectError("uploadFileWithURL: File upload failed for /tmp/a log");
    EXPECT_EQ(client->ask(ClientSessionOperation::UploadFileAtPath, {url})[0], Value(false)) << url;
    EXPECT_TRUE(hasLines(log(), 1, "uploadFileWithURL: File upload failed for /tmp/a log")) << url;
  }
}

TEST_F(TelvanedSessionMessagesTest, uploadsWithoutBackendsFailToo) {
  const auto client = openSession();
  log().expectError("uploadFileWithURL: File upload failed for /tmp/log");
  log().expectError("uploadLogData: Log data array upload failed");
  EXPECT_EQ(client->ask(ClientSessionOperation::UploadFileAtPath, {"file:///tmp/log"})[0], Value(false));
  EXPECT_EQ(client->ask(ClientSessionOperation::UploadLogData, {Array{Value(Dictionary())}})[0], Value(false));
}

TEST_F(TelvanedSessionMessagesTest, sharedDataAccompaniesEventsUntilItIsTakenAway) {
  givenStorebag();
  const auto client = startSession(sessionInfoIn("a", 0));
  client->tell(ClientSessionOperation::UpdateSharedDataWithDictionary, {Dictionary{{Key("k"), 1}, {Key("kept"), 2}}});
  client->send(7);
  client->tell(ClientSessionOperation::UpdateSharedDataForKey, {"k", Value()});
  client->tell(ClientSessionOperation::UpdateSharedDataForKey, {"new", 3});
  client->send(8);
  client->flush();
  ASSERT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_THAT(postedEvents(7, 1)[0], HasEntry("k", 1));
  ASSERT_EQ(postedEvents(8, 1).size(), 1u);
  EXPECT_FALSE(postedEvents(8, 1)[0].contains("k"));
  EXPECT_THAT(postedEvents(8, 1)[0], HasEntry("kept", 2));
  EXPECT_THAT(postedEvents(8, 1)[0], HasEntry("new", 3));
}

TEST_F(TelvanedSessionMessagesTest, theAggregatorHearsEveryMessageWithTheUserInfoAdded) {
  givenStorebag();
  const auto client = startSession(sessionInfo(), userInfo(), true);
  client->send(7, 2, {{Key("k"), 1}, {kTelvaneUserInfoClientName, "forged"}});
  ASSERT_EQ(client->aggregated().size(), 2u) << log().text();
  const Array& heard = client->aggregated()[1];
  EXPECT_EQ(heard[0], Value(sessionInfo()));
  EXPECT_EQ(heard[1], Value(world.clock().now().secondsSince1970()));
  EXPECT_EQ(heard[2], Value(7));
  EXPECT_EQ(heard[3], Value(2));
  Dictionary payload{{Key("k"), 1}};
  payload.addEntriesFrom(userInfo());
  EXPECT_EQ(heard[4], Value(payload));
}

TEST_F(TelvanedSessionMessagesTest, aMessageWithoutAPayloadIsAggregatedWithoutOne) {
  givenStorebag();
  const auto client = startSession(sessionInfo(), userInfo(), true);
  client->sendMessage(message(7, 2));
  ASSERT_EQ(client->aggregated().size(), 2u);
  EXPECT_EQ(client->aggregated()[1][4], Value());
}

TEST_F(TelvanedSessionMessagesTest, theRootsAggregatorHearsAChildsMessagesAndTheChildsDoesNot) {
  givenStorebag();
  const auto root = startSession(sessionInfoIn("a", 0, 1), userInfo(), true);
  const auto child = startSession(sessionInfoIn("a", 1, 2), userInfo(), true);
  const size_t before = root->aggregated().size();
  child->send(7);
  ASSERT_EQ(root->aggregated().size(), before + 1);
  EXPECT_EQ(root->aggregated().back()[0], Value(sessionInfoIn("a", 1, 2)));
  ASSERT_EQ(child->aggregated().size(), 1u) << "that aggregation has ended for it";
  const Array& end = child->aggregated()[0];
  EXPECT_EQ(end[0], Value());
  EXPECT_EQ(end[1], Value(0.0));
  EXPECT_EQ(end[2], Value(0));
  EXPECT_EQ(end[3], Value(0));
  EXPECT_EQ(end[4], Value());
}

// What an application shows of itself does not depend on what may leave the device.
TEST_F(TelvanedSessionMessagesTest, anEventThatEveryBackendDropsIsAggregatedAllTheSame) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryEventWhitelist, Array{5})));
  const auto client = startSession(sessionInfo(), userInfo(), true);
  const size_t before = client->aggregated().size();
  EXPECT_EQ(client->send(7)[0], Value());
  EXPECT_TRUE(hasLine(log(), "Dropping event with category 7 as it is not whitelisted"));
  ASSERT_EQ(client->aggregated().size(), before + 1);
  EXPECT_EQ(client->aggregated().back()[2], Value(7));
}

TEST_F(TelvanedSessionMessagesTest, aSessionWithoutAnAggregatorAggregatesNothing) {
  givenStorebag();
  const auto client = startSession();
  client->send(7);
  EXPECT_TRUE(client->aggregated().empty());
}

TEST_F(TelvanedSessionMessagesTest, aDigestKeyReachesTheBackendOfThatNameAlone) {
  givenSection(sectionOf({{"qrs", clientWith(kClientEntryPostURL, "https://digest.example/")},
                          {"splunk", StorebagBuilder::permissiveClient()}}));
  world.network().answer("https://digest.example/", NetworkAnswer::ok());
  const auto client = startSession();
  client->tell(ClientSessionOperation::SetDigestKey, {Data::copyOf("key"), 0});
  client->flush();
  const auto digested = world.network().requestsTo("https://digest.example/");
  const auto plain = world.network().requestsTo(StorebagBuilder::kPostURL);
  ASSERT_EQ(digested.size(), 1u);
  ASSERT_EQ(plain.size(), 1u);
  EXPECT_TRUE(RecordingConnectivity::header(digested[0].request, "X-TVN-DIGEST").has_value());
  EXPECT_FALSE(RecordingConnectivity::header(plain[0].request, "X-TVN-DIGEST").has_value());
}

TEST_F(TelvanedSessionMessagesTest, aChangeOfUserInfoForgetsTheDigestsAlgorithmAndKeepsItsKey) {
  givenSection(StorebagBuilder::section("qrs"));
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoBatchEvent, false);
  const auto client = startSession(info);
  const auto hasDigest = [this, &client] {
    client->send(7);
    const auto requests = world.network().requestsTo(StorebagBuilder::kPostURL);
    return RecordingConnectivity::header(requests.back().request, "X-TVN-DIGEST").has_value();
  };
  client->tell(ClientSessionOperation::SetDigestKey, {Data::copyOf("key"), 1});
  EXPECT_FALSE(hasDigest()) << "no such algorithm";
  client->fetchStates(userInfo("other"));
  EXPECT_TRUE(hasDigest());
}

TEST_F(TelvanedSessionMessagesTest, whatAnAggregatorThatHasGoneCannotHearIsOnlyLogged) {
  givenStorebag();
  const auto client = startSession(sessionInfo(), userInfo(), true);
  const std::shared_ptr<TelvanedSession> session = sessions().front();
  client->close();
  session->sendToAggregator(Value(sessionInfo()), 1.0, 7, 1, Value());
  world.runUntilIdle();
  EXPECT_TRUE(hasLines(log(), 1, "sendMessageWithDictionary: Failed to get remote object proxy: "));
}

TEST_F(TelvanedSessionMessagesTest, aSessionThatEndsShutsItsAggregationDown) {
  givenStorebag();
  const auto root = startSession(sessionInfoIn("a", 0, 1), userInfo(), true);
  auto child = startSession(sessionInfoIn("a", 1, 2), userInfo(), true);
  const size_t before = log().count("shutdownSessionAggregation: Disable aggregation module for session 2");
  child->close();
  world.advance(std::chrono::seconds(1));
  EXPECT_EQ(log().count("shutdownSessionAggregation: Disable aggregation module for session 2"), before + 1);
}

}  // namespace
}  // namespace telvane::testing
