// What events cost on their way to a live dashboard: real client, real daemon, real datagrams, once as a bag says it
// without reliable mode and once with it. The dashboard is of this program and acknowledges at once.
//
//   telvane-bench-dashboard [--events N] [--rounds N] [--quick]
//
// Datagrams get lost where a sender is faster than who reads them, also on one machine; so how many arrived is a figure
// like the others. In reliable mode at most 50 wait for their acknowledgements, and what a burst pushes out is not sent
// again.
#include <fmt/format.h>
#include <signal.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <stdexcept>

#include "bench/FigureTable.h"
#include "bench/Measurement.h"
#include "bench/RoadBag.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/datagram/DatagramServer.h"
#include "tests/endtoend/Instance.h"

namespace {

using namespace telvane;
using namespace telvane::bench;

constexpr char kClient[] = "telvane-road-client";
constexpr char kBagName[] = "conferencing";
constexpr int kPeriod = 500;  // milliseconds
constexpr auto kRunPatience = std::chrono::minutes(10);

// Counts what it gets and acknowledges what wants it.
class CountingDashboard {
 public:
  CountingDashboard() {
    auto server = DatagramServer::start({{127, 0, 0, 1}, 0},
                                        [this](const DatagramServer& self, std::span<const uint8_t> datagram,
                                               const IPv4SocketAddress& peer) { take(self, datagram, peer); });
    if (server.has_error()) throw std::runtime_error(server.error().description());
    _server = std::move(*server);
  }
  uint16_t port() const { return _server->address().port; }
  uint64_t events() const { return _events; }
  uint64_t sessionsEnded() const { return _sessionsEnded; }

 private:
  void take(const DatagramServer& server, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer) {
    constexpr size_t kHeader = 64;
    if (datagram.size() < kHeader) return;
    const int category = datagram[16] << 8 | datagram[17];
    const int type = datagram[18] << 8 | datagram[19];
    if (category == kEventCategory) ++_events;
    if (category == 0 && type == 1) ++_sessionsEnded;
    if ((datagram[63] & 1) != 0) server.send(peer, datagram.first(kHeader));
  }

  std::atomic<uint64_t> _events{0};
  std::atomic<uint64_t> _sessionsEnded{0};
  std::unique_ptr<DatagramServer> _server;  // last, so that it ends first
};

struct Cost {
  Samples eventsPerSecond;
  Samples daemonMicroseconds;  // CPU per event
  Samples arrived;             // of a hundred
};

Dictionary bagFor(uint16_t port, bool isReliable) {
  Dictionary profile{{kProfileIP, "127.0.0.1"}, {kProfilePort, port}};
  if (isReliable) profile.set(kProfileReliable, kPeriod);
  Dictionary section;
  section.set("dashboard", profile);
  return {{kEnvironmentRelease, section}, {kStorebagVersion, "bench-1"}, {kStorebagRefreshCycle, 3600}};
}

double secondsOf(const std::string& output) {
  const size_t start = output.rfind("{\"seconds\"");
  const auto figures = json::parse(start != std::string::npos ? output.substr(start) : output);
  if (figures.has_error() || !figures->isDictionary()) throw std::runtime_error("no figures in: " + output);
  return (*figures->dictionary())["seconds"].realValue();
}

void measureOnce(bool isReliable, uint64_t events, Cost& cost) {
  CountingDashboard dashboard;
  telvane::testing::Instance instance;
  instance.startCollector({"--discard"});
  instance.grant(kClient);
  instance.givenStorebag(kBagName, bagFor(dashboard.port(), isReliable));
  instance.startDaemon({"--log-level", "info"});
  const pid_t daemon = instance.daemon().pid();
  const double before = cpuMicrosecondsOf(daemon);
  const auto client = instance.startProgram(kClient, {"--events", std::to_string(events)}, "client");
  if (client->wait(kRunPatience) != 0) throw std::runtime_error(instance.read("client.err"));
  // The session's stop is its last event.
  if (!telvane::testing::eventually([&dashboard] { return dashboard.sessionsEnded() > 0; })) {
    throw std::runtime_error("the session did not end");
  }
  const double used = cpuMicrosecondsOf(daemon) - before;
  const auto count = static_cast<double>(events);
  cost.eventsPerSecond.add(count / secondsOf(instance.read("client.out")));
  cost.daemonMicroseconds.add(used / count);
  cost.arrived.add(100.0 * static_cast<double>(dashboard.events()) / count);
  instance.daemon().signal(SIGTERM);
  if (instance.daemon().wait() != 0) throw std::runtime_error("the daemon ended badly");
}

void report(const std::string& how, const Cost& cost, FigureTable& figures) {
  figures.add({.what = "events per second, " + how, .samples = cost.eventsPerSecond, .decimals = 0});
  figures.add({.what = "daemon's CPU per event, " + how, .samples = cost.daemonMicroseconds, .unit = " us"});
  figures.add({.what = "datagrams that came, " + how, .samples = cost.arrived, .unit = " %", .decimals = 1});
}

}  // namespace

int main(int argc, char** argv) {
  const bool isQuick = hasOption(argc, argv, "quick");
  const uint64_t events = numberOption(argc, argv, "events", isQuick ? 5000 : 50000);
  const uint64_t rounds = numberOption(argc, argv, "rounds", isQuick ? 1 : 5);
  try {
    Cost plain;
    Cost reliable;
    for (uint64_t round = 0; round < rounds; ++round) {
      measureOnce(false, events, plain);
      measureOnce(true, events, reliable);
    }
    FigureTable figures;
    report("once each", plain, figures);
    report("reliable", reliable, figures);
#ifndef NDEBUG
    figures.addNote("Built for development: these figures say nothing about speed.");
#endif
    std::fputs(figures.text().c_str(), stdout);
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-bench-dashboard: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
