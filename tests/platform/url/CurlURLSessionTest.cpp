#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>

#include "platform/system/UnnamedFile.h"
#include "tests/platform/url/Peers.h"
#include "tests/platform/url/URLSessionFixture.h"

namespace telvane::testing {

using ::testing::ElementsAre;

class CurlURLSessionTest : public URLSessionFixture {
 protected:
  CurlURLSessionTest() {
    _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
      Server::Response response{.headers = {{"X-Method", request.method}, {"X-Target", request.target}}};
      response.body = request.body.empty() ? Data::copyOf("hello") : request.body;
      responder->send(std::move(response));
    };
  }
  void givenPlainServer() { _serverOptions.certificateFile = _serverOptions.privateKeyFile = ""; }
  void givenAnswersByTheTest() { _handler = nullptr; }
};

TEST_F(CurlURLSessionTest, bringsBackStatusHeadersAndBody) {
  const TaskOutcome outcome = get("/bags/one?a=b");
  EXPECT_FALSE(outcome.error.has_value()) << outcome.error->description();
  EXPECT_EQ(outcome.completions, 1);
  ASSERT_TRUE(outcome.response.has_value());
  EXPECT_EQ(outcome.response->statusCode, 200);
  EXPECT_EQ(outcome.response->url, url("/bags/one?a=b"));
  ASSERT_NE(outcome.response->header("x-target"), nullptr);
  EXPECT_EQ(*outcome.response->header("x-target"), "/bags/one?a=b");
  EXPECT_EQ(*outcome.response->header("X-METHOD"), "GET");
  EXPECT_EQ(outcome.body(), "hello");
}

TEST_F(CurlURLSessionTest, tellsItsDelegateInOrder) {
  run(post(url(), "body"));
  session().finishTasksAndInvalidate();
  ASSERT_TRUE(delegate().waitUntilInvalid());
  EXPECT_THAT(delegate().calls(), ElementsAre("sent 1", "response 1", "data 1", "completed 1", "invalid"));
}

TEST_F(CurlURLSessionTest, postsABodyAndTellsWhatWasSent) {
  const std::string body(300'000, 'x');
  const TaskOutcome outcome = run(post(url(), body));
  EXPECT_FALSE(outcome.error.has_value());
  EXPECT_EQ(outcome.body(), body);
  EXPECT_EQ(outcome.sent, 300'000);
  EXPECT_EQ(outcome.expectedToSend, 300'000);
}

TEST_F(CurlURLSessionTest, postsAnEmptyBody) {
  const TaskOutcome outcome = run(post(url(), ""));
  EXPECT_FALSE(outcome.error.has_value());
  EXPECT_EQ(*outcome.response->header("X-Method"), "POST");
  EXPECT_EQ(outcome.sent, 0);
}

TEST_F(CurlURLSessionTest, sendsOtherMethods) {
  EXPECT_EQ(run({.url = url(), .method = "HEAD"}).body(), "");
  const TaskOutcome outcome = run({.url = url(), .method = "PUT", .body = Data::copyOf("new")});
  EXPECT_EQ(*outcome.response->header("X-Method"), "PUT");
  EXPECT_EQ(outcome.body(), "new");
}

TEST_F(CurlURLSessionTest, keepsItsConnectionForTheNextTask) {
  for (int i = 0; i < 5; ++i) EXPECT_EQ(get().body(), "hello");
  EXPECT_EQ(run(post(url(), "x")).body(), "x");
  EXPECT_EQ(server().acceptedConnections(), 1u);
}

TEST_F(CurlURLSessionTest, runsManyTasksOverFewConnections) {
  std::vector<std::shared_ptr<URLSessionTask>> tasks;
  tasks.reserve(200);
  for (int i = 0; i < 200; ++i) tasks.push_back(start(post(url(), "body " + std::to_string(i))));
  for (int i = 0; i < 200; ++i) {
    const TaskOutcome outcome = delegate().waitFor(tasks[static_cast<size_t>(i)]);
    EXPECT_EQ(outcome.body(), "body " + std::to_string(i));
    EXPECT_EQ(outcome.completions, 1);
  }
  EXPECT_LE(server().acceptedConnections(), 6u);
}

TEST_F(CurlURLSessionTest, connectsAgainWhenTheServerClosedTheKeptConnection) {
  givenPlainServer();
  RawServer closing([](const RawPeer& peer, int connection) {
    peer.hearUntil("\r\n\r\n");
    peer.say("HTTP/1.1 200 OK\r\nContent-Length: 1\r\n\r\n" + std::to_string(connection));
  });
  const std::string address = "http://127.0.0.1:" + std::to_string(closing.port());
  EXPECT_EQ(run({.url = address}).body(), "1");
  EXPECT_EQ(run({.url = address}).body(), "2");
}

TEST_F(CurlURLSessionTest, deliversABodyInPiecesAsTheyCome) {
  givenAnswersByTheTest();
  const auto task = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  responder->sendHead({}, std::nullopt);
  std::string expected;
  for (const char* piece : {"one", "two", "three"}) {
    responder->sendPiece(Data::copyOf(piece));
    expected += piece;
    EXPECT_TRUE(delegate().waitForBytes(task, expected.size())) << "did not bring " << piece;
  }
  responder->finish();
  const TaskOutcome outcome = delegate().waitFor(task);
  EXPECT_THAT(outcome.pieces, ElementsAre("one", "two", "three"));
  EXPECT_FALSE(outcome.error.has_value());
}

TEST_F(CurlURLSessionTest, doesNotDecompress) {
  _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    EXPECT_EQ(request.header("Accept-Encoding"), nullptr);
    responder->send({.headers = {{"Content-Encoding", "gzip"}}, .body = Data::copyOf("not really gzip")});
  };
  EXPECT_EQ(get().body(), "not really gzip");
}

TEST_F(CurlURLSessionTest, givesAnyStatusAsAResponse) {
  _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    responder->send({.status = std::stoi(request.target.substr(1)), .body = Data::copyOf("why")});
  };
  for (const int status : {304, 404, 500, 503}) {
    const TaskOutcome outcome = get("/" + std::to_string(status));
    EXPECT_FALSE(outcome.error.has_value());
    EXPECT_EQ(outcome.response->statusCode, status);
    EXPECT_EQ(outcome.body(), status == 304 ? "" : "why");
  }
}

TEST_F(CurlURLSessionTest, sendsHeadersInTheOrderGivenAndNoOthers) {
  std::string heard;
  RawServer listening([&heard](const RawPeer& peer, int) {
    heard = peer.hearUntil("\r\n\r\n");
    heard += peer.hear(4);
    peer.say("HTTP/1.1 200 OK\r\nContent-Length: 0\r\nConnection: close\r\n\r\n");
  });
  const std::string host = "127.0.0.1:" + std::to_string(listening.port());
  URLRequest request = post("http://" + host + "/events", "BODY");
  request.headers = {{"x-telvane-zebra", "1"},
                     {"Content-Type", "application/json"},
                     {"Accept", "text/plain"},
                     {"User-Agent", "agent/1"},
                     {"Content-Encoding", "gzip"},
                     {"X-Empty", ""},
                     {"a-last", "2"}};
  EXPECT_FALSE(run(request).error.has_value());
  EXPECT_EQ(heard, "POST /events HTTP/1.1\r\nHost: " + host +
                       "\r\nx-telvane-zebra: 1\r\nContent-Type: application/json\r\nAccept: text/plain\r\n"
                       "User-Agent: agent/1\r\nContent-Encoding: gzip\r\nX-Empty:\r\na-last: 2\r\n"
                       "Content-Length: 4\r\n\r\nBODY");
}

TEST_F(CurlURLSessionTest, sendsTheTrueLengthWhereTheRequestNamesOne) {
  std::string heard;
  RawServer listening([&heard](const RawPeer& peer, int) {
    heard = peer.hearUntil("\r\n\r\n");
    peer.say("HTTP/1.1 200 OK\r\nContent-Length: 0\r\nConnection: close\r\n\r\n");
  });
  const std::string host = "127.0.0.1:" + std::to_string(listening.port());
  URLRequest request = post("http://" + host + "/", "BODY");
  request.headers = {{"Content-Length", "99"}, {"B", "2"}};
  EXPECT_FALSE(run(request).error.has_value());
  EXPECT_EQ(heard, "POST / HTTP/1.1\r\nHost: " + host + "\r\nContent-Length: 4\r\nB: 2\r\n\r\n");
}

TEST_F(CurlURLSessionTest, sendsABareGetWithoutHeaders) {
  std::string heard;
  RawServer listening([&heard](const RawPeer& peer, int) {
    heard = peer.hearUntil("\r\n\r\n");
    peer.say("HTTP/1.1 200 OK\r\nContent-Length: 0\r\nConnection: close\r\n\r\n");
  });
  const std::string host = "127.0.0.1:" + std::to_string(listening.port());
  EXPECT_FALSE(run({.url = "http://" + host + "/"}).error.has_value());
  EXPECT_EQ(heard, "GET / HTTP/1.1\r\nHost: " + host + "\r\n\r\n");
}

TEST_F(CurlURLSessionTest, uploadsAFileThatWasRemovedMeanwhile) {
  const std::string content(200'000, 'f');
  const std::string path = _folder.write("container.tvndiag", content);
  auto task = session().newUploadTask({.url = url(), .method = "POST", .body = Data::copyOf("ignored")}, path);
  ASSERT_TRUE(task.has_value());
  ASSERT_EQ(remove(path.c_str()), 0);
  (*task)->resume();
  const TaskOutcome outcome = delegate().waitFor(*task);
  EXPECT_EQ(outcome.body(), content);
  EXPECT_EQ(outcome.sent, 200'000);
  EXPECT_EQ(outcome.expectedToSend, 200'000);
}

TEST_F(CurlURLSessionTest, makesNoUploadTaskWithoutItsFile) {
  const auto task = session().newUploadTask(post(url(), ""), _folder.at("missing"));
  ASSERT_FALSE(task.has_value());
  EXPECT_EQ(task.error().code(), ENOENT);
  EXPECT_FALSE(session().newUploadTask(post(url(), ""), _folder.path()).has_value());
}

TEST_F(CurlURLSessionTest, refusesRequestsThatCannotBeSent) {
  const auto codeOf = [this](URLRequest request) -> int64_t {
    const auto task = session().newDataTask(std::move(request));
    return task ? 0 : task.error().code();
  };
  const auto badURL = static_cast<int64_t>(URLErrorCode::BadURL);
  for (const char* bad :
       {"", "nonsense", "ftp://host/", "file:///etc/passwd", "https://", "http://a b/", "https://h\r\n/"}) {
    EXPECT_EQ(codeOf({.url = bad}), badURL) << bad;
  }
  EXPECT_EQ(codeOf({.url = "https://host/", .method = "GET / HTTP/1.1\r\nX: y"}), badURL);
  EXPECT_EQ(codeOf({.url = "https://host/", .headers = {{"Name", "value\r\nInjected: yes"}}}), badURL);
  EXPECT_EQ(codeOf({.url = "https://host/", .headers = {{"Na me", "value"}}}), badURL);
  EXPECT_EQ(codeOf({.url = "https://host/", .headers = {{"", "value"}}}), badURL);
  EXPECT_EQ(codeOf({.url = "https://host/", .headers = {{"Name", "value"}}}), 0);
}

TEST_F(CurlURLSessionTest, startsATaskOnceHoweverOftenItIsResumed) {
  const auto task = start({.url = url()});
  task->resume();
  EXPECT_EQ(delegate().waitFor(task).completions, 1);
  task->resume();
  session().finishTasksAndInvalidate();
  ASSERT_TRUE(delegate().waitUntilInvalid());
  EXPECT_EQ(delegate().outcome(task.get()).completions, 1);
}

TEST_F(CurlURLSessionTest, cancelsATaskWhoseResponseIsRefused) {
  givenAnswersByTheTest();
  delegate().refuseResponses();
  const auto task = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  responder->sendHead({}, 1000);
  responder->sendPiece(Data::copyOf("unwanted"));
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::Cancelled);
  EXPECT_EQ(outcome.body(), "");
}

TEST_F(CurlURLSessionTest, letsRunningTasksEndBeforeItBecomesInvalid) {
  givenAnswersByTheTest();
  const auto first = start({.url = url()});
  const auto second = start({.url = url()});
  const auto responders = waitForRequests(2);
  session().finishTasksAndInvalidate();
  const auto refused = session().newDataTask({.url = url()});
  ASSERT_FALSE(refused.has_value());
  EXPECT_EQ(refused.error().code(), static_cast<int64_t>(URLErrorCode::SessionInvalidated));
  responders[0]->send({.body = Data::copyOf("a")});
  responders[1]->send({.body = Data::copyOf("b")});
  EXPECT_EQ(delegate().waitFor(first).body() + delegate().waitFor(second).body(), "ab");
  ASSERT_TRUE(delegate().waitUntilInvalid());
  EXPECT_EQ(delegate().calls().back(), "invalid");
}

TEST_F(CurlURLSessionTest, staysUntilItsTasksHaveEndedWhenLetGoAfterInvalidation) {
  givenAnswersByTheTest();
  const auto task = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  session().finishTasksAndInvalidate();
  dropSession();
  responder->send({.body = Data::copyOf("late")});
  EXPECT_EQ(delegate().waitFor(task).body(), "late");
  EXPECT_TRUE(delegate().waitUntilInvalid());
}

TEST_F(CurlURLSessionTest, becomesInvalidAtOnceWithoutTasks) {
  session().finishTasksAndInvalidate();
  session().finishTasksAndInvalidate();
  EXPECT_TRUE(delegate().waitUntilInvalid());
}

TEST_F(CurlURLSessionTest, completesATaskThatIsResumedAfterInvalidationWithAnError) {
  givenAnswersByTheTest();
  const auto running = start({.url = url()});
  const auto late = *session().newDataTask({.url = url()});
  const auto responder = waitForRequests(1).front();
  session().finishTasksAndInvalidate();
  late->resume();
  expectError(delegate().waitFor(late), URLErrorCode::SessionInvalidated);
  responder->send({});
  EXPECT_TRUE(delegate().waitUntilInvalid());
}

TEST_F(CurlURLSessionTest, saysNothingMoreOnceItHasBecomeInvalid) {
  const auto late = *session().newDataTask({.url = url()});
  session().finishTasksAndInvalidate();
  ASSERT_TRUE(delegate().waitUntilInvalid());
  late->resume();
  dropSession();
  dropProvider();  // ends the loop with whatever it still had
  EXPECT_EQ(delegate().calls(), std::vector<std::string>{"invalid"});
}

TEST_F(CurlURLSessionTest, cancelsItsTasksWhenItIsLetGoOf) {
  givenAnswersByTheTest();
  const auto task = start(post(url(), "body"));
  waitForRequests(1);
  dropSession();
  expectError(delegate().waitFor(task), URLErrorCode::Cancelled);
  EXPECT_TRUE(delegate().waitUntilInvalid());
  EXPECT_EQ(_gate.bytes(), 0u);
}

TEST_F(CurlURLSessionTest, cancelsItsTasksWhenItsProviderEnds) {
  givenAnswersByTheTest();
  const auto task = start(post(url(), "body"));
  waitForRequests(1);
  dropProvider();
  expectError(delegate().waitFor(task), URLErrorCode::Cancelled);
  EXPECT_TRUE(delegate().waitUntilInvalid());
}

TEST_F(CurlURLSessionTest, countsARequestInTheFlowGateFromResumeToCompletion) {
  givenAnswersByTheTest();
  const uint64_t urlSize = url().size();
  const auto made = *session().newDataTask(post(url(), std::string(1000, 'x')));
  EXPECT_EQ(_gate.bytes(), 0u);
  made->resume();
  EXPECT_EQ(_gate.bytes(), urlSize + 1000);
  const auto other = start(post(url(), std::string(500, 'y')));
  const auto responders = waitForRequests(2);
  EXPECT_EQ(_gate.bytes(), 2 * urlSize + 1500);
  for (const auto& responder : responders) responder->send({});
  delegate().waitFor(made);
  delegate().waitFor(other);
  EXPECT_EQ(_gate.bytes(), 0u);
}

// Clients' names stand in headers, at any length.
TEST_F(CurlURLSessionTest, countsHeadersInTheFlowGateLikeTheBody) {
  givenAnswersByTheTest();
  URLRequest request = post(url(), "body");
  request.setHeader("X-Name", std::string(5000, 'n'));
  request.setHeader("X-Other", "12");
  const auto task = start(std::move(request));
  EXPECT_EQ(_gate.bytes(), url().size() + 4 + 6 + 5000 + 7 + 2);
  waitForRequests(1).front()->send({});
  delegate().waitFor(task);
  EXPECT_EQ(_gate.bytes(), 0u);
}

TEST_F(CurlURLSessionTest, doesNotCountAFileInTheFlowGate) {
  givenAnswersByTheTest();
  const std::string path = _folder.write("container", std::string(1000, 'f'));
  const auto task = *session().newUploadTask(post(url(), "x"), path);
  task->resume();
  EXPECT_EQ(_gate.bytes(), url().size());
  waitForRequests(1).front()->send({});
  EXPECT_FALSE(delegate().waitFor(task).error.has_value());
  EXPECT_EQ(_gate.bytes(), 0u);
}

TEST_F(CurlURLSessionTest, sendsABodyThatIsAFileWithItsLength) {
  const auto file = std::shared_ptr(*UnnamedFile::open(_folder.path()));
  for (int i = 0; i < 100; ++i)
    ASSERT_TRUE(file->append(std::string(3000, static_cast<char>('a' + i % 26))).has_value());
  std::string length;
  _handler = [&length](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    length = *request.header("Content-Length");
    responder->send({.body = request.body});
  };
  URLRequest request = post(url(), "ignored");
  request.bodyFile = file;
  const TaskOutcome outcome = run(std::move(request));
  EXPECT_EQ(length, "300000");
  EXPECT_EQ(outcome.body().size(), 300'000u);
  EXPECT_EQ(outcome.body().substr(298'000, 10), "vvvvvvvvvv");
  EXPECT_EQ(outcome.sent, 300'000);
  EXPECT_EQ(file.use_count(), 1) << "let go of when the task has completed";
}

TEST_F(CurlURLSessionTest, doesNotCountABodyThatIsAFileInTheFlowGate) {
  givenAnswersByTheTest();
  URLRequest request = post(url(), "x");
  const auto file = std::shared_ptr(*UnnamedFile::open(_folder.path()));
  ASSERT_TRUE(file->append(std::string(1000, 'f')).has_value());
  request.bodyFile = file;
  const auto task = start(std::move(request));
  EXPECT_EQ(_gate.bytes(), url().size());
  waitForRequests(1).front()->send({});
  EXPECT_FALSE(delegate().waitFor(task).error.has_value());
  EXPECT_EQ(_gate.bytes(), 0u);
}

TEST_F(CurlURLSessionTest, keepsItsDescription) {
  session().setSessionDescription("F00D");
  EXPECT_EQ(session().sessionDescription(), "F00D");
}

}  // namespace telvane::testing
