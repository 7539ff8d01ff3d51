#include "backends/UploadBackend.h"

#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/UploadFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class UploadBackendTest : public UploadFixture {
 protected:
  std::shared_ptr<TelvaneBackend> ofSection(const Value& section) {
    return TelvaneBackend::newBackendWithName(context(), String(kTelvaneBackendUploadServer.view()), section,
                                              String("TelvaneBox"), 6);
  }
  void expectRefusal(const std::string& errorLine) {
    log().expectError(errorLine);
    EXPECT_FALSE(upload());
    EXPECT_TRUE(hasLines(log(), 1, errorLine));
    EXPECT_EQ(helper().requests.size(), 0u);
    EXPECT_EQ(extensions().heldExtensions(), 0);
  }
};

TEST_F(UploadBackendTest, needsAURLToPostTo) {
  const std::string line = "UploadBackend(initWithName): can't resolve upload post URL.";
  log().expectError(line);
  const std::vector<Value> sections{Value(), Dictionary(), Dictionary{{kProfileDisplayURL, "https://x.example/"}},
                                    Dictionary{{kProfilePostURL, 17}}, Array{Value("https://x.example/")}};
  for (const Value& section : sections) EXPECT_EQ(ofSection(section), nullptr) << ::testing::PrintToString(section);
  EXPECT_TRUE(hasLines(log(), sections.size(), line));
}

TEST_F(UploadBackendTest, isEnabledAtOnceAndTellsWhereToLook) {
  const auto backend = makeUploadBackend();
  EXPECT_EQ(backend->state(), TelvaneBackendStateUnknown);
  EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
  EXPECT_EQ(backend->displayURL(), String("https://uploads.example/show"));
  EXPECT_FALSE(backend->isHTTPSPostBackend());
}

TEST_F(UploadBackendTest, hasNoDisplayURLWhereTheSectionHasNone) {
  for (const Value& section : {Value(Dictionary{{kProfilePostURL, kUploadURL}}),
                               Value(Dictionary{{kProfilePostURL, kUploadURL}, {kProfileDisplayURL, 3}})}) {
    const auto backend = ofSection(section);
    ASSERT_NE(backend, nullptr);
    EXPECT_EQ(backend->displayURL(), std::nullopt);
  }
}

TEST_F(UploadBackendTest, takesNoEventsAndFlushesNothing) {
  const auto backend = makeUploadBackend();
  EXPECT_EQ(backend->sendMessage(Dictionary(), _world.clock().now(), 7, 2, 0), std::nullopt);
  int calls = 0;
  EXPECT_EQ(backend->flushMessagesWithCompletion([&calls](const auto& text, const auto& error) {
    EXPECT_EQ(text, std::nullopt);
    EXPECT_EQ(error, std::nullopt);
    ++calls;
  }),
            std::nullopt);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(helper().requests.size(), 0u);
}

TEST_F(UploadBackendTest, postsTheWholeFileCompressedUnderItsName) {
  givenFile("one line\nanother line\n");
  EXPECT_TRUE(upload());
  ASSERT_EQ(helper().requests.size(), 1u);
  const URLRequest& request = helper().requests[0];
  EXPECT_EQ(request.url,
            "https://uploads.example/upload?uuid=device-id&sequence=4711&description=Vantico%20AFRC%20log%20(Uploaded"
            "%20by%20ZPH)&filename=call.log.gz&raw=true");
  EXPECT_EQ(request.method, "POST");
  EXPECT_THAT(RecordingConnectivity::headerNames(request), ElementsAre("Content-Type", "Content-Encoding"));
  EXPECT_EQ(RecordingConnectivity::header(request, "Content-Type"), "application/octet-stream");
  EXPECT_EQ(RecordingConnectivity::header(request, "Content-Encoding"), "gzip");
  EXPECT_EQ(RecordingConnectivity::bodyText(request), "one line\nanother line\n");
  EXPECT_EQ(request.timeout, std::nullopt);
  EXPECT_TRUE(request.allowsCellularAccess);
}

TEST_F(UploadBackendTest, holdsTheBodyInAFileAndNotInMemory) {
  givenFile(std::string(1000, 'x'));
  EXPECT_TRUE(upload());
  const URLRequest& request = helper().requests.at(0);
  EXPECT_EQ(request.body.size(), 0u);
  ASSERT_NE(request.bodyFile, nullptr);
  EXPECT_LT(request.bodyFile->size(), 100u);
}

TEST_F(UploadBackendTest, sendsAFileNameWithBlanksPercentEncoded) {
  struct Case {
    const char* name;
    const char* sent;
  };
  for (const Case& one : {Case{"a log with blanks", "a%20log%20with%20blanks.gz"}, Case{"100%", "100%25.gz"},
                          Case{"a#b", "a%23b.gz"}, Case{"\xC3\xA4.log", "%C3%A4.log.gz"}, Case{"a&b=c+d", "a&b=c+d.gz"},
                          Case{"\"<>^`{|}[]\\", "%22%3C%3E%5E%60%7B%7C%7D%5B%5D%5C.gz"}, Case{"a\nb", "a%0Ab.gz"}}) {
    const std::string path = std::string("/home/user/logs/") + one.name;
    givenFile("text", path);
    EXPECT_TRUE(upload(path)) << one.name;
    EXPECT_THAT(helper().requests.back().url, HasSubstr(std::string("&filename=") + one.sent + "&raw=true"));
  }
}

TEST_F(UploadBackendTest, deletesTheFileWhenTheAnswerContainsSuccess) {
  for (const char* answer :
       {"success", R"({"result": "success"})", "it was unsuccessful", "success\n", "a success b"}) {
    givenFile("text");
    helper().setAnswer(answer);
    EXPECT_TRUE(upload());
    EXPECT_FALSE(isThere()) << answer;
    EXPECT_TRUE(hasLine(log(), std::string("UploadBackend(uploadFileAtPath): sending to |") + kUploadURL +
                                   "|, Json output: " + answer));
  }
  EXPECT_TRUE(hasLines(log(), 5, "UploadBackend(uploadFileAtPath): Uploading file /home/user/logs/call.log"));
}

TEST_F(UploadBackendTest, keepsTheFileAtAnyOtherAnswer) {
  for (const char* answer : {"", "ok", "Success", "SUCCESS", "succes", "s u c c e s s", "{}"}) {
    givenFile("text");
    helper().setAnswer(answer);
    EXPECT_TRUE(upload()) << answer;
    EXPECT_TRUE(isThere()) << answer;
    EXPECT_TRUE(hasLine(log(), std::string("UploadBackend(uploadFileAtPath): sending to |") + kUploadURL +
                                   "|, Json output: " + answer));
  }
}

TEST_F(UploadBackendTest, goesByTheAnswersTextAndNotByItsStatus) {
  givenFile("text");
  helper().setAnswer("success", 500);
  EXPECT_TRUE(upload());
  EXPECT_FALSE(isThere());
}

TEST_F(UploadBackendTest, readsNoSuccessInWhatIsNoText) {
  givenFile("text");
  helper().setAnswer("success\xFF");
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
  EXPECT_TRUE(hasLine(
      log(), std::string("UploadBackend(uploadFileAtPath): sending to |") + kUploadURL + "|, Json output: (null)"));
}

TEST_F(UploadBackendTest, keepsTheFileAndSaysWhyWhenNoAnswerComes) {
  givenFile("text");
  helper().setError(Error::withDescription("D", -1005, "The connection to the server was lost"));
  log().expectError("UploadBackend(uploadFileAtPath): post The connection to the server was lost");
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
}

TEST_F(UploadBackendTest, readsWhatHadComeBeforeTheConnectionBroke) {
  givenFile("text");
  helper().setError(Error::withDescription("D", -1005, "lost"), "success, and more to");
  EXPECT_TRUE(upload());
  EXPECT_FALSE(isThere());
}

TEST_F(UploadBackendTest, doesNotWaitForAnAnswerThatCannotCome) {
  givenFile("text");
  makeUploadBackend();
  helper().goInactive();
  log().expectError("UploadBackend(uploadFileAtPath): post (null)");
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
  EXPECT_EQ(extensions().heldExtensions(), 0);
}

TEST_F(UploadBackendTest, waitsAsLongAsTheServerTakes) {
  givenFile("text");
  const auto before = _world.clock().monotonicNow();
  int heldMeanwhile = 0;
  helper().setDelay(std::chrono::hours(3));
  helper().beforeAnswer = [this, &heldMeanwhile] { heldMeanwhile = extensions().heldExtensions(); };
  EXPECT_TRUE(upload());
  EXPECT_FALSE(isThere());
  EXPECT_EQ(_world.clock().monotonicNow() - before, std::chrono::hours(3));
  EXPECT_EQ(heldMeanwhile, 1);
  EXPECT_EQ(extensions().heldExtensions(), 0);
}

TEST_F(UploadBackendTest, withoutItsHelperAnUploadCountsAndNothingIsSaid) {
  givenFile("text");
  makeUploadBackend();
  endHelper();
  log().clear();
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
  EXPECT_EQ(log().lines().size(), 1u) << log().text();
}

TEST_F(UploadBackendTest, refusesWhatIsNoRegularFile) {
  process().files().createDirectory(kPath).value();
  expectRefusal(kOnlyRegular);
}

TEST_F(UploadBackendTest, refusesAPathThatLeadsElsewhere) {
  givenFile("text");
  makeUploadBackend();
  log().expectError(kOnlyRegular);
  const ExtensionToken token = extensions().newToken(kPath);
  extensions().replace(kPath);
  EXPECT_FALSE(_uploader->uploadFileAtPath(kPath, token));
  EXPECT_TRUE(isThere());
}

TEST_F(UploadBackendTest, refusesATokenForAnotherFileAndNoToken) {
  givenFile("text");
  givenFile("secret", "/home/user/other");
  makeUploadBackend();
  log().expectError(kOnlyRegular);
  EXPECT_FALSE(_uploader->uploadFileAtPath(kPath, extensions().newToken("/home/user/other")));
  EXPECT_FALSE(_uploader->uploadFileAtPath(kPath, ExtensionToken()));
  EXPECT_TRUE(hasLines(log(), 2, kOnlyRegular));
  EXPECT_EQ(helper().requests.size(), 0u);
}

TEST_F(UploadBackendTest, refusesAnEmptyFile) {
  givenFile("");
  expectRefusal(kIsEmpty);
  EXPECT_TRUE(isThere());
}

TEST_F(UploadBackendTest, refusesAFileThatTheTokenDoesNotOpen) {
  givenFile("text");
  extensions().refuseReading();
  expectRefusal(kIsEmpty);
  EXPECT_TRUE(isThere());
}

TEST_F(UploadBackendTest, refusesInSilenceWhatItHasNoRoomFor) {
  givenFile("text");
  makeUploadBackend();
  log().clear();
  process().fileFaults().fillDisk();
  EXPECT_FALSE(upload());
  EXPECT_TRUE(isThere());
  EXPECT_EQ(log().lines().size(), 1u) << log().text();
  EXPECT_EQ(helper().requests.size(), 0u);
}

// Its file system may be the client's own, and never answer: what hangs there must be counted, too.
TEST_F(UploadBackendTest, looksAtNoFileForWhichThereIsNoPlace) {
  process().files().createDirectory(kPath).value();
  makeUploadBackend();
  std::vector<RunningUploads::Place> others;
  for (size_t i = 0; i < RunningUploads::kMostAtOnce; ++i) {
    others.push_back(*context().runningUploads().begin(RunningUploads::Kind::LogData,
                                                       process().platform().dispatch.newSemaphore(0), 0));
  }
  log().expectError("UploadBackend(uploadFileAtPath): Too much is being uploaded already");
  EXPECT_FALSE(upload());
  EXPECT_TRUE(hasNoLine(log(), kOnlyRegular));
  others.pop_back();
  log().expectError(kOnlyRegular);
  EXPECT_FALSE(upload()) << "and that is its own place";
  EXPECT_TRUE(hasLines(log(), 1, kOnlyRegular));
}

TEST_F(UploadBackendTest, refusesAURLThatNoRequestCanGoTo) {
  const std::string line = "UploadBackend(uploadFileAtPath): Unable to create URL request";
  log().expectError(line);
  const std::vector<std::string> urls{"https://a b/",    "uploads.example",           "ftp://uploads.example/",
                                      "https://",        "https://\xC3\xA4.example/", "https://x.example/%zz",
                                      "https:///upload", "https://x.example/a#b"};
  for (const std::string& url : urls) {
    givenFile("text");
    makeUploadBackend(url);
    EXPECT_FALSE(upload()) << url;
    EXPECT_TRUE(isThere());
  }
  EXPECT_TRUE(hasLines(log(), urls.size(), line));
}

TEST_F(UploadBackendTest, postsToTheURLAsTheBagHasIt) {
  for (const char* url : {"http://uploads.example/upload", "HTTPS://uploads.example:8443/a/b"}) {
    givenFile("text");
    makeUploadBackend(url);
    EXPECT_TRUE(upload());
    EXPECT_THAT(helper().requests.back().url, ::testing::StartsWith(std::string(url) + "?uuid="));
  }
}

TEST_F(UploadBackendTest, withAnEmptyURLItRefusesInSilence) {
  givenFile("text");
  makeUploadBackend("");
  log().clear();
  EXPECT_FALSE(upload());
  EXPECT_EQ(log().lines().size(), 1u) << log().text();
}

TEST_F(UploadBackendTest, saysWhyAnUploadedFileStays) {
  givenFile("text");
  extensions().refuseRemoval("the client may not delete it");
  const std::string line =
      "UploadBackend(uploadFileAtPath): The uploaded file /home/user/logs/call.log stays: the client may not delete it";
  log().expectError(line);
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
  EXPECT_TRUE(hasLines(log(), 1, line));
}

TEST_F(UploadBackendTest, deletesNothingThatHasTakenTheFilesPlaceMeanwhile) {
  givenFile("text");
  helper().beforeAnswer = [this] { extensions().replace(kPath); };
  log().expectError("stays: its path names another file now");
  EXPECT_TRUE(upload());
  EXPECT_TRUE(isThere());
}

}  // namespace
}  // namespace telvane::testing
