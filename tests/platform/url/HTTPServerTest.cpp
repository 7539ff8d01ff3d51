#include "platform/url/HTTPServer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <thread>

#include "tests/platform/url/Peers.h"
#include "tests/platform/url/URLSessionFixture.h"

namespace telvane::testing {

using namespace std::chrono_literals;
using ::testing::HasSubstr;
using ::testing::StartsWith;

// The server as a peer sees it that speaks to it byte by byte.
class HTTPServerTest : public URLSessionFixture {
 protected:
  HTTPServerTest() {
    _serverOptions.certificateFile = _serverOptions.privateKeyFile = "";
    _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
      std::string text = request.method + " " + request.target + "\n";
      for (const Server::Header& header : request.headers) text += header.name + "=" + header.value + "\n";
      responder->send({.body = Data(text + std::string(request.body.view()))});
    };
  }
  void givenAnswersByTheTest() { _handler = nullptr; }
  RawPeer connect() { return RawPeer::to(server().port()); }
  // Sends one request and hears until the server ends the connection.
  std::string answerTo(std::string_view request) {
    const RawPeer peer = connect();
    peer.say(request);
    return peer.hearAll();
  }
  static std::string body(const std::string& answer) { return answer.substr(answer.find("\r\n\r\n") + 4); }
};

TEST_F(HTTPServerTest, givesTheHandlerTheRequestAsItWasSent) {
  const std::string answer = answerTo(
      "POST /a%20b?c=d HTTP/1.1\r\nhost: h\r\nX-Zebra: 1\r\nConnection: close\r\nx-alpha:  two words \r\n"
      "Content-Length: 4\r\n\r\nBODY");
  EXPECT_EQ(body(answer),
            "POST /a%20b?c=d\nhost=h\nX-Zebra=1\nConnection=close\nx-alpha=two words\nContent-Length=4\nBODY");
  EXPECT_THAT(answer, StartsWith("HTTP/1.1 200 OK\r\n"));
  EXPECT_THAT(answer, HasSubstr("Connection: close\r\n"));
}

TEST_F(HTTPServerTest, tellsItsAddressWithThePortThatItPicked) {
  EXPECT_NE(server().port(), 0);
  EXPECT_EQ(server().address(), "127.0.0.1:" + std::to_string(server().port()));
}

TEST_F(HTTPServerTest, answersRequestsOfOneConnectionInOrder) {
  const std::string answer = answerTo(
      "GET /1 HTTP/1.1\r\nHost: h\r\n\r\nPOST /2 HTTP/1.1\r\nHost: h\r\nContent-Length: 1\r\n\r\nx"
      "GET /3 HTTP/1.1\r\nHost: h\r\nConnection: close\r\n\r\n");
  const size_t first = answer.find("GET /1");
  const size_t second = answer.find("POST /2");
  const size_t third = answer.find("GET /3");
  EXPECT_LT(first, second);
  EXPECT_LT(second, third);
  EXPECT_NE(third, std::string::npos);
  EXPECT_EQ(server().acceptedConnections(), 1u);
}

TEST_F(HTTPServerTest, takesABodyInChunks) {
  EXPECT_THAT(answerTo("POST / HTTP/1.1\r\nConnection: close\r\nTransfer-Encoding: chunked\r\n\r\n"
                       "3\r\nabc\r\n2\r\nde\r\n0\r\n\r\n"),
              ::testing::EndsWith("abcde"));
}

TEST_F(HTTPServerTest, asksForABodyThatIsHeldBack) {
  const RawPeer peer = connect();
  peer.say("POST / HTTP/1.1\r\nConnection: close\r\nExpect: 100-continue\r\nContent-Length: 2\r\n\r\n");
  EXPECT_EQ(peer.hearUntil("\r\n\r\n"), "HTTP/1.1 100 Continue\r\n\r\n");
  peer.say("ok");
  EXPECT_THAT(peer.hearAll(), ::testing::EndsWith("ok"));
}

TEST_F(HTTPServerTest, sendsNoBodyInAnswerToHead) {
  const std::string answer = answerTo("HEAD / HTTP/1.1\r\nConnection: close\r\n\r\n");
  EXPECT_THAT(answer, HasSubstr("Content-Length: "));
  EXPECT_EQ(body(answer), "");
}

TEST_F(HTTPServerTest, refusesATooLargeBody) {
  _serverOptions.maximumBodyBytes = 10;
  EXPECT_THAT(answerTo("POST / HTTP/1.1\r\nContent-Length: 11\r\n\r\nxxxxxxxxxxx"), StartsWith("HTTP/1.1 413 "));
  EXPECT_THAT(answerTo("POST / HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nb\r\nxxxxxxxxxxx\r\n0\r\n\r\n"),
              StartsWith("HTTP/1.1 413 "));
  EXPECT_THAT(answerTo("POST / HTTP/1.1\r\nConnection: close\r\nContent-Length: 10\r\n\r\nxxxxxxxxxx"),
              StartsWith("HTTP/1.1 200 "));
}

// Keeps the pieces of a body, and refuses at a byte of the test's choice.
class KeepingSink final : public HTTPServer::BodySink {
 public:
  explicit KeepingSink(int* alive) : _alive(alive) { ++*_alive; }
  ~KeepingSink() override { --*_alive; }
  int take(std::string_view piece) override {
    bytes += piece;
    largestPiece = std::max(largestPiece, piece.size());
    return piece.find('!') == std::string_view::npos ? 0 : 507;
  }
  std::string bytes;
  size_t largestPiece = 0;

 private:
  int* const _alive;
};

// Bodies for /sink go to a sink, those for other paths are gathered.
class HTTPServerSinkTest : public HTTPServerTest {
 protected:
  HTTPServerSinkTest() {
    _serverOptions.maximumBodyBytes = 10;
    _sinkMaker = [this](const Server::Request& head) -> std::shared_ptr<Server::BodySink> {
      return head.target == "/sink" ? std::make_shared<KeepingSink>(&_aliveSinks) : nullptr;
    };
    _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
      const auto sink = std::dynamic_pointer_cast<KeepingSink>(request.sink);
      const std::string taken = sink != nullptr ? sink->bytes : "nothing";
      const size_t largest = sink != nullptr ? sink->largestPiece : 0;
      responder->send({.headers = {{"Largest", std::to_string(largest)}},
                       .body = Data(taken + "|" + std::string(request.body.view()))});
    };
  }
  int _aliveSinks = 0;  // read when the server has ended
};

TEST_F(HTTPServerSinkTest, takesABodyOfAnySizeInPieces) {
  const std::string content(1'000'000, 'x');
  const std::string answer =
      answerTo("POST /sink HTTP/1.1\r\nConnection: close\r\nContent-Length: 1000000\r\n\r\n" + content);
  EXPECT_EQ(body(answer), content + "|");
  const size_t at = answer.find("Largest: ");
  ASSERT_NE(at, std::string::npos);
  EXPECT_LE(std::stoul(answer.substr(at + 9)), 64u << 10);
}

TEST_F(HTTPServerSinkTest, takesChunksAndABodyThatIsHeldBack) {
  EXPECT_EQ(body(answerTo("POST /sink HTTP/1.1\r\nConnection: close\r\nTransfer-Encoding: chunked\r\n\r\n"
                          "c\r\nabcdefghijkl\r\n2\r\nmn\r\n0\r\n\r\n")),
            "abcdefghijklmn|");
  const RawPeer peer = connect();
  peer.say("POST /sink HTTP/1.1\r\nConnection: close\r\nExpect: 100-continue\r\nContent-Length: 2\r\n\r\n");
  EXPECT_EQ(peer.hearUntil("\r\n\r\n"), "HTTP/1.1 100 Continue\r\n\r\n");
  peer.say("ok");
  EXPECT_THAT(peer.hearAll(), ::testing::EndsWith("ok|"));
}

TEST_F(HTTPServerSinkTest, goesOnWithTheNextRequestOfTheConnection) {
  const std::string both = answerTo(
      "POST /sink HTTP/1.1\r\nContent-Length: 12\r\n\r\nfirst of allPOST /other HTTP/1.1\r\nConnection: close\r\n"
      "Content-Length: 3\r\n\r\ntwo");
  EXPECT_THAT(both, HasSubstr("first of all|"));
  EXPECT_THAT(both, ::testing::EndsWith("nothing|two"));
}

TEST_F(HTTPServerSinkTest, gathersWhatNoSinkTakesAndBoundsIt) {
  EXPECT_THAT(answerTo("POST /other HTTP/1.1\r\nContent-Length: 11\r\n\r\nxxxxxxxxxxx"), StartsWith("HTTP/1.1 413 "));
  EXPECT_THAT(answerTo("POST /other HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nb\r\nxxxxxxxxxxx\r\n0\r\n\r\n"),
              StartsWith("HTTP/1.1 413 "));
}

TEST_F(HTTPServerSinkTest, refusesWhatIsTooMuchForASinkTooAndSaysNothingMore) {
  _serverOptions.maximumPiecewiseBodyBytes = 20;
  const std::string tooMuch(21, 'x');
  const std::string answers[] = {
      answerTo("POST /sink HTTP/1.1\r\nContent-Length: 21\r\n\r\n" + tooMuch),
      answerTo("POST /sink HTTP/1.1\r\nExpect: 100-continue\r\nContent-Length: 21\r\n\r\n"),
      answerTo("POST /sink HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\n15\r\n" + tooMuch + "\r\n0\r\n\r\n")};
  for (const std::string& answer : answers) {
    EXPECT_THAT(answer, StartsWith("HTTP/1.1 413 "));
    EXPECT_EQ(body(answer), "");
  }
  EXPECT_EQ(
      body(answerTo("POST /sink HTTP/1.1\r\nConnection: close\r\nContent-Length: 20\r\n\r\n" + tooMuch.substr(1))),
      tooMuch.substr(1) + "|");
}

TEST_F(HTTPServerSinkTest, asksNobodyForARequestWithoutABody) {
  EXPECT_EQ(body(answerTo("POST /sink HTTP/1.1\r\nConnection: close\r\nContent-Length: 0\r\n\r\n")), "nothing|");
}

TEST_F(HTTPServerSinkTest, endsTheConnectionWithTheStatusOfASinkThatRefuses) {
  EXPECT_THAT(answerTo("POST /sink HTTP/1.1\r\nContent-Length: 14\r\n\r\nno more of it!"), StartsWith("HTTP/1.1 507 "));
}

TEST_F(HTTPServerSinkTest, letsASinkGoWhoseBodyDoesNotComeToItsEnd) {
  {
    const RawPeer peer = connect();
    peer.say("POST /sink HTTP/1.1\r\nContent-Length: 1000\r\n\r\nhalf");
  }
  EXPECT_EQ(body(answerTo("POST /other HTTP/1.1\r\nConnection: close\r\n\r\n")), "nothing|");
  endServer();
  EXPECT_EQ(_aliveSinks, 0);
}

TEST_F(HTTPServerTest, refusesATooLargeHead) {
  _serverOptions.maximumHeadBytes = 1000;
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\nX: " + std::string(2000, 'x') + "\r\n\r\n"), StartsWith("HTTP/1.1 431 "));
}

TEST_F(HTTPServerTest, refusesGarbage) {
  EXPECT_THAT(answerTo("what is this\r\n\r\n"), StartsWith("HTTP/1.1 400 "));
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\nno colon\r\n\r\n"), StartsWith("HTTP/1.1 400 "));
  EXPECT_THAT(answerTo("POST / HTTP/1.1\r\nContent-Length: many\r\n\r\n"), StartsWith("HTTP/1.1 400 "));
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\nConnection: close\r\n\r\n"), StartsWith("HTTP/1.1 200 "));
}

TEST_F(HTTPServerTest, endsAConnectionWhoseRequestDoesNotGoOn) {
  _serverOptions.transferTimeout = 20ms;
  const RawPeer peer = connect();
  peer.say("POST / HTTP/1.1\r\nContent-Le");
  EXPECT_TRUE(peer.hearsEnd());
}

TEST_F(HTTPServerTest, endsAnIdleConnection) {
  _serverOptions.idleTimeout = 20ms;
  const RawPeer peer = connect();
  peer.say("GET / HTTP/1.1\r\n\r\n");
  peer.hearUntil("\r\n\r\n");
  EXPECT_TRUE(peer.hearsEnd());
}

TEST_F(HTTPServerTest, waitsForAnAnswerLongerThanForAPeer) {
  _serverOptions.idleTimeout = _serverOptions.transferTimeout = 20ms;
  givenAnswersByTheTest();
  const RawPeer slow = connect();
  slow.say("GET / HTTP/1.1\r\nConnection: close\r\n\r\n");
  const auto responder = waitForRequests(1).front();
  EXPECT_TRUE(connect().hearsEnd()) << "another connection, idle since then, has ended";
  responder->send({.body = Data::copyOf("late")});
  EXPECT_THAT(slow.hearAll(), ::testing::EndsWith("late"));
}

TEST_F(HTTPServerTest, endsATLSConnectionThatSpeaksPlainly) {
  const TestCertificates::Server files = _certificates.valid();
  _serverOptions.certificateFile = files.certificateFile;
  _serverOptions.privateKeyFile = files.privateKeyFile;
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\n\r\n"), ::testing::Not(HasSubstr("HTTP/1.1 200")));
}

TEST_F(HTTPServerTest, takesAnAnswerFromAnotherThread) {
  givenAnswersByTheTest();
  const RawPeer peer = connect();
  peer.say("GET / HTTP/1.1\r\nConnection: close\r\n\r\n");
  const auto responder = waitForRequests(1).front();
  std::thread([&responder] { responder->send({.status = 404, .body = Data::copyOf("none")}); }).join();
  const std::string answer = peer.hearAll();
  EXPECT_THAT(answer, StartsWith("HTTP/1.1 404 Not Found\r\n"));
  EXPECT_EQ(body(answer), "none");
}

TEST_F(HTTPServerTest, takesOneAnswerToARequest) {
  _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    responder->send({.body = Data(std::string(request.target))});
    responder->send({.status = 500});
    responder->sendPiece(Data::copyOf("more"));
    responder->finish();
  };
  const std::string answer = answerTo("GET /1 HTTP/1.1\r\n\r\nGET /2 HTTP/1.1\r\nConnection: close\r\n\r\n");
  EXPECT_EQ(answer,
            "HTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\n/1HTTP/1.1 200 OK\r\nContent-Length: 2\r\n"
            "Connection: close\r\n\r\n/2");
}

TEST_F(HTTPServerTest, sendsABodyInPieces) {
  givenAnswersByTheTest();
  const RawPeer peer = connect();
  peer.say("GET / HTTP/1.1\r\nConnection: close\r\n\r\n");
  const auto responder = waitForRequests(1).front();
  responder->sendHead({.headers = {{"X", "y"}}}, std::nullopt);
  responder->sendPiece(Data::copyOf("abc"));
  responder->sendPiece(Data());
  responder->sendPiece(Data::copyOf("0123456789abcdef"));
  responder->finish();
  EXPECT_EQ(peer.hearAll(),
            "HTTP/1.1 200 OK\r\nX: y\r\nTransfer-Encoding: chunked\r\nConnection: close\r\n\r\n"
            "3\r\nabc\r\n10\r\n0123456789abcdef\r\n0\r\n\r\n");
}

TEST_F(HTTPServerTest, endsTheConnectionWhenAnAnswerIsNotGiven) {
  _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>&) {};
  EXPECT_EQ(answerTo("GET / HTTP/1.1\r\n\r\n"), "");
}

TEST_F(HTTPServerTest, endsTheConnectionWhenTheAnswerSaysSo) {
  _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>& responder) { responder->close(); };
  EXPECT_EQ(answerTo("GET / HTTP/1.1\r\n\r\n"), "");
}

TEST_F(HTTPServerTest, answersForAHandlerThatThrows) {
  _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>&) { throw std::runtime_error("x"); };
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\nConnection: close\r\n\r\n"), StartsWith("HTTP/1.1 500 "));
}

TEST_F(HTTPServerTest, keepsHeadersOnTheirLines) {
  _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>& responder) {
    responder->send({.headers = {{"Location", "x\r\nSet-Cookie: evil"}}});
  };
  EXPECT_THAT(answerTo("GET / HTTP/1.1\r\nConnection: close\r\n\r\n"), HasSubstr("Location: x  Set-Cookie: evil\r\n"));
}

TEST_F(HTTPServerTest, closesConnectionsAboveItsLimit) {
  _serverOptions.maximumConnections = 1;
  const RawPeer first = connect();
  first.say("GET / HTTP/1.1\r\n\r\n");
  EXPECT_THAT(first.hearUntil("\r\n\r\n"), StartsWith("HTTP/1.1 200 "));
  EXPECT_TRUE(connect().hearsEnd());
}

TEST_F(HTTPServerTest, endsWithConnectionsOpenAndAnswersOwed) {
  std::shared_ptr<Server::Responder> owed;
  std::mutex mutex;
  std::condition_variable came;
  auto started = HTTPServer::start({.threads = 2}, [&](const Server::Request&, auto responder) {
    const std::lock_guard lock(mutex);
    owed = std::move(responder);
    came.notify_all();
  });
  ASSERT_TRUE(started.has_value());
  const RawPeer idle = RawPeer::to((*started)->port());
  const RawPeer asking = RawPeer::to((*started)->port());
  asking.say("GET / HTTP/1.1\r\n\r\n");
  {
    std::unique_lock lock(mutex);
    ASSERT_TRUE(came.wait_for(lock, 30s, [&] { return owed != nullptr; }));
  }
  started->reset();
  EXPECT_TRUE(idle.hearsEnd());
  EXPECT_TRUE(asking.hearsEnd());
  owed->send({});
  owed->close();
}

TEST_F(HTTPServerTest, doesNotStartOnAnAddressThatCannotBeUsed) {
  const auto unused = [](const Server::Request&, const std::shared_ptr<Server::Responder>&) {};
  EXPECT_FALSE(HTTPServer::start({.host = "nowhere"}, unused).has_value());
  const auto taken = HTTPServer::start({.host = "127.0.0.1", .port = server().port()}, unused);
  ASSERT_FALSE(taken.has_value());
  EXPECT_EQ(taken.error().code(), EADDRINUSE);
  EXPECT_THAT(taken.error().description(), StartsWith("The server cannot be started: "));
}

TEST_F(HTTPServerTest, doesNotStartWithACertificateThatCannotBeUsed) {
  const auto unused = [](const Server::Request&, const std::shared_ptr<Server::Responder>&) {};
  const TestCertificates::Server files = _certificates.valid();
  Server::Options options;
  options.certificateFile = files.certificateFile;
  EXPECT_FALSE(HTTPServer::start(options, unused).has_value()) << "no key";
  options.privateKeyFile = _folder.write("garbage.key", "garbage");
  EXPECT_FALSE(HTTPServer::start(options, unused).has_value()) << "a key of garbage";
  options.privateKeyFile = _certificates.expired().privateKeyFile;
  EXPECT_FALSE(HTTPServer::start(options, unused).has_value()) << "the key of another certificate";
}

}  // namespace telvane::testing
