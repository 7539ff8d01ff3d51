#include "bench/ManySessions.h"

#include <fmt/format.h>

#include <cstdio>
#include <string>

#include "bench/Measurement.h"
#include "bench/RoadInstance.h"
#include "interfaces/ClientTypes.h"

namespace telvane::bench {
namespace {

constexpr uint64_t kSessionsOfType = 4;
// A session says of itself that it starts and that it stops.
constexpr uint64_t kEventsOfSession = 2;

std::vector<RoadInstance::Running> startClients(RoadInstance& instance, uint64_t eventsOfClient) {
  std::vector<RoadInstance::Running> clients;
  for (const ClientType& type : allClientTypes()) {
    const std::string number = std::to_string(type.number);
    clients.push_back(instance.start("telvane-road-client",
                                     {"--events", std::to_string(eventsOfClient), "--client-type", number, "--sessions",
                                      std::to_string(kSessionsOfType), "--held"},
                                     "client-" + number));
  }
  for (const auto& client : clients) instance.waitForLine(client, "ready");
  return clients;
}

}  // namespace

void measureManySessions(const RoadOptions& options, Report& report) {
  std::fprintf(stderr, "many sessions\n");
  const uint64_t sessions = kSessionsOfType * allClientTypes().size();
  const uint64_t events = options.sessionEvents * sessions;
  RoadInstance instance;
  for (const ClientType& type : allClientTypes()) instance.givenBag(type.number, BagRules::FiltersAndWhitelist);
  instance.startDaemon("error");
  auto clients = startClients(instance, options.sessionEvents * kSessionsOfType);
  const double cpuBefore = cpuMicrosecondsOf(instance.daemonPID());
  const double start = monotonicSeconds();
  for (auto& client : clients) client.process->closeInput();
  for (auto& client : clients) instance.finish(client);
  instance.waitForEvents(events + sessions * kEventsOfSession);
  const double seconds = monotonicSeconds() - start;
  const double cpu = cpuMicrosecondsOf(instance.daemonPID()) - cpuBefore;
  const double peak = static_cast<double>(peakMemoryOf(instance.daemonPID())) / 1e6;
  instance.endDaemon();
  const double count = static_cast<double>(events);
  report.figures.add("26 client types, 4 sessions each: events arrived, with their own",
                     std::to_string(instance.arrivedEvents()) + " of " + std::to_string(instance.expectedEvents()),
                     "all", instance.arrivedEvents() == instance.expectedEvents());
  report.figures.add({"26 x 4 sessions: events per second", Samples({count / seconds}), "", 0});
  report.figures.add({"26 x 4 sessions: daemon's CPU per event", Samples({cpu / count}), " us"});
  report.figures.add({"26 x 4 sessions: daemon's peak memory", Samples({peak}), " MB", 1});
  report.figures.addNote(fmt::format("26 x 4 sessions: {} events in each of {} sessions, from {} processes.",
                                     options.sessionEvents, sessions, clients.size()));
  report.sentEvents += instance.expectedEvents();
  report.arrivedEvents += instance.arrivedEvents();
}

}  // namespace telvane::bench
