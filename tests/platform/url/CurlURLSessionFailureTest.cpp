#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>

#include "tests/platform/url/Peers.h"
#include "tests/platform/url/URLSessionFixture.h"

namespace telvane::testing {

using namespace std::chrono_literals;

// What goes wrong with servers, and what a task tells of it.
class CurlURLSessionFailureTest : public URLSessionFixture {
 protected:
  void givenCertificate(const TestCertificates::Server& files) {
    _serverOptions.certificateFile = files.certificateFile;
    _serverOptions.privateKeyFile = files.privateKeyFile;
    _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>& responder) {
      ADD_FAILURE() << "a request went to a server that is not to be trusted";
      responder->send({});
    };
  }
  TaskOutcome getFrom(RawServer& peer) { return run({.url = "http://127.0.0.1:" + std::to_string(peer.port()) + "/"}); }
};

TEST_F(CurlURLSessionFailureTest, refusesAnExpiredCertificate) {
  givenCertificate(_certificates.expired());
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
}

TEST_F(CurlURLSessionFailureTest, refusesACertificateForAnotherHost) {
  givenCertificate(_certificates.forAnotherHost());
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
}

TEST_F(CurlURLSessionFailureTest, refusesACertificateOfAnUnknownAuthority) {
  givenCertificate(_certificates.fromUnknownAuthority());
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
}

TEST_F(CurlURLSessionFailureTest, refusesThatOfTheTestsAuthorityWhenTheSystemsStoreDecides) {
  givenCertificate(_certificates.valid());
  _options.caFile = "";
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
}

TEST_F(CurlURLSessionFailureTest, trustsNobodyWhenTheTrustedCertificatesCannotBeRead) {
  givenCertificate(_certificates.valid());
  _log.expectError("No trusted certificate could be read from");
  _options.caFile = _folder.at("missing.pem");
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
  EXPECT_EQ(_log.count(LogLevel::Error, "No trusted certificate"), 1u);
}

TEST_F(CurlURLSessionFailureTest, trustsNobodyWhenTheTrustedCertificatesAreGarbage) {
  givenCertificate(_certificates.valid());
  _log.expectError("No trusted certificate could be read from");
  _options.caFile = _folder.write("garbage.pem", "-----BEGIN CERTIFICATE-----\nAAAA\n-----END CERTIFICATE-----\n");
  expectError(get(), URLErrorCode::ServerCertificateUntrusted);
}

TEST_F(CurlURLSessionFailureTest, takesAPlainServerForNoSecureOne) {
  RawServer plain([](const RawPeer& peer, int) {
    peer.hear(1);
    peer.say("HTTP/1.1 400 Bad Request\r\n\r\n");
  });
  const TaskOutcome outcome = run({.url = "https://127.0.0.1:" + std::to_string(plain.port()) + "/"});
  expectError(outcome, URLErrorCode::SecureConnectionFailed);
}

TEST_F(CurlURLSessionFailureTest, endsAtItsTimeoutWhenTheServerDoesNotAnswer) {
  const TaskOutcome outcome = run({.url = url(), .timeout = 100ms});
  expectError(outcome, URLErrorCode::TimedOut);
  EXPECT_FALSE(outcome.response.has_value());
}

TEST_F(CurlURLSessionFailureTest, endsAtItsTimeoutWhenTheBodyStalls) {
  const auto task = start({.url = url(), .timeout = 1s});
  const auto responder = waitForRequests(1).front();
  responder->sendHead({}, 1000);
  responder->sendPiece(Data::copyOf("the beginning"));
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::TimedOut);
  EXPECT_EQ(outcome.response->statusCode, 200);
  EXPECT_EQ(outcome.body(), "the beginning");
}

TEST_F(CurlURLSessionFailureTest, endsAtItsTimeoutWhenTheHandshakeStalls) {
  RawServer silent([](const RawPeer& peer, int) { peer.hearsEnd(); });
  const TaskOutcome outcome =
      run({.url = "https://127.0.0.1:" + std::to_string(silent.port()) + "/", .timeout = 100ms});
  expectError(outcome, URLErrorCode::TimedOut);
}

TEST_F(CurlURLSessionFailureTest, endsAnIdleTransferThatHasNoTimeoutOfItsOwn) {
  _options.idleTimeout = 1s;
  expectError(get(), URLErrorCode::TimedOut);
}

TEST_F(CurlURLSessionFailureTest, endsATransferAtTheLongestTimeForAny) {
  _options.resourceTimeout = 100ms;
  expectError(get(), URLErrorCode::TimedOut);
}

TEST_F(CurlURLSessionFailureTest, reportsARefusedConnectionAtOnceThoughItWaitsForConnectivity) {
  _configuration.waitsForConnectivity = true;
  const std::string port = std::to_string(unusedPort());
  expectError(run({.url = "http://127.0.0.1:" + port + "/"}), URLErrorCode::CannotConnectToHost);
  expectError(run({.url = "http://localhost:" + port + "/"}), URLErrorCode::CannotConnectToHost);
}

TEST_F(CurlURLSessionFailureTest, reportsAConnectionThatClosesBeforeTheResponse) {
  const auto task = start(post(url(), "body"));
  waitForRequests(1).front()->close();
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::NetworkConnectionLost);
  EXPECT_FALSE(outcome.response.has_value());
}

TEST_F(CurlURLSessionFailureTest, reportsAConnectionThatClosesInsideTheBody) {
  const auto task = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  responder->sendHead({}, 100);
  responder->sendPiece(Data::copyOf("ten bytes."));
  ASSERT_TRUE(delegate().waitForBytes(task, 10));
  responder->close();
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::NetworkConnectionLost);
  EXPECT_EQ(outcome.body(), "ten bytes.");
}

TEST_F(CurlURLSessionFailureTest, doesNotCollectAResponseWithoutEnd) {
  const auto task = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  responder->sendHead({}, std::nullopt);
  const Data piece(std::string(1 << 20, 'x'));
  for (int i = 0; i < 100; ++i) responder->sendPiece(piece);
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::ResponseTooLarge);
  EXPECT_LE(outcome.body().size(), _options.maximumResponseBytes);
}

TEST_F(CurlURLSessionFailureTest, refusesAResponseThatAnnouncesTooMuch) {
  const auto task = start({.url = url()});
  waitForRequests(1).front()->sendHead({}, 100 << 20);
  const TaskOutcome outcome = delegate().waitFor(task);
  expectError(outcome, URLErrorCode::ResponseTooLarge);
  EXPECT_EQ(outcome.body(), "");
}

TEST_F(CurlURLSessionFailureTest, takesAResponseOfExactlyTheMaximum) {
  _options.maximumResponseBytes = 1000;
  _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    responder->send({.body = Data(std::string(static_cast<size_t>(std::stoi(request.target.substr(1))), 'x'))});
  };
  EXPECT_EQ(get("/1000").body().size(), 1000u);
  expectError(get("/1001"), URLErrorCode::ResponseTooLarge);
}

TEST_F(CurlURLSessionFailureTest, refusesAResponseHeadWithoutEnd) {
  RawServer endless([](const RawPeer& peer, int) {
    peer.hearUntil("\r\n\r\n");
    std::string head = "HTTP/1.1 200 OK\r\n";
    for (int i = 0; i < 2000; ++i) head += "X-" + std::to_string(i) + ": y\r\n";
    peer.say(head);
    peer.hearsEnd();
  });
  expectError(getFrom(endless), URLErrorCode::ResponseTooLarge);
}

TEST_F(CurlURLSessionFailureTest, endsWithAnErrorWhenTheServerTalksGarbage) {
  RawServer garbage([](const RawPeer& peer, int) {
    peer.hearUntil("\r\n\r\n");
    peer.say(std::string("\0\1\2 what is this\r\n\r\n\r\n", 22));
  });
  const TaskOutcome outcome = getFrom(garbage);
  EXPECT_TRUE(outcome.error.has_value());
  EXPECT_EQ(outcome.completions, 1);
  EXPECT_EQ(outcome.body(), "");
}

TEST_F(CurlURLSessionFailureTest, doesNotTakeInformationalResponsesForTheResponse) {
  RawServer chatty([](const RawPeer& peer, int) {
    peer.hearUntil("\r\n\r\n");
    peer.say("HTTP/1.1 103 Early Hints\r\nLink: x\r\n\r\nHTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nok");
    peer.hearsEnd();
  });
  const TaskOutcome outcome = getFrom(chatty);
  EXPECT_EQ(outcome.response->statusCode, 200);
  EXPECT_EQ(outcome.response->header("Link"), nullptr);
  EXPECT_EQ(outcome.body(), "ok");
  dropSession();
}

TEST_F(CurlURLSessionFailureTest, endsAnUploadWhoseFileBecameShorter) {
  const std::string path = _folder.write("container", std::string(300'000, 'f'));
  auto task = session().newUploadTask(post(url(), ""), path);
  ASSERT_TRUE(task.has_value());
  _folder.write("container", "short");
  (*task)->resume();
  const TaskOutcome outcome = delegate().waitFor(*task);
  EXPECT_TRUE(outcome.error.has_value());
  EXPECT_EQ(outcome.completions, 1);
}

TEST_F(CurlURLSessionFailureTest, keepsServingTheOtherTasksWhenOneFails) {
  const auto good = start({.url = url()});
  const auto responder = waitForRequests(1).front();
  expectError(run({.url = "http://127.0.0.1:" + std::to_string(unusedPort()) + "/"}),
              URLErrorCode::CannotConnectToHost);
  responder->send({.body = Data::copyOf("fine")});
  EXPECT_EQ(delegate().waitFor(good).body(), "fine");
}

}  // namespace telvane::testing
