// Sends batched events as fast as it can through the client library and prints what that cost this process.
//
//   telvane-road-client [--events N] [--client-type N] [--sessions N] [--held]
//
// --sessions: that many, each with its own connection; the events go to them in turn. --held: says "ready" when they
// are configured, and sends when its input ends.
//
// The library drops what it cannot hand on, so this client waits for flushes now and then: it is never more than two
// windows ahead of the daemon.
#include <telvane/Telvane.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/BenchEvent.h"
#include "bench/ConfiguredSession.h"
#include "bench/Measurement.h"
#include "bench/RoadBag.h"

namespace {

using namespace telvane;

constexpr uint64_t kWindow = 5000;

// A session and its last flush.
struct Sender {
  std::shared_ptr<Telvane> session;
  std::future<void> flushed;
};

std::shared_ptr<Telvane> openSession(int clientType, uint64_t number) {
  return bench::newConfiguredSession({{"ComponentType", clientType},
                                      {"ClientVersion", 1},
                                      {"SessionID", number},
                                      {"BatchEvents", true},
                                      {"RequireUserDict", true}},
                                     "road");
}

void flush(Sender& sender) {
  if (sender.flushed.valid()) sender.flushed.wait();
  auto answered = std::make_shared<std::promise<void>>();
  sender.flushed = answered->get_future();
  sender.session->flushMessagesWithCompletion(
      [answered = std::move(answered)](const std::optional<Error>&) { answered->set_value(); });
}

// Returns the CPU time that making the payloads took; it belongs to the application, not to the library.
double send(std::vector<Sender>& senders, uint64_t events) {
  double making = 0;
  std::vector<Dictionary> payloads;
  for (uint64_t sent = 0; sent < events;) {
    const double before = bench::threadCPUMicroseconds();
    payloads.clear();
    const uint64_t end = std::min(sent + kWindow, events);
    for (uint64_t i = sent; i < end; ++i) payloads.push_back(bench::makePayload(i));
    making += bench::threadCPUMicroseconds() - before;
    for (const Dictionary& payload : payloads) {
      senders[sent++ % senders.size()].session->sendMessageWithCategory(bench::kEventCategory, 1, payload);
    }
    for (Sender& sender : senders) flush(sender);
  }
  for (Sender& sender : senders) sender.flushed.wait();
  return making;
}

void waitForEndOfInput() {
  std::puts("ready");
  std::fflush(stdout);
  while (std::getchar() != EOF) {
  }
}

void run(int argc, char** argv) {
  const uint64_t events = bench::numberOption(argc, argv, "events", 200000);
  const int clientType = static_cast<int>(bench::numberOption(argc, argv, "client-type", 7));
  std::vector<Sender> senders(std::max<uint64_t>(bench::numberOption(argc, argv, "sessions", 1), 1));
  for (uint64_t i = 0; i < senders.size(); ++i) senders[i].session = openSession(clientType, i + 1);
  if (bench::hasOption(argc, argv, "held")) waitForEndOfInput();
  const double startCPU = bench::ownCPUMicroseconds();
  const double start = bench::monotonicSeconds();
  const double making = send(senders, events);
  std::printf("{\"seconds\": %.6f, \"cpuMicroseconds\": %.1f}\n", bench::monotonicSeconds() - start,
              bench::ownCPUMicroseconds() - startCPU - making);
}

}  // namespace

int main(int argc, char** argv) {
  try {
    run(argc, argv);
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-road-client: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
