// Servers that do not do what they should: the daemon says so, stays up, stays small, and serves the next session.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <fstream>
#include <future>

#include "platform/url/HTTPServer.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;
using Responder = HTTPServer::Responder;

constexpr size_t kPieceBytes = 1u << 20;
constexpr size_t kHugePieces = 100;
constexpr int64_t kLargestPeakKilobytes = 98304;

void closeEarly(Responder& responder) {
  responder.sendHead({200, {}, {}}, 1000);
  responder.sendPiece(Data::copyOf("not all of it"));
  responder.close();
}

void sendHuge(Responder& responder) {
  responder.sendHead({200, {}, {}}, kPieceBytes * kHugePieces);
  const Data piece(std::string(kPieceBytes, ' '));
  for (size_t i = 0; i < kHugePieces; ++i) responder.sendPiece(piece);
  responder.finish();
}

// What a server does with a request, and what the daemon then says.
struct Fault {
  const char* name;
  std::function<void(Responder&)> answer;
  const char* logged;
};

void PrintTo(const Fault& fault, std::ostream* stream) { *stream << fault.name; }

Fault status(const char* name, int code, const char* logged, std::vector<HTTPServer::Header> headers = {}) {
  return {name, [code, headers](Responder& responder) { responder.send({code, headers, {}}); }, logged};
}

// A server of the test's own with the certificate of the instance's collector.
class FaultyServerFixture : public ::testing::Test {
 protected:
  FaultyServerFixture() { _instance.startCollector(); }

  // Serves the path with the fault, everything else as a storebag whose events go to postURL.
  void givenServer(const std::string& faultyPath, std::function<void(Responder&)> fault) {
    HTTPServer::Options options;
    options.certificateFile = _instance.path("valid.pem");
    options.privateKeyFile = _instance.path("valid.key");
    // The server's thread learns the address from here; the field is the test's.
    std::promise<std::string> opened;
    auto handler = [this, faultyPath, fault = std::move(fault), address = opened.get_future().share()](
                       const HTTPServer::Request& request, const std::shared_ptr<Responder>& responder) {
      if (request.target.starts_with(faultyPath)) return fault(*responder);
      const std::string postURL = request.target.starts_with("/conferencing") ? "https://" + address.get() + "/events"
                                                                              : _instance.collectorURL("/events");
      responder->send({200, {}, Data(_instance.signedEnvelope(openBag(postURL)))});
    };
    Result<std::unique_ptr<HTTPServer>> started = HTTPServer::start(std::move(options), std::move(handler));
    ASSERT_FALSE(started.has_error()) << started.error().description();
    _server = std::move(*started);
    opened.set_value(_server->address());
    _instance.givenStorebagServer("https://" + _server->address());
    _instance.startDaemon();
  }
  void expectTheNextSessionWorks() {
    EXPECT_THAT(_instance.sendEvents({"--client-type", "8"}), HasSubstr("configured: [splunk]"))
        << _instance.daemonLog();
    EXPECT_TRUE(eventually([this] { return _instance.arrivedWithCategory(21).size() == 3; })) << _instance.daemonLog();
  }
  int64_t peakKilobytes() {
    std::ifstream file("/proc/" + std::to_string(_instance.daemon().pid()) + "/status");
    for (std::string line; std::getline(file, line);) {
      if (line.starts_with("VmHWM:")) return std::stoll(line.substr(6));
    }
    return -1;
  }

  Instance _instance;
  std::unique_ptr<HTTPServer> _server;
};

class StorebagServerFaultsTest : public FaultyServerFixture, public ::testing::WithParamInterface<Fault> {};

TEST_P(StorebagServerFaultsTest, aStorebagServerThatFailsCostsItsBagOnly) {
  givenServer("/conferencing", GetParam().answer);
  EXPECT_THAT(_instance.sendEvents({"--no-flush"}), HasSubstr("configured: nothing"));
  // The log is written behind what it tells of.
  EXPECT_TRUE(eventually([this] { return _instance.daemonLogHas(GetParam().logged); })) << _instance.daemonLog();
  expectTheNextSessionWorks();
  EXPECT_GT(peakKilobytes(), 0);
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
  EXPECT_LT(peakKilobytes(), kLargestPeakKilobytes);
#endif
}

constexpr char kNoUpdate[] = "storebag 'conferencing' does not need update";

INSTANTIATE_TEST_SUITE_P(
    Servers, StorebagServerFaultsTest,
    ::testing::Values(status("notModified", 304, kNoUpdate), status("notFound", 404, kNoUpdate),
                      status("serverError", 500, kNoUpdate),
                      status("redirectToPlainHTTP", 302, kNoUpdate, {{"Location", "http://127.0.0.1:1/x"}}),
                      status("nothing", 200, "received zero-length storebag"),
                      Fault{"closesAtOnce", [](Responder& responder) { responder.close(); }, kNoUpdate},
                      Fault{"closesEarly", closeEarly, kNoUpdate}, Fault{"sendsTooMuch", sendHuge, kNoUpdate}),
    [](const auto& fault) { return std::string(fault.param.name); });

class CollectorFaultsTest : public FaultyServerFixture {};

TEST_F(CollectorFaultsTest, aCollectorThatIsBrokenSwitchesItsBackendOff) {
  givenServer("/events", [](Responder& responder) { responder.send({503, {}, {}}); });
  const std::string said = _instance.sendEvents({});
  EXPECT_THAT(said, HasSubstr("flushed: error 503 backend splunk disabled by server 503 return code"));
  expectTheNextSessionWorks();
}

TEST_F(CollectorFaultsTest, aCollectorThatHangsUpIsToldToWhoFlushed) {
  givenServer("/events", [](Responder& responder) { responder.close(); });
  EXPECT_THAT(_instance.sendEvents({}), HasSubstr("flushed: error "));
  EXPECT_TRUE(eventually([this] { return _instance.daemonLogHas("HTTPSPostBackend(postJsonMessage): post error:"); }))
      << _instance.daemonLog();
  expectTheNextSessionWorks();
}

TEST_F(CollectorFaultsTest, anAnswerThatIsTooLargeIsNotKept) {
  givenServer("/events", sendHuge);
  _instance.sendEvents({});
  expectTheNextSessionWorks();
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
  EXPECT_LT(peakKilobytes(), kLargestPeakKilobytes);
#endif
}

// Descriptors run out: connections are not accepted until there are some again, and nothing is lost for good.
TEST_F(CollectorFaultsTest, aDaemonWithoutDescriptorsServesAgainWhenItHasSome) {
  rlimit usual{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit scarce{48, usual.rlim_max};
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &scarce), 0);
  _instance.startDaemon();
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &usual), 0);
  _instance.givenStorebag("audio", openBag(_instance.collectorURL("/events")));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  _instance.socketPath().copy(address.sun_path, sizeof(address.sun_path) - 1);
  std::vector<int> sockets;
  for (int i = 0; i < 100; ++i) {
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK, 0);
    ASSERT_GE(socket, 0);
    sockets.push_back(socket);
    static_cast<void>(connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof(address)));
  }
  EXPECT_TRUE(eventually([this] { return _instance.daemonLogHas("<error>"); })) << _instance.daemonLog();
  EXPECT_TRUE(_instance.daemon().isRunning());
  for (const int socket : sockets) close(socket);
  expectTheNextSessionWorks();
}

}  // namespace
}  // namespace telvane::testing
