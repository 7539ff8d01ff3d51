#include "tests/support/ScriptedNetwork.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

constexpr char kURL[] = "https://collector.example/events";

// Writes down what it is told, each call on the delegate queue.
class WritingDelegate final : public URLSessionDelegate {
 public:
  explicit WritingDelegate(std::shared_ptr<SerialQueue> queue) : _queue(std::move(queue)) {}

  void didBecomeInvalidWithError(URLSession&, const std::optional<Error>&) override { note("invalid"); }
  void didSendBodyData(URLSession&, URLSessionTask&, int64_t sent, int64_t expected) override {
    note("sent " + std::to_string(sent) + "/" + std::to_string(expected));
  }
  void didCompleteWithError(URLSession&, URLSessionTask& task, const std::optional<Error>& error) override {
    note("complete " + task.taskDescription() + (error ? std::to_string(error->code()) : "ok"));
  }
  ResponseDisposition didReceiveResponse(URLSession&, URLSessionTask& task) override {
    note("response " + std::to_string(task.response()->statusCode));
    return disposition;
  }
  void didBecomeDownloadTask(URLSession&, URLSessionTask&) override { note("download"); }
  void didReceiveData(URLSession&, URLSessionTask&, const Data& data) override {
    note("data " + std::string(data.view()));
  }

  std::vector<std::string> story;
  ResponseDisposition disposition = ResponseDisposition::Allow;

 private:
  void note(std::string what) {
    _queue->assertOnQueue();
    story.push_back(std::move(what));
  }
  const std::shared_ptr<SerialQueue> _queue;
};

class ScriptedNetworkTest : public ::testing::Test {
 protected:
  ~ScriptedNetworkTest() override { _world.end(); }

  void givenSession(URLSessionConfiguration configuration = {}) {
    _session = _process.platform().urlSessions.newSession(std::move(configuration), _delegate, _queue);
    _session->setSessionDescription("session");
  }
  std::shared_ptr<URLSessionTask> start(URLRequest request) {
    if (_session == nullptr) givenSession();
    auto task = *_session->newDataTask(std::move(request));
    task->resume();
    return task;
  }
  std::shared_ptr<URLSessionTask> post(std::string body) {
    URLRequest request{kURL, "POST"};
    request.body = Data(std::move(body));
    return start(std::move(request));
  }
  std::vector<std::string> happened() {
    _world.runUntilIdle();
    return std::exchange(_delegate->story, {});
  }

  SimulatedWorld _world{1};
  SimulatedPlatform& _process = _world.makeProcess("app");
  ScriptedNetwork& _network = _world.network();
  std::shared_ptr<SerialQueue> _queue = _process.dispatch().newSerialQueue("delegate");
  std::shared_ptr<WritingDelegate> _delegate = std::make_shared<WritingDelegate>(_queue);
  std::unique_ptr<URLSession> _session;
};

TEST_F(ScriptedNetworkTest, answersARequestOnTheDelegateQueue) {
  _network.answer("collector.example", NetworkAnswer::ok("fine").withHeader("Date", "today"));
  const auto task = post("body");
  EXPECT_THAT(happened(), ElementsAre("sent 4/4", "response 200", "data fine", "complete ok"));
  EXPECT_THAT(*task->response(), HasHeader("date", "today"));
  EXPECT_EQ(task->response()->url, kURL);
}

TEST_F(ScriptedNetworkTest, recordsWhatWasAsked) {
  _network.answer(kURL, NetworkAnswer::ok());
  URLRequest request{kURL, "POST", {{"X-Test", "1"}}, Data::copyOf("body")};
  givenSession({.waitsForConnectivity = true});
  auto task = *_session->newDataTask(request);
  task->setTaskDescription("task");
  EXPECT_EQ(_network.requests().size(), 0u);
  _world.advance(5s);
  task->resume();
  task->resume();
  happened();
  ASSERT_EQ(_network.countTo("collector.example"), 1u);
  const RecordedRequest& recorded = _network.requests()[0];
  EXPECT_EQ(recorded.process, "app");
  EXPECT_EQ(recorded.sessionDescription, "session");
  EXPECT_EQ(recorded.taskDescription, "task");
  EXPECT_EQ(recorded.request.body, Data::copyOf("body"));
  EXPECT_THAT(recorded.request, HasHeader("X-Test", "1"));
  EXPECT_TRUE(recorded.configuration.waitsForConnectivity);
  EXPECT_EQ(recorded.resumedAt, SimulatedScheduler::kStart + 5s);
  EXPECT_EQ(recorded.leftAt, recorded.resumedAt);
  EXPECT_EQ(recorded.completedAt, recorded.resumedAt);
  EXPECT_EQ(recorded.error, std::nullopt);
}

TEST_F(ScriptedNetworkTest, choosesTheNewestStandingRuleAndOnceRulesFirst) {
  _network.answer("collector.example", NetworkAnswer::status(500));
  _network.answer("https://collector.example/ev", NetworkAnswer::status(404));
  _network.answerOnce(kURL, NetworkAnswer::status(201));
  _network.answerOnce(kURL, NetworkAnswer::status(202));
  std::vector<std::string> answers;
  for (int i = 0; i < 3; ++i) {
    start({kURL});
    answers.push_back(happened().front());
  }
  start({"https://collector.example/other"});
  answers.push_back(happened().front());
  EXPECT_THAT(answers, ElementsAre("response 201", "response 202", "response 404", "response 500"));
}

TEST_F(ScriptedNetworkTest, answersByWhatWasAsked) {
  _network.answerWith(kURL, [](const URLRequest& request) { return NetworkAnswer::ok(request.body.view()); });
  post("echo");
  EXPECT_THAT(happened(), ::testing::Contains("data echo"));
}

TEST_F(ScriptedNetworkTest, cannotFindAHostThatNobodyScripted) {
  start({"https://nowhere.example/"});
  EXPECT_THAT(happened(), ElementsAre("complete -1003"));
}

TEST_F(ScriptedNetworkTest, bringsPiecesInTheirTime) {
  _network.answer(kURL, NetworkAnswer::ok().withPieces({"a", "b"}).after(2s).withPieceDelay(3s));
  start({kURL});
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(2s);
  EXPECT_THAT(happened(), ElementsAre("response 200"));
  _world.advance(3s);
  EXPECT_THAT(happened(), ElementsAre("data a"));
  _world.advance(3s);
  EXPECT_THAT(happened(), ElementsAre("data b", "complete ok"));
}

TEST_F(ScriptedNetworkTest, failsAfterAPartOfTheBody) {
  _network.answer(kURL, NetworkAnswer::ok("half").thenFailing(URLErrorCode::NetworkConnectionLost));
  start({kURL});
  EXPECT_THAT(happened(), ElementsAre("response 200", "data half", "complete -1005"));
}

TEST_F(ScriptedNetworkTest, failsWithoutAResponse) {
  _network.answer(kURL, NetworkAnswer::failure(URLErrorCode::ServerCertificateUntrusted).after(1s));
  start({kURL});
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("complete -1202"));
}

TEST_F(ScriptedNetworkTest, endsASilentTransferAfterAMinute) {
  _network.answer(kURL, NetworkAnswer::silence());
  start({kURL});
  _world.advance(59s);
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("complete -1001"));
}

TEST_F(ScriptedNetworkTest, keepsToTheRequestsOwnTimeout) {
  _network.answer(kURL, NetworkAnswer::silence());
  URLRequest request{kURL};
  request.timeout = 15s;
  start(request);
  _world.advance(15s);
  EXPECT_THAT(happened(), ElementsAre("complete -1001"));
  request.timeout = 90s;
  start(request);
  _world.advance(89s);
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("complete -1001"));
}

TEST_F(ScriptedNetworkTest, waitsForConnectivityWhenTheSessionDoes) {
  _network.answer(kURL, NetworkAnswer::ok());
  _network.loseConnectivity();
  givenSession({.waitsForConnectivity = true});
  start({kURL});
  _world.advance(24h);
  EXPECT_THAT(happened(), ElementsAre());
  _network.restoreConnectivity();
  EXPECT_THAT(happened(), ElementsAre("response 200", "complete ok"));
  EXPECT_EQ(_network.requests()[0].leftAt, SimulatedScheduler::kStart + 24h);
}

TEST_F(ScriptedNetworkTest, givesUpWaitingForConnectivity) {
  _network.loseConnectivity();
  givenSession({.waitsForConnectivity = true});
  URLRequest hurried{kURL};
  hurried.timeout = 60s;
  start(hurried);
  start({kURL});
  _world.advance(60s);
  EXPECT_THAT(happened(), ElementsAre("complete -1001"));
  _world.advance(ScriptedNetwork::kResourceTimeout - 61s);
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("complete -1001"));
}

TEST_F(ScriptedNetworkTest, failsAtOnceWithoutConnectivityOtherwise) {
  _network.loseConnectivity();
  start({kURL});
  EXPECT_THAT(happened(), ElementsAre("complete -1009"));
}

TEST_F(ScriptedNetworkTest, breaksRunningConnections) {
  _network.answer(kURL, NetworkAnswer::silence());
  start({kURL});
  happened();
  _network.breakConnections();
  EXPECT_THAT(happened(), ElementsAre("complete -1005"));
}

TEST_F(ScriptedNetworkTest, cancelsATaskWhoseResponseIsRefused) {
  _delegate->disposition = URLSessionDelegate::ResponseDisposition::Cancel;
  _network.answer(kURL, NetworkAnswer::ok("never seen"));
  start({kURL});
  EXPECT_THAT(happened(), ElementsAre("response 200", "complete -999"));
}

TEST_F(ScriptedNetworkTest, letsRunningTasksEndWhenItIsFinished) {
  _network.answer(kURL, NetworkAnswer::ok().after(10s));
  start({kURL});
  _session->finishTasksAndInvalidate();
  EXPECT_TRUE(isError(_session->newDataTask({kURL}), static_cast<int64_t>(URLErrorCode::SessionInvalidated)));
  _session = nullptr;
  _world.advance(9s);
  EXPECT_THAT(happened(), ElementsAre());
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("response 200", "complete ok", "invalid"));
  EXPECT_EQ(_delegate.use_count(), 1) << "an invalid session lets go of its delegate";
}

TEST_F(ScriptedNetworkTest, becomesInvalidAtOnceWithoutTasks) {
  givenSession();
  _session->finishTasksAndInvalidate();
  _session->finishTasksAndInvalidate();
  EXPECT_THAT(happened(), ElementsAre("invalid"));
}

TEST_F(ScriptedNetworkTest, refusesATaskResumedAfterItWasFinished) {
  givenSession();
  const auto running = start({kURL});
  const auto late = *_session->newDataTask({kURL});
  _network.answer(kURL, NetworkAnswer::silence());
  _session->finishTasksAndInvalidate();
  late->resume();
  EXPECT_THAT(happened(), ::testing::Contains("complete -2000"));
}

TEST_F(ScriptedNetworkTest, cancelsWhatRunsWhenItIsLetGo) {
  _network.answer(kURL, NetworkAnswer::silence());
  start({kURL});
  happened();
  _session = nullptr;
  EXPECT_THAT(happened(), ElementsAre("complete -999", "invalid"));
}

TEST_F(ScriptedNetworkTest, countsBodiesAtTheGateUntilTheirEnd) {
  _network.answer(kURL, NetworkAnswer::ok().after(1s));
  post("12345");
  post("678");
  EXPECT_EQ(_process.flowGate().bytes(), 8u);
  _world.advance(1s);
  EXPECT_EQ(_process.flowGate().bytes(), 0u);
}

TEST_F(ScriptedNetworkTest, uploadsAFileThatIsRemovedMeanwhile) {
  _process.files().place("/tmp/tvnstorage/upload", "content");
  _network.answer(kURL, NetworkAnswer::ok().after(1s));
  givenSession();
  const auto task = *_session->newUploadTask({kURL, "POST"}, "/tmp/tvnstorage/upload");
  EXPECT_TRUE(isOk(_process.files().remove("/tmp/tvnstorage/upload")));
  task->resume();
  _world.advance(1s);
  EXPECT_THAT(happened(), ElementsAre("sent 7/7", "response 200", "complete ok"));
  EXPECT_TRUE(_network.requests()[0].isUpload);
  EXPECT_EQ(_network.requests()[0].request.body, Data::copyOf("content"));
  EXPECT_TRUE(isError(_session->newUploadTask({kURL, "POST"}, "/absent"), ENOENT));
}

TEST_F(ScriptedNetworkTest, refusesAnUnusableURL) {
  givenSession();
  for (const char* url : {"", "collector.example", "ftp://collector.example/", "https://a b/"}) {
    EXPECT_TRUE(isError(_session->newDataTask({url}), static_cast<int64_t>(URLErrorCode::BadURL))) << url;
  }
}

TEST_F(ScriptedNetworkTest, tellsNobodyOfAnEndedProcess) {
  _network.answer(kURL, NetworkAnswer::ok().after(1s));
  start({kURL});
  happened();
  _process.kill();
  _world.advance(1h);
  EXPECT_THAT(happened(), ElementsAre());
  EXPECT_EQ(_network.requests()[0].completedAt, std::nullopt);
  EXPECT_EQ(_delegate.use_count(), 1);
}

}  // namespace
}  // namespace telvane::testing
