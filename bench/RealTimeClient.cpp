// Sends real-time events one by one through the client library and, after each, posts the same request once more with
// libcurl alone: same body, same headers, over a kept connection to the same collector, which is in this process.
//
//   telvane-road-realtime --certificate FILE --private-key FILE --ca FILE [--posts N] [--client-type N]
//
// Prints the URL to be posted to, and starts when its input ends. Then prints, in microseconds,
//   road      from the client's call until the request has arrived at the collector by way of the daemon
//   bare      from the call of libcurl until the request has arrived at the collector
//   answered  from the call of libcurl until it returns, its answer read
// See ArrivalServer for what arrival is. Each call starts from rest: a pause before it lets everybody finish with the
// one before, so that neither side waits for the other or for a connection that is still busy.
#include <curl/curl.h>
#include <telvane/Telvane.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "bench/ArrivalServer.h"
#include "bench/BenchEvent.h"
#include "bench/ConfiguredSession.h"
#include "bench/KeptConnection.h"
#include "bench/Measurement.h"
#include "bench/RoadBag.h"
#include "bench/Samples.h"
#include "platform/Compression.h"

namespace {

using namespace telvane;
using bench::ArrivalServer;
using bench::Samples;

constexpr int kStatus = 1;
constexpr int kRealTimeFlag = 1;
constexpr uint64_t kWarmUp = 50;
constexpr auto kPause = std::chrono::milliseconds(2);
constexpr size_t kMaximumBodyBytes = 1 << 20;

struct Times {
  Samples road;
  Samples bare;
  Samples answered;
};

// The request of the event with this number. What a session says of itself is posted, too, and is let pass.
ArrivalServer::Arrival arrivalOf(ArrivalServer& server, uint64_t number) {
  const std::string eventMap = std::to_string(bench::kEventCategory) + " " + std::to_string(kStatus);
  for (;;) {
    ArrivalServer::Arrival arrival = server.next();
    const std::string* sent = arrival.request.header("X-TVN-Event-Map");
    if (sent == nullptr || *sent != eventMap) continue;
    const bool isCompressed = arrival.request.header("Content-Encoding") != nullptr;
    const auto body = isCompressed ? compression::inflate(arrival.request.body.view(), kMaximumBodyBytes)
                                   : Result<Data>(arrival.request.body);
    if (body.has_error() ||
        body->view().find("\"sequence\":" + std::to_string(number) + ",") == std::string_view::npos) {
      throw std::runtime_error("event " + std::to_string(number) + " was lost or came in another's place");
    }
    return arrival;
  }
}

// The headers of a request as libcurl is to send them; it adds the host and the length of the body by itself.
std::vector<std::string> headersToRepeat(const HTTPServer::Request& request) {
  std::vector<std::string> headers;
  for (const auto& header : request.headers) {
    if (header.name != "Host" && header.name != "Content-Length") headers.push_back(header.name + ": " + header.value);
  }
  return headers;
}

size_t headBytes(const HTTPServer::Request& request) {
  size_t bytes = 0;
  for (const auto& header : request.headers) bytes += header.name.size() + header.value.size();
  return bytes;
}

class Comparison {
 public:
  Comparison(ArrivalServer& server, Telvane& session, const std::string& authorityFile)
      : _server(server), _session(session), _bare(server.url(), authorityFile, {}) {}

  void step(uint64_t number, Times& times) {
    const Dictionary message{{"ParametersCategory", bench::kEventCategory},
                             {"ParametersType", kStatus},
                             {"ParametersFlag", kRealTimeFlag},
                             {"ParametersPayload", bench::makePayload(number)}};
    std::this_thread::sleep_for(kPause);
    const double called = bench::monotonicSeconds();
    _session.sendMessageWithDictionary(message);
    const ArrivalServer::Arrival arrival = arrivalOf(_server, number);
    times.road.add((arrival.seconds - called) * 1e6);
    repeat(arrival.request, number, times);
  }

 private:
  void repeat(const HTTPServer::Request& request, uint64_t number, Times& times) {
    _bare.setHeaders(headersToRepeat(request));
    std::this_thread::sleep_for(kPause);
    const double called = bench::monotonicSeconds();
    if (!_bare.post(request.body.view())) throw std::runtime_error("a bare post failed");
    const double answered = bench::monotonicSeconds();
    const ArrivalServer::Arrival arrival = arrivalOf(_server, number);
    if (headBytes(arrival.request) != headBytes(request)) throw std::runtime_error("the bare post has other headers");
    times.bare.add((arrival.seconds - called) * 1e6);
    times.answered.add((answered - called) * 1e6);
  }

  ArrivalServer& _server;
  Telvane& _session;
  bench::KeptConnection _bare;
};

void print(const char* name, const Samples& samples) {
  std::printf("\"%sp50\": %.1f, \"%sp95\": %.1f, \"%sp99\": %.1f, ", name, samples.percentile(0.5), name,
              samples.percentile(0.95), name, samples.percentile(0.99));
}

void run(int argc, char** argv) {
  const uint64_t posts = bench::numberOption(argc, argv, "posts", 2000);
  const int clientType = static_cast<int>(bench::numberOption(argc, argv, "client-type", 7));
  ArrivalServer server(bench::option(argc, argv, "certificate", ""), bench::option(argc, argv, "private-key", ""));
  std::printf("%s\n", server.url().c_str());
  std::fflush(stdout);
  while (std::getchar() != EOF) {
  }
  const auto session = bench::newConfiguredSession(
      {{"ComponentType", clientType}, {"ClientVersion", 1}, {"SessionID", 1}, {"RequireUserDict", true}}, "realtime");
  Comparison comparison(server, *session, bench::option(argc, argv, "ca", ""));
  Times warmUp;
  Times times;
  for (uint64_t i = 0; i < kWarmUp + posts; ++i) comparison.step(i, i < kWarmUp ? warmUp : times);
  std::printf("{");
  print("road", times.road);
  print("bare", times.bare);
  print("answered", times.answered);
  std::printf("\"sent\": %llu, \"arrived\": %zu, \"connections\": %llu}\n",
              static_cast<unsigned long long>(kWarmUp + posts), warmUp.road.count() + times.road.count(),
              static_cast<unsigned long long>(server.acceptedConnections()));
}

}  // namespace

int main(int argc, char** argv) {
  curl_global_init(CURL_GLOBAL_DEFAULT);
  try {
    run(argc, argv);
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-road-realtime: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
