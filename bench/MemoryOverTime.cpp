#include "bench/MemoryOverTime.h"

#include <fmt/format.h>

#include <chrono>
#include <cstdio>
#include <string>
#include <thread>

#include "bench/Measurement.h"
#include "bench/MemoryWatch.h"
#include "bench/RoadInstance.h"

namespace telvane::bench {
namespace {

constexpr int kClientType = 5;
constexpr uint64_t kEventsOfSession = 2;
constexpr auto kInterval = std::chrono::milliseconds(10);
constexpr double kFlat = 0.05;
// For workers and timers that the work has left behind.
constexpr auto kSettling = std::chrono::seconds(1);

void addTrend(FigureTable& figures, const std::string& name, const MemoryWatch& watch) {
  const MemoryWatch::Trend trend = watch.trend();
  figures.add(fmt::format("{}: memory, second and last quarter of the run", name),
              fmt::format("{:.1f} to {:.1f} MB ({:+.1f} %)", trend.warm, trend.end, trend.growth() * 100),
              fmt::format("flat: at most +{:.0f} %", kFlat * 100), trend.growth() <= kFlat);
  figures.add({name + ": largest sample", Samples({trend.peak}), " MB", 1});
}

void addWakeUps(FigureTable& figures, RoadInstance& instance, uint64_t seconds) {
  std::this_thread::sleep_for(kSettling);
  const auto before = switchesOf(instance.daemonPID());
  std::this_thread::sleep_for(std::chrono::seconds(seconds));
  const uint64_t count = wakeUpsBetween(before, switchesOf(instance.daemonPID()));
  figures.add({fmt::format("daemon after work: wake-ups in {} s", seconds), Samples({static_cast<double>(count)}), "",
               0, Goal{Goal::Kind::AtMost, 0}});
}

}  // namespace

void measureMemoryOverTime(const RoadOptions& options, Report& report) {
  std::fprintf(stderr, "memory over time\n");
  RoadInstance instance;
  instance.givenBag(kClientType, BagRules::FiltersAndWhitelist);
  instance.startDaemon("error");
  RoadInstance::Running client =
      instance.start("telvane-road-client",
                     {"--events", std::to_string(options.memoryEvents), "--client-type", std::to_string(kClientType)});
  MemoryWatch daemonMemory(instance.daemonPID());
  MemoryWatch clientMemory(client.process->pid());
  while (client.process->isRunning()) {
    daemonMemory.sample();
    clientMemory.sample();
    std::this_thread::sleep_for(kInterval);
  }
  instance.finish(client);
  instance.waitForEvents(options.memoryEvents + kEventsOfSession);
  addTrend(report.figures, "daemon", daemonMemory);
  addTrend(report.figures, "client", clientMemory);
  addWakeUps(report.figures, instance, options.idleSeconds);
  instance.endDaemon();
  report.figures.addNote(fmt::format("Memory: resident, sampled every {} ms over a run of {} events.",
                                     kInterval.count(), options.memoryEvents));
  report.sentEvents += instance.expectedEvents();
  report.arrivedEvents += instance.arrivedEvents();
}

}  // namespace telvane::bench
