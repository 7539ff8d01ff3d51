// Sends events as fast as it can through the client library and prints what that cost this process.
//
// The library drops what it cannot hand on, so this client waits for a flush now and then: it is never more than two
// windows ahead of the daemon.
#include <telvane/Telvane.h>

#include <cstdio>
#include <cstdlib>
#include <future>
#include <string>

#include "bench/BenchEvent.h"
#include "bench/Measurement.h"

namespace {

constexpr uint64_t kWindow = 5000;
constexpr uint16_t kCategory = 11;

std::future<bool> flush(telvane::Telvane& session) {
  auto answered = std::make_shared<std::promise<bool>>();
  std::future<bool> future = answered->get_future();
  session.flushMessagesWithCompletion(
      [answered](const std::optional<telvane::Error>& error) { answered->set_value(!error.has_value()); });
  return future;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace telvane;
  const uint64_t events = std::strtoull(bench::option(argc, argv, "events", "200000").c_str(), nullptr, 10);
  const Dictionary sessionInfo{
      {"ComponentType", 7}, {"ClientVersion", 1}, {"SessionID", 1}, {"BatchEvents", true}, {"RequireUserDict", true}};
  const Dictionary userInfo{{"_clientName", "bench"}, {"_serviceName", "road"}};
  const auto session = Telvane::initWithSessionInfo(sessionInfo, userInfo);
  if (session == nullptr) return EXIT_FAILURE;
  std::promise<std::string> configured;
  session->startConfigurationWithCompletionHandler([&configured](const Value& names) {
    configured.set_value(names.array() != nullptr && names.array()->size() > 0 ? "ready" : "");
  });
  if (configured.get_future().get().empty()) {
    std::fprintf(stderr, "road-client: no backend is enabled\n");
    return EXIT_FAILURE;
  }
  const double startCPU = bench::ownCPUMicroseconds();
  const double start = bench::monotonicSeconds();
  // What making the payloads costs belongs to the application, not to the library.
  double making = 0;
  std::future<bool> window;
  std::vector<Dictionary> payloads;
  for (uint64_t i = 0; i < events;) {
    const double before = bench::threadCPUMicroseconds();
    payloads.clear();
    for (uint64_t n = 0; n < kWindow && i < events; ++n, ++i) payloads.push_back(bench::makePayload(i));
    making += bench::threadCPUMicroseconds() - before;
    for (const Dictionary& payload : payloads) session->sendMessageWithCategory(kCategory, 1, payload);
    if (window.valid()) window.wait();
    window = flush(*session);
  }
  if (window.valid()) window.wait();
  const double seconds = bench::monotonicSeconds() - start;
  const double cpu = bench::ownCPUMicroseconds() - startCPU - making;
  std::printf("{\"seconds\": %.6f, \"cpuMicroseconds\": %.1f}\n", seconds, cpu);
  return EXIT_SUCCESS;
}
