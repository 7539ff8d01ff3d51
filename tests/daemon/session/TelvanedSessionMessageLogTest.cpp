// What sessions write to the message log.
#include "tests/daemon/DaemonFixture.h"
#include "util/MessageLogFolder.h"

namespace telvane::testing {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;

class TelvanedSessionMessageLogTest : public DaemonFixture {
 protected:
  static constexpr char kDate[] = "(2026-01-01 00:00:00 +0000) ";

  // A session that posts event by event.
  std::unique_ptr<DaemonClient> startUnbatchedSession() {
    Dictionary info = sessionInfo();
    info.set(kTelvaneSessionInfoBatchEvent, false);
    return startSession(info);
  }
  // The whole log; it is one file, since no time passes.
  std::string messageLog() {
    if (!process.files().exists(MessageLogFolder::kPath)) return "";
    std::string text;
    for (const std::string& name : *process.files().filesBelow(MessageLogFolder::kPath)) {
      text += process.files().content(std::string(MessageLogFolder::kPath) + "/" + name);
    }
    return text;
  }
  // How often a message begins with this text.
  size_t messagesThatBeginWith(const std::string& text) {
    const std::string log = "\n" + messageLog();
    const std::string begin = std::string("\n") + kDate + text;
    size_t count = 0;
    for (size_t at = log.find(begin); at != std::string::npos; at = log.find(begin, at + 1)) ++count;
    return count;
  }
  void forgetTheLog() {
    for (const std::string& name : *process.files().filesBelow(MessageLogFolder::kPath)) {
      EXPECT_TRUE(isOk(process.files().write(std::string(MessageLogFolder::kPath) + "/" + name, Data())));
    }
  }
};

TEST_F(TelvanedSessionMessageLogTest, whatABackendReturnsForAMessageIsWrittenUnderItsName) {
  givenStorebag();
  const auto client = startUnbatchedSession();
  forgetTheLog();
  const Answer answer = client->send(7, 1, {{Key("k"), "v"}});
  ASSERT_TRUE(answer[0].isString());
  const std::string text(answer[0].text());
  EXPECT_THAT(text, HasSubstr("\"k\": \"v\""));
  EXPECT_EQ(messageLog(), kDate + ("[splunk -> sendMessageWithDictionary] " + text + "\n"));
}

TEST_F(TelvanedSessionMessageLogTest, eachBackendHasItsLineWhoseverTextTheClientHears) {
  givenSection(
      sectionOf({{"qrs", StorebagBuilder::permissiveClient()}, {"splunk", StorebagBuilder::permissiveClient()}}));
  const auto client = startUnbatchedSession();
  forgetTheLog();
  client->send(7);
  EXPECT_EQ(messagesThatBeginWith("[qrs -> sendMessageWithDictionary] {"), 1u);
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 1u);
}

TEST_F(TelvanedSessionMessageLogTest, startAndStopOfASessionAreMessagesToo) {
  givenStorebag();
  auto client = startUnbatchedSession();
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 1u);
  client->close();
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 2u);
}

TEST_F(TelvanedSessionMessageLogTest, aBatchIsWrittenWhenItIsFlushed) {
  givenStorebag();
  const auto client = startSession();
  client->send(7, 1, {{Key("number"), 1}});
  client->send(7, 1, {{Key("number"), 2}});
  EXPECT_EQ(messageLog(), "");
  client->flush();
  EXPECT_EQ(messagesThatBeginWith("[splunk -> flushMessages] {"), 1u);
  EXPECT_THAT(messageLog(), HasSubstr("\"number\": 1"));
  EXPECT_THAT(messageLog(), HasSubstr("\"number\": 2"));
  EXPECT_THAT(messageLog(), EndsWith("}\n"));
}

TEST_F(TelvanedSessionMessageLogTest, aFlushThatAMessageCausedIsWrittenAsThatMessagesText) {
  givenStorebag();
  const auto client = startSession();
  client->flush();
  forgetTheLog();
  constexpr int kDefaultThreshold = 50;
  for (int n = 0; n <= kDefaultThreshold; ++n) client->send(7, 1, {{Key("number"), n}});
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 1u);
  EXPECT_EQ(messagesThatBeginWith("[splunk -> flushMessages]"), 0u);
}

TEST_F(TelvanedSessionMessageLogTest, aFlushThatTheServerRefusesIsWrittenAllTheSame) {
  givenStorebag();
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::status(503));
  log().allowErrors();
  const auto client = startSession();
  client->flush();
  EXPECT_EQ(messagesThatBeginWith("[splunk -> flushMessages] {"), 1u);
}

TEST_F(TelvanedSessionMessageLogTest, aFlushOfNothingLeavesNoLine) {
  givenStorebag();
  const auto client = startSession();
  client->flush();
  forgetTheLog();
  client->flush();
  EXPECT_EQ(messageLog(), "");
}

TEST_F(TelvanedSessionMessageLogTest, aOneShotMessageIsWrittenWhenItGoesAtOnce) {
  givenStorebag();
  const auto client = connect();
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoBatchEvent, false);
  client->sendOneMessage(info, userInfo(), Dictionary{{Key("k"), "v"}});
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendOneMessageWithSessionInfo] {"), 1u);
  EXPECT_THAT(messageLog(), HasSubstr("\"k\": \"v\""));
}

TEST_F(TelvanedSessionMessageLogTest, anUploadIsWrittenWithItsURLWhateverCameOfIt) {
  const auto client = openSession();
  log().expectError("uploadFileWithURL: File upload failed for /tmp/a log");
  client->ask(ClientSessionOperation::UploadFileAtPath, {"file:///tmp/a%20log"});
  EXPECT_EQ(messageLog(), std::string(kDate) + "[uploadFileWithURL] Upload failed for file file:///tmp/a%20log\n");
}

TEST_F(TelvanedSessionMessageLogTest, aURLCannotMakeLinesOfTheLog) {
  const auto client = openSession();
  log().allowErrors();
  client->ask(ClientSessionOperation::UploadFileAtPath, {"file:///tmp/a\n(2026-01-01 00:00:00 +0000) b\r\x7f\t"});
  EXPECT_EQ(messageLog(), std::string(kDate) +
                              "[uploadFileWithURL] Upload failed for file "
                              "file:///tmp/a%0A(2026-01-01 00:00:00 +0000) b%0D%7F%09\n");
}

TEST_F(TelvanedSessionMessageLogTest, sessionsShareOneFile) {
  givenStorebag();
  const auto first = startUnbatchedSession();
  const auto second = startUnbatchedSession();
  first->send(7);
  second->send(7);
  EXPECT_EQ(process.files().filesBelow(MessageLogFolder::kPath)->size(), 1u);
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 4u) << "two starts, two messages";
}

// Events are on the disk in clear only where they may leave the device under the user's own consent.
TEST_F(TelvanedSessionMessageLogTest, withoutConsentNoEventIsWritten) {
  process.consent().set(false);
  givenStorebag();
  const auto client = startUnbatchedSession();
  client->send(7);
  client->flush();
  EXPECT_FALSE(process.files().exists(MessageLogFolder::kPath));
}

TEST_F(TelvanedSessionMessageLogTest, underABagThatOverridesConsentNoEventIsWrittenThoughItIsPosted) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryOverrideDNU, 1)));
  for (const bool isAllowed : {true, false}) {
    process.consent().set(isAllowed);
    const size_t before = postedEvents(7, 1).size();
    const auto client = startUnbatchedSession();
    client->send(7);
    EXPECT_EQ(postedEvents(7, 1).size(), before + 1);
  }
  EXPECT_FALSE(process.files().exists(MessageLogFolder::kPath));
}

TEST_F(TelvanedSessionMessageLogTest, aDeveloperMayHaveEventsWrittenUnderABagThatOverridesConsent) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryOverrideDNU, 1)));
  givenInternalBuild();
  givenDefault(kTelvaneDefaultsSuite, kDefaultsForceEventLogging, true);
  const auto client = startUnbatchedSession();
  forgetTheLog();
  client->send(7);
  EXPECT_EQ(messagesThatBeginWith("[splunk -> sendMessageWithDictionary] {"), 1u);
}

TEST_F(TelvanedSessionMessageLogTest, aCustomersDeviceForcesNothing) {
  givenSection(StorebagBuilder::section("splunk", clientWith(kClientEntryOverrideDNU, 1)));
  givenDefault(kTelvaneDefaultsSuite, kDefaultsForceEventLogging, true);
  const auto client = startUnbatchedSession();
  client->send(7);
  EXPECT_FALSE(process.files().exists(MessageLogFolder::kPath));
}

TEST_F(TelvanedSessionMessageLogTest, aLogThatCannotBeWrittenCostsNoEvent) {
  givenStorebag();
  process.fileFaults().failWrites(EROFS, "CrashReporter");
  log().allowErrors();
  const auto client = startUnbatchedSession();
  EXPECT_TRUE(client->send(7)[0].isString());
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_TRUE(hasLine(log(), "writeToLogFile: Failed to create new telvaned log file"));
}

}  // namespace
}  // namespace telvane::testing
