// The whole road beside the ceiling: how much CPU an event costs from a client's call to the collector's answer.
//
//   telvane-bench-road [--events N]
//
// Prints one line per run and, as our figure of merit, the daemon's CPU per event divided by the ceiling's of this run.
#include <curl/curl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include "bench/Measurement.h"
#include "bench/RoadInstance.h"
#include "platform/JSON.h"

namespace {

using namespace telvane;

struct Figures {
  double eventsPerSecond = 0;
  double clientMicroseconds = 0;  // per event
  double daemonMicroseconds = 0;
  double bytesPerEvent = 0;
  double peakMegabytes = 0;
};

Dictionary parseFigures(const std::string& text) {
  const auto parsed = json::parse(text);
  if (parsed.has_error() || !parsed->isDictionary()) throw std::runtime_error("no figures in: " + text);
  return *parsed->dictionary();
}

// Waits until the collector has counted so many events, and fails when it stands still.
void waitForEvents(const bench::RoadInstance& instance, uint64_t expected) {
  uint64_t last = 0;
  double lastChange = bench::monotonicSeconds();
  for (;;) {
    const uint64_t now = instance.collected("events");
    if (now >= expected) return;
    if (now != last) lastChange = bench::monotonicSeconds();
    last = now;
    if (bench::monotonicSeconds() - lastChange > 10) {
      throw std::runtime_error("events were lost: " + std::to_string(now) + " of " + std::to_string(expected));
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
}

Figures runRoad(const std::string& programs, uint64_t events, const std::string& logLevel) {
  bench::RoadInstance instance(programs, logLevel);
  const double daemonBefore = bench::cpuMicrosecondsOf(instance.daemonPID());
  const Dictionary client = parseFigures(instance.run("telvane-road-client", {"--events", std::to_string(events)}));
  // The session's start and stop messages come on top.
  waitForEvents(instance, events + 1);
  const double count = static_cast<double>(events);
  Figures figures;
  figures.eventsPerSecond = count / client["seconds"].realValue();
  figures.clientMicroseconds = client["cpuMicroseconds"].realValue() / count;
  figures.daemonMicroseconds = (bench::cpuMicrosecondsOf(instance.daemonPID()) - daemonBefore) / count;
  figures.bytesPerEvent = static_cast<double>(instance.collected("bytes")) / count;
  figures.peakMegabytes = static_cast<double>(bench::peakMemoryOf(instance.daemonPID())) / 1e6;
  return figures;
}

double runCeiling(const std::string& programs, uint64_t events) {
  const bench::RoadInstance instance(programs, "error");
  const Dictionary ceiling = parseFigures(
      instance.run("telvane-ceiling", {"--events", std::to_string(events), "--url", instance.collectorURL("/events"),
                                       "--ca", instance.authorityFile()}));
  const double perEvent = ceiling["cpuMicroseconds"].realValue() / static_cast<double>(events);
  std::printf("ceiling            %9.0f events/s  %6.2f us CPU per event  %6.1f bytes per event\n",
              static_cast<double>(events) / ceiling["seconds"].realValue(), perEvent,
              ceiling["bytes"].realValue() / static_cast<double>(events));
  // An idle daemon must not wake up: it has been idle all the while.
  const uint64_t before = bench::wakeUpsOf(instance.daemonPID());
  std::this_thread::sleep_for(std::chrono::seconds(5));
  std::printf("idle daemon        %9llu wake-ups in 5 s\n",
              static_cast<unsigned long long>(bench::wakeUpsOf(instance.daemonPID()) - before));
  return perEvent;
}

int run(int argc, char** argv) {
  const uint64_t events = std::strtoull(bench::option(argc, argv, "events", "200000").c_str(), nullptr, 10);
  const std::string programs = std::filesystem::canonical("/proc/self/exe").parent_path().string();
  std::printf("%llu events of 10 fields\n", static_cast<unsigned long long>(events));
  const double ceiling = runCeiling(programs, events);
  for (const char* logLevel : {"error", "default"}) {
    const Figures figures = runRoad(programs, events, logLevel);
    std::printf(
        "daemon log=%-7s %9.0f events/s  client %5.2f us, daemon %5.2f us CPU per event  %6.1f bytes per event  "
        "peak %.1f MB  ratio %.2f\n",
        logLevel, figures.eventsPerSecond, figures.clientMicroseconds, figures.daemonMicroseconds,
        figures.bytesPerEvent, figures.peakMegabytes, figures.daemonMicroseconds / ceiling);
    std::fflush(stdout);
  }
  return EXIT_SUCCESS;
}

}  // namespace

int main(int argc, char** argv) {
  curl_global_init(CURL_GLOBAL_DEFAULT);
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-bench-road: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
