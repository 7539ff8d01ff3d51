#include "bench/RealTimeEvents.h"

#include <fmt/format.h>

#include <cstdio>
#include <string>

#include "bench/Measurement.h"
#include "bench/RoadInstance.h"

namespace telvane::bench {
namespace {

constexpr int kClientType = 5;

void addTimes(FigureTable& figures, const Dictionary& times) {
  for (const char* share : {"p50", "p95", "p99"}) {
    const std::string name(share);
    const auto time = [&times, &name](const std::string& of) {
      return Samples({times[std::string_view(of + name)].realValue()});
    };
    figures.add({"real-time event: call to arrival, " + name, time("road"), " us", 0});
    figures.add({"bare post: call to arrival, " + name, time("bare"), " us", 0});
    figures.add({"bare post: call to its answer, " + name, time("answered"), " us", 0});
  }
}

// Both from call to arrival.
void addRatio(FigureTable& figures, const Dictionary& times, const std::string& share, std::optional<Goal> goal) {
  const double bare = times[std::string_view("bare" + share)].realValue();
  const double road = times[std::string_view("road" + share)].realValue();
  figures.add({"real-time event: ratio to bare post, " + share, Samples({road / bare}), "", 2, goal});
}

}  // namespace

void measureRealTimeEvents(const RoadOptions& options, Report& report) {
  std::fprintf(stderr, "real-time events\n");
  RoadInstance instance;
  const auto server = instance.serverCertificate();
  RoadInstance::Running client = instance.start(
      "telvane-road-realtime",
      {"--posts", std::to_string(options.posts), "--client-type", std::to_string(kClientType), "--certificate",
       server.certificateFile, "--private-key", server.privateKeyFile, "--ca", instance.authorityFile()});
  // It serves the bag's URL itself, so it has to be there first.
  instance.givenBag(kClientType, BagRules::FiltersAndWhitelist, instance.firstLine(client));
  instance.startDaemon("error");
  const double before = cpuMicrosecondsOf(instance.daemonPID());
  const Dictionary times = instance.finish(client);
  const double daemon = (cpuMicrosecondsOf(instance.daemonPID()) - before) / times["sent"].realValue();
  instance.endDaemon();
  addTimes(report.figures, times);
  addRatio(report.figures, times, "p50", Goal{Goal::Kind::AtMost, 2.5});
  addRatio(report.figures, times, "p95", std::nullopt);
  addRatio(report.figures, times, "p99", Goal{Goal::Kind::AtMost, 3});
  report.figures.add({"real-time event: daemon's CPU", Samples({daemon}), " us", 0});
  report.figures.add({"real-time events: connections to the collector, bare post's included",
                      Samples({times["connections"].realValue()}), "", 0, Goal{Goal::Kind::AtMost, 2}});
  report.figures.addNote(fmt::format(
      "Real-time: {} events, each beside a bare post of the same request; arrived is when the collector has read it.",
      options.posts));
  report.sentEvents += times["sent"].unsignedValue();
  report.arrivedEvents += times["arrived"].unsignedValue();
}

}  // namespace telvane::bench
