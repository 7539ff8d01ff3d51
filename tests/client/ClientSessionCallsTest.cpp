#include <cstdio>
#include <filesystem>
#include <stdexcept>

#include "client/ClientSession.h"
#include "client/ReportingQueue.h"
#include "interfaces/FileURL.h"
#include "tests/client/ClientFixture.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

class Listener final : public TelvaneMessageSentDelegate {
 public:
  void didSendMessageForReportingClient(const std::shared_ptr<Telvane>&, const Dictionary&) override {}
};

// Flushes, shared data, digest key and uploads.
class ClientSessionCallsTest : public ClientFixture {
 protected:
  // A session whose calls wait until run(), behind a message of which its delegate has not been told yet.
  std::shared_ptr<Telvane> openHeldUp() {
    daemon().answer(Operation::SendMessageWithDictionary, Array{Value()});
    std::shared_ptr<Telvane> session = open();
    session->setMessageSentDelegate(_listener);
    run();
    EXPECT_TRUE(session->sendMessageWithCategory(9, 1));
    return session;
  }

  ScratchFolder _folder;
  const std::shared_ptr<Listener> _listener = std::make_shared<Listener>();
};

TEST_F(ClientSessionCallsTest, flushesAndPassesTheTextOn) {
  daemon().answer(Operation::FlushMessages, Array{"posted", Value()});
  std::vector<String> texts;
  std::vector<std::optional<Error>> ends;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String& text) { texts.push_back(text); });
  session->flushMessagesWithCompletion([&](const std::optional<Error>& error) { ends.push_back(error); });
  run();
  EXPECT_EQ(texts, std::vector<String>{"posted"});
  EXPECT_EQ(ends, std::vector<std::optional<Error>>{std::nullopt});
  EXPECT_TRUE(hasLines(log(), 1, "flushMessagesWithCompletion: flushed session successfully with reply posted"));
}

TEST_F(ClientSessionCallsTest, passesTheErrorOfAFlushOn) {
  const Error error = Error::withDescription("TelvaneErrorDomain", -1, "Nothing to flush");
  daemon().answer(Operation::FlushMessages, Array{"ignored", Dictionary{{Key("domain"), "TelvaneErrorDomain"},
                                                                        {Key("code"), -1},
                                                                        {Key("userInfo"), error.userInfo()}}});
  bool hasText = false;
  std::vector<std::optional<Error>> ends;
  const auto session = open();
  session->setMessageLoggingBlock([&](const String&) { hasText = true; });
  session->flushMessagesWithCompletion([&](const std::optional<Error>& end) { ends.push_back(end); });
  session->flushMessagesWithCompletion({});
  run();
  EXPECT_FALSE(hasText);
  EXPECT_EQ(ends, std::vector<std::optional<Error>>{error});
  EXPECT_TRUE(hasLines(log(), 2, "flushMessagesWithCompletion: flush failed with error 'Nothing to flush'"));
}

TEST_F(ClientSessionCallsTest, tellsTheCompletionOfAFlushThatIsLost) {
  std::vector<std::optional<Error>> ends;
  log().expectError("flushMessagesWithCompletion: Failed to get remote object proxy: ");
  const auto session = open();
  session->flushMessagesWithCompletion([&](const std::optional<Error>& end) { ends.push_back(end); });
  run();
  daemon().dropReplies();
  run();
  ASSERT_EQ(ends.size(), 1u);
  ASSERT_TRUE(ends[0].has_value());
  EXPECT_EQ(ends[0]->domain(), kPlatformErrorDomain.view());
}

TEST_F(ClientSessionCallsTest, saysYesToAFlushEvenWithoutADaemon) {
  log().allowErrors();
  daemon().stop();
  const auto session = open();
  EXPECT_TRUE(session->flushMessages());
  run();
  EXPECT_TRUE(hasLines(log(), 1, "flushMessages:"));
  EXPECT_TRUE(hasLine(log(), LogLevel::Error, "flushMessagesWithCompletion: Failed to get remote object proxy: "));
}

TEST_F(ClientSessionCallsTest, survivesACompletionOfAFlushThatThrows) {
  daemon().answer(Operation::FlushMessages, Array{Value(), Value()});
  log().expectError("flushMessagesWithCompletion: Exception in a block of the client: no");
  const auto session = open();
  session->flushMessagesWithCompletion([](const std::optional<Error>&) { throw std::runtime_error("no"); });
  run();
}

TEST_F(ClientSessionCallsTest, forwardsSharedData) {
  const auto session = open();
  const Dictionary data{{Key("a"), 1}};
  session->updateSharedDataWithDictionary(data);
  session->updateSharedDataForKey("k", Array{1});
  session->updateSharedDataForKey("k", {});
  run();
  ASSERT_EQ(daemon().calls().size(), 4u);
  EXPECT_EQ(daemon().calls()[1].arguments, Array{data});
  EXPECT_EQ(daemon().calls()[2].arguments, (Array{"k", Array{1}}));
  EXPECT_EQ(daemon().calls()[3].arguments[0], Value("k"));
  EXPECT_FALSE(daemon().calls()[3].arguments[1].isPresent()) << "an absent value removes the key";
}

TEST_F(ClientSessionCallsTest, dropsTheNewestCallsBeyondTheBoundWhileTheyWait) {
  log().expectError("Dropped 4 calls: more than 8388608 bytes were waiting to be handed to the daemon");
  daemon().answer(Operation::UploadLogData, Array{true, Value()});
  const std::string text(ReportingQueue::kMaximumWaitingBytes / 5 * 2, 'x');
  const auto session = openHeldUp();
  session->updateSharedDataForKey("a", text);
  session->updateSharedDataWithDictionary({{Key("b"), text}});
  session->updateSharedDataForKey("c", text);
  session->updateSharedDataWithDictionary({{Key("d"), text}});
  EXPECT_TRUE(session->setDigestKey(Data::copyOf(text), 0)) << "as with events, only the log tells";
  bool isCalled = false;
  EXPECT_TRUE(session->uploadDataArray(Array{Dictionary{{kTelvaneLogDataData, text}}},
                                       [&](bool, const std::optional<Error>&) { isCalled = true; }));
  run();
  EXPECT_FALSE(isCalled);
  EXPECT_EQ(daemon().count(Operation::SendMessageWithDictionary), 1u);
  EXPECT_EQ(daemon().last(Operation::UpdateSharedDataForKey).arguments[0], Value("a"));
  EXPECT_EQ(daemon().last(Operation::UpdateSharedDataWithDictionary).arguments, (Array{Dictionary{{Key("b"), text}}}));
  EXPECT_EQ(daemon().count(Operation::SetDigestKey) + daemon().count(Operation::UploadLogData), 0u);
  EXPECT_TRUE(session->sendMessageWithCategory(9, 1));
  EXPECT_TRUE(session->uploadDataArray(Array{Dictionary{{kTelvaneLogDataData, text}}}));
  session->updateSharedDataForKey("e", text);
  run();
  EXPECT_EQ(daemon().count(Operation::UploadLogData), 1u) << "there is room again";
  EXPECT_EQ(daemon().last(Operation::UpdateSharedDataForKey).arguments[0], Value("e"));
}

TEST_F(ClientSessionCallsTest, holdsFewFilesOpenWhileTheirUploadsWait) {
  log().expectError("calls: more than 8388608 bytes were waiting to be handed to the daemon");
  daemon().answer(Operation::UploadFileAtPath, Array{true});
  const std::string path = _folder.write("a.log", "the log");
  const auto session = openHeldUp();
  for (int i = 0; i < 100; ++i) EXPECT_TRUE(session->uploadFileWithURL(path));
  run();
  EXPECT_GT(daemon().count(Operation::UploadFileAtPath), 50u);
  EXPECT_LE(daemon().count(Operation::UploadFileAtPath), 64u) << "each is a descriptor of the host's";
}

TEST_F(ClientSessionCallsTest, logsSharedDataThatIsLost) {
  log().allowErrors();
  daemon().refuse();
  const auto session = open();
  run();
  session->updateSharedDataWithDictionary({});
  session->updateSharedDataForKey("k", 1);
  session->finishSession();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "updateSharedDataWithDictionary: Failed to get remote object proxy: "));
  EXPECT_TRUE(hasLines(log(), 1, "updateSharedDataForKey: Failed to get remote object proxy: "));
  EXPECT_TRUE(hasLines(log(), 1, "finishSession: Failed to get remote object proxy: "));
}

TEST_F(ClientSessionCallsTest, forwardsTheDigestKey) {
  const auto session = open();
  EXPECT_TRUE(session->setDigestKey(Data::copyOf("key"), -2));
  run();
  EXPECT_EQ(daemon().last(Operation::SetDigestKey).arguments, (Array{Data::copyOf("key"), -2}));
}

TEST_F(ClientSessionCallsTest, refusesAnAbsentDigestKey) {
  log().expectError("setDigestKey: digestKey should not be nil!!!");
  const auto session = open();
  EXPECT_FALSE(session->setDigestKey({}, 1));
  run();
  EXPECT_EQ(daemon().count(Operation::SetDigestKey), 0u);
}

TEST_F(ClientSessionCallsTest, logsALostDigestKeyUnderTheNameOfTheUpload) {
  log().allowErrors();
  daemon().refuse();
  const auto session = open();
  run();
  EXPECT_TRUE(session->setDigestKey("key", 1));
  run();
  EXPECT_TRUE(hasLines(log(), 1, "uploadDataArray: Failed to get remote object proxy: "));
}

TEST_F(ClientSessionCallsTest, handsAFileOverWithTheCall) {
  daemon().answer(Operation::UploadFileAtPath, Array{true});
  const std::string path = _folder.write("a b.log", "the log");
  std::vector<bool> ends;
  const auto session = open();
  EXPECT_TRUE(session->uploadFileWithURL(path, [&](bool isSuccess, const std::optional<Error>& error) {
    EXPECT_FALSE(error.has_value());
    ends.push_back(isSuccess);
  }));
  EXPECT_TRUE(session->uploadFileWithURL("file://" + _folder.path() + "/a%20b.log"));
  run();
  ASSERT_EQ(daemon().count(Operation::UploadFileAtPath), 2u);
  for (size_t i : {1u, 2u}) {
    const ScriptedDaemon::Call call = daemon().calls()[i];
    EXPECT_EQ(call.arguments[0], Value("file://" + _folder.path() + "/a%20b.log"));
    EXPECT_EQ(call.file, "the log");
  }
  EXPECT_EQ(ends, std::vector<bool>{true});
}

TEST_F(ClientSessionCallsTest, opensTheFileBeforeTheCallReturns) {
  const std::string path = _folder.write("a.log", "the log");
  const auto session = open();
  EXPECT_TRUE(session->uploadFileWithURL(path));
  ASSERT_EQ(std::remove(path.c_str()), 0);
  run();
  EXPECT_EQ(daemon().last(Operation::UploadFileAtPath).file, "the log");
  daemon().dropReplies();
  log().expectError("uploadFileWithURL: Failed to get remote object proxy: ");
  run();
}

TEST_F(ClientSessionCallsTest, refusesAnEmptyURL) {
  log().expectError("uploadFileWithURL: fileURL provided is nil");
  const auto session = open();
  EXPECT_FALSE(session->uploadFileWithURL(""));
}

TEST_F(ClientSessionCallsTest, refusesAFileThatCannotBeOpened) {
  const std::string path = _folder.path() + "/none";
  log().expectError("uploadFileWithURL: Failed to get sandbox extension for path " + path + ", errno 2");
  bool isCalled = false;
  const auto session = open();
  EXPECT_FALSE(session->uploadFileWithURL(path, [&](bool, const std::optional<Error>&) { isCalled = true; }));
  run();
  EXPECT_FALSE(isCalled);
  EXPECT_EQ(daemon().count(Operation::UploadFileAtPath), 0u);
}

TEST_F(ClientSessionCallsTest, doesNotCallTheCompletionOfAnUploadThatIsLost) {
  log().expectError("uploadFileWithURL: Failed to get remote object proxy: ");
  bool isCalled = false;
  const auto session = open();
  EXPECT_TRUE(session->uploadFileWithURL(_folder.write("a.log", "x"),
                                         [&](bool, const std::optional<Error>&) { isCalled = true; }));
  run();
  daemon().dropReplies();
  run();
  EXPECT_FALSE(isCalled);
}

TEST_F(ClientSessionCallsTest, tellsTheDaemonThePathWithoutLinksInItsFoldersButWithOneAtItsEnd) {
  const auto session = open();
  daemon().answer(Operation::UploadFileAtPath, Array{true});
  const std::string file = _folder.write("folder/a.log", "x");
  std::filesystem::create_directory_symlink(_folder.at("folder"), _folder.at("way"));
  std::filesystem::create_symlink(file, _folder.at("link"));
  const auto told = [&](const std::string& path) {
    EXPECT_TRUE(session->uploadFileWithURL(path));
    run();
    return pathOfFileURL(daemon().last(Operation::UploadFileAtPath).arguments[0].text());
  };
  EXPECT_EQ(told(_folder.at("way/a.log")), file);
  EXPECT_EQ(told(_folder.at("folder/../way//a.log")), file);
  EXPECT_EQ(told(std::filesystem::relative(file).string()), file);
  EXPECT_EQ(told(_folder.at("link")), _folder.at("link"));
}

TEST_F(ClientSessionCallsTest, uploadsLogData) {
  daemon().answer(Operation::UploadLogData, Array{true, Value()});
  std::vector<bool> ends;
  const Array logData{Dictionary{{kTelvaneLogDataData, "text"}, {kTelvaneLogDataStartTime, 1}}};
  const auto session = open();
  EXPECT_TRUE(session->uploadDataArray(logData, [&](bool isSuccess, const std::optional<Error>& error) {
    EXPECT_FALSE(error.has_value());
    ends.push_back(isSuccess);
  }));
  EXPECT_TRUE(session->uploadDataArray(logData));
  run();
  EXPECT_EQ(daemon().count(Operation::UploadLogData), 2u);
  EXPECT_EQ(daemon().last(Operation::UploadLogData).arguments, Array{logData});
  EXPECT_EQ(ends, std::vector<bool>{true});
}

TEST_F(ClientSessionCallsTest, refusesNoLogData) {
  log().expectError("uploadDataArray: Log data array is empty");
  const auto session = open();
  EXPECT_FALSE(session->uploadDataArray({}));
}

// Letting go.
TEST_F(ClientSessionCallsTest, finishesTheSessionBeforeTheConnectionEnds) {
  auto session = open();
  run();
  session.reset();
  run();
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::FinishSessionGracefully}));
  EXPECT_EQ(daemon().endedConnectionCount(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "aboutToDealloc: Telvane client session 0x"));
  EXPECT_TRUE(hasLine(log(), " is about to dealloc"));
  EXPECT_TRUE(hasLines(log(), 1, "initWithSessionInfo: XPC connection invalidated"));
}

TEST_F(ClientSessionCallsTest, finishesASessionThatIsLetGoAtOnce) {
  open().reset();
  run();
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::FinishSessionGracefully}));
}

TEST_F(ClientSessionCallsTest, deliversWhatWasSentBeforeItWasLetGo) {
  daemon().answer(Operation::SendMessageWithDictionary, Array{Value()});
  daemon().answer(Operation::FlushMessages, Array{"posted", Value()});
  std::vector<std::optional<Error>> ends;
  auto session = open();
  EXPECT_TRUE(session->sendMessageWithCategory(7, 1));
  session->flushMessagesWithCompletion([&](const std::optional<Error>& error) { ends.push_back(error); });
  session.reset();
  run();
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::SendMessageWithDictionary,
                                               Operation::FlushMessages, Operation::FinishSessionGracefully}));
  EXPECT_EQ(ends, std::vector<std::optional<Error>>{std::nullopt});
}

TEST_F(ClientSessionCallsTest, staysUsableAfterFinishSession) {
  daemon().answer(Operation::SendMessageWithDictionary, Array{Value()});
  auto session = open();
  session->finishSession();
  EXPECT_TRUE(session->sendMessageWithCategory(7, 1));
  run();
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::FinishSessionGracefully,
                                               Operation::SendMessageWithDictionary}));
}

TEST_F(ClientSessionCallsTest, mayBeLetGoInItsOwnCompletion) {
  daemon().answer(Operation::FlushMessages, Array{Value(), Value()});
  auto session = open();
  session->flushMessagesWithCompletion([&](const std::optional<Error>&) { session.reset(); });
  run();
  EXPECT_EQ(daemon().last(Operation::FinishSessionGracefully).arguments, Array());
  EXPECT_EQ(daemon().endedConnectionCount(), 1u);
}

TEST_F(ClientSessionCallsTest, callsNothingOfTheHostOnceTheProcessEnds) {
  daemon().answer(Operation::FlushMessages, Array{"text", Value()});
  bool isCalled = false;
  const auto session =
      open(sessionInfo(), {}, {}, [&](const Value&, double, uint16_t, uint16_t, const Value&) { isCalled = true; });
  session->setMessageLoggingBlock([&](const String&) { isCalled = true; });
  session->flushMessagesWithCompletion([&](const std::optional<Error>&) { isCalled = true; });
  _context.stopCallingOut();
  run();
  daemon().connection().send({static_cast<uint16_t>(ClientSessionReplyOperation::SendMessageToClient),
                              Array{sessionInfo(), 1.0, 1, 1, Value()},
                              {}},
                             {});
  run();
  EXPECT_FALSE(isCalled);
}

TEST_F(ClientSessionCallsTest, holdsTheEndUpUntilAllIsDelivered) {
  daemon().answer(Operation::FetchDisplayURL, Array{"URL not available"});
  const auto session = open();
  session->updateSharedDataForKey("k", 1);
  TelvaneFactory::session(*session)->holdUntilDelivered(PendingWork::Hold(_context.pendingWork()));
  EXPECT_TRUE(_context.pendingWork().waitUntilNone(client().platform().dispatch, std::chrono::seconds(2)));
  EXPECT_EQ(daemon().count(Operation::UpdateSharedDataForKey), 1u);
}

TEST_F(ClientSessionCallsTest, holdsTheEndUpNoLongerThanAsked) {
  log().allowErrors();
  const auto session = open();
  TelvaneFactory::session(*session)->holdUntilDelivered(PendingWork::Hold(_context.pendingWork()));
  const auto before = _world.scheduler().now();
  EXPECT_FALSE(_context.pendingWork().waitUntilNone(client().platform().dispatch, std::chrono::seconds(2)));
  EXPECT_EQ(_world.scheduler().now() - before, std::chrono::seconds(2));
}

}  // namespace
}  // namespace telvane::testing
