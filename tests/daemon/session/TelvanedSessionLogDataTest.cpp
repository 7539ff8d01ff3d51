// Log data that sessions post, and what becomes of the daemon while their server does not answer.
#include "platform/KeyedArchive.h"
#include "tests/daemon/DaemonFixture.h"
#include "tests/support/BodyBytes.h"

namespace telvane::testing {
namespace {

constexpr char kLogDataURL[] = "https://dashboard.example/logdata";
constexpr char kUploadURL[] = "https://uploads.example/upload";
constexpr char kNoRoom[] = "DashboardBackend(uploadLogData): Too much is being uploaded already";
constexpr char kNotAnswered[] = "DashboardBackend(uploadLogData): Error uploading log data array ((null))";
constexpr char kFailed[] = "uploadLogData: Log data array upload failed";

class TelvanedSessionLogDataTest : public DaemonFixture {
 protected:
  TelvanedSessionLogDataTest() {
    Dictionary section = sectionOf({{"splunk", StorebagBuilder::permissiveClient()}});
    section.set("dashboard",
                Dictionary{{kProfileIP, "192.0.2.7"}, {kProfilePort, 9000}, {kProfilePostURL, kLogDataURL}});
    section.set(kTelvaneBackendUploadServer, Dictionary{{kProfilePostURL, kUploadURL}});
    givenSection(section);
    world.network().answer(kLogDataURL, NetworkAnswer::ok("/logs/1"));
    process.files().place("/tmp/log", "one line");
  }
  static Array logData(const std::string& text = "line") { return {Dictionary{{Key("LogData"), text}}}; }
  std::shared_ptr<Answer> uploadInPassing(DaemonClient& client, const Array& data = logData()) {
    auto answer = client.askInPassing(ClientSessionOperation::UploadLogData, {data});
    world.runUntilIdle();
    return answer;
  }
  void givenAServerThatHangs() { world.network().answer(kLogDataURL, NetworkAnswer::silence()); }
  void expectNoAnswers() {
    log().expectError(kNotAnswered);
    log().expectError(kFailed);
  }
  void expectRefusal() {
    log().expectError(kNoRoom);
    log().expectError(kFailed);
  }
};

TEST_F(TelvanedSessionLogDataTest, goToTheDashboardsServerAndTheClientHearsOfIt) {
  const auto client = startSession();
  const auto answer = uploadInPassing(*client);
  EXPECT_EQ((*answer)[0], Value(true));
  const auto requests = world.network().requestsTo(kLogDataURL);
  ASSERT_EQ(requests.size(), 1u);
  const auto archived = keyedarchive::unarchive(bodyBytes(requests[0].request));
  ASSERT_TRUE(archived.has_value());
  EXPECT_EQ(*archived, Value(logData()));
  EXPECT_TRUE(hasLine(log(), "DashboardBackend(uploadLogData): Log data uploaded to /logs/1"));
}

TEST_F(TelvanedSessionLogDataTest, aClientOpensSessionAfterSessionAndLeavesAndOthersGoOn) {
  givenAServerThatHangs();
  world.network().loseConnectivity();
  constexpr size_t kCrowd = 3 * RunningUploads::kMostAtOnce;
  expectRefusal();
  for (size_t i = 0; i < kCrowd; ++i) {
    const auto client = startSession(sessionInfo(kClientType, static_cast<uint32_t>(i)));
    uploadInPassing(*client);
  }
  EXPECT_EQ(world.network().countTo(kLogDataURL), RunningUploads::kMostAtOnce);
  EXPECT_TRUE(hasLines(log(), kCrowd - RunningUploads::kMostAtOnce, kNoRoom));
  EXPECT_EQ(sessions().size(), RunningUploads::kMostAtOnce) << "the refused ones are gone with their clients";
  const auto other = startSession(sessionInfo(kClientType, 1000));
  EXPECT_FALSE(other->isInvalidated()) << "clients that are gone do not count for their type";
  EXPECT_TRUE(other->send(7).values.has_value());
  world.network().restoreConnectivity();
  other->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  expectNoAnswers();
  service->shutDown();
  world.advance(std::chrono::seconds(1));
  EXPECT_EQ(sessions().size(), 0u);
}

TEST_F(TelvanedSessionLogDataTest, sharesThePlacesWithUploadsOfFiles) {
  givenAServerThatHangs();
  std::vector<std::unique_ptr<DaemonClient>> clients;
  for (size_t i = 0; i < RunningUploads::kMostAtOnce; ++i) {
    clients.push_back(startSession(sessionInfo(kClientType, static_cast<uint32_t>(i))));
    uploadInPassing(*clients.back());
    clients.back()->close();
  }
  const auto client = startSession(sessionInfo(kClientType, 1000));
  log().expectError("UploadBackend(uploadFileAtPath): Too much is being uploaded already");
  log().expectError("uploadFileWithURL: File upload failed for /tmp/log");
  EXPECT_EQ(client->upload("file:///tmp/log", process.sandboxExtensions().newToken("/tmp/log"))[0], Value(false));
  expectNoAnswers();
  service->shutDown();
  world.advance(std::chrono::seconds(1));
}

// It waits in memory, and together with the events of others for the network.
TEST_F(TelvanedSessionLogDataTest, doesNotStopTheDaemonFromReadingWhatOthersSendHoweverMuchItIs) {
  givenAServerThatHangs();
  const auto client = startSession();
  const auto second = startSession(sessionInfo(kClientType, 43));
  const std::string large(20u << 20, 'x');
  const auto waiting = uploadInPassing(*client, logData(large));
  EXPECT_FALSE(waiting->values.has_value());
  expectRefusal();
  EXPECT_EQ((*uploadInPassing(*second, logData(large)))[0], Value(false));
  EXPECT_TRUE(second->send(7).values.has_value());
  second->flush();
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  expectNoAnswers();
  service->shutDown();
  world.advance(std::chrono::seconds(1));
}

TEST_F(TelvanedSessionLogDataTest, theDaemonsEndWaitsForNoServerAndStillSendsTheSessionsEvents) {
  givenAServerThatHangs();
  const auto client = startSession();
  client->send(7);
  const auto upload = uploadInPassing(*client);
  const auto behind = uploadInPassing(*client);
  ASSERT_FALSE(upload->values.has_value());
  expectNoAnswers();
  service->shutDown();
  world.advance(std::chrono::seconds(1));
  EXPECT_EQ(postedEvents(7, 1).size(), 1u);
  EXPECT_EQ(sessions().size(), 0u);
  EXPECT_EQ(world.network().countTo(kLogDataURL), 1u) << "what waited behind it is not posted any more";
  EXPECT_FALSE(behind->values.has_value());
}

}  // namespace
}  // namespace telvane::testing
