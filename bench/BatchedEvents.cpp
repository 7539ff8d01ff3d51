#include "bench/BatchedEvents.h"

#include <fmt/format.h>

#include <cstdio>
#include <string>

#include "bench/InstructionCounter.h"
#include "bench/Measurement.h"
#include "bench/RoadInstance.h"

namespace telvane::bench {
namespace {

constexpr int kPlainClient = 7;
constexpr int kFilteredClient = 5;
constexpr int kDigestClient = 6;
// A session says of itself that it starts and that it stops.
constexpr uint64_t kEventsOfSession = 2;

// What one run cost. Microseconds and instructions are per event.
struct Run {
  double eventsPerSecond = 0;
  double microseconds = 0;  // of CPU, in the daemon or in the ceiling
  double clientMicroseconds = 0;
  double bytes = 0;
  double peakMegabytes = 0;
  double instructions = 0;
};

// The same run of all rounds.
struct Series {
  Samples eventsPerSecond;
  Samples microseconds;
  Samples clientMicroseconds;
  Samples bytes;
  Samples peakMegabytes;
  Samples instructions;

  void add(const Run& run) {
    eventsPerSecond.add(run.eventsPerSecond);
    microseconds.add(run.microseconds);
    clientMicroseconds.add(run.clientMicroseconds);
    bytes.add(run.bytes);
    peakMegabytes.add(run.peakMegabytes);
    instructions.add(run.instructions);
  }
};

class Measuring {
 public:
  explicit Measuring(uint64_t events) : _events(events) {
    _instance.givenBag(kPlainClient, BagRules::None);
    _instance.givenBag(kFilteredClient, BagRules::FiltersAndWhitelist);
    _instance.givenBag(kDigestClient, BagRules::FiltersWithDigest);
  }

  Run runCeiling();
  Run runRoad(int clientType, std::string_view logLevel);
  const RoadInstance& instance() const { return _instance; }
  // Why instructions are not counted; empty when they are.
  const std::string& refusal() const { return _refusal; }

 private:
  double perEvent(double total) const { return total / static_cast<double>(_events); }

  const uint64_t _events;
  RoadInstance _instance;
  std::string _refusal;
};

Run Measuring::runCeiling() {
  const Dictionary figures =
      _instance.run("telvane-ceiling", {"--events", std::to_string(_events), "--url", _instance.collectorURL("/events"),
                                        "--ca", _instance.authorityFile()});
  _instance.waitForEvents(_events);
  Run run;
  run.eventsPerSecond = static_cast<double>(_events) / figures["seconds"].realValue();
  run.microseconds = perEvent(figures["cpuMicroseconds"].realValue());
  run.bytes = perEvent(figures["bytes"].realValue());
  run.instructions = perEvent(figures["instructions"].realValue());
  return run;
}

Run Measuring::runRoad(int clientType, std::string_view logLevel) {
  _instance.startDaemon(logLevel);
  const uint64_t bytesBefore = _instance.collectedBytes();
  const double before = cpuMicrosecondsOf(_instance.daemonPID());
  const InstructionCounter instructions(_instance.daemonPID());
  const Dictionary client = _instance.run(
      "telvane-road-client", {"--events", std::to_string(_events), "--client-type", std::to_string(clientType)});
  _instance.waitForEvents(_events + kEventsOfSession);
  Run run;
  run.eventsPerSecond = static_cast<double>(_events) / client["seconds"].realValue();
  run.microseconds = perEvent(cpuMicrosecondsOf(_instance.daemonPID()) - before);
  run.clientMicroseconds = perEvent(client["cpuMicroseconds"].realValue());
  run.bytes = perEvent(static_cast<double>(_instance.collectedBytes() - bytesBefore));
  run.peakMegabytes = static_cast<double>(peakMemoryOf(_instance.daemonPID())) / 1e6;
  run.instructions = perEvent(static_cast<double>(instructions.count().value_or(0)));
  _refusal = instructions.refusal();
  _instance.endDaemon();
  return run;
}

struct Rounds {
  Series ceiling;
  Series plain;
  Series filtered;
  Series logging;
  Series digest;
  Samples plainRatio;        // to the ceiling
  Samples filteredRatio;     // to the ceiling
  Samples loggingRatio;      // to the same with the log at "error"
  Samples digestRatio;       // to the ceiling
  Samples instructionRatio;  // of the filtered run, to the ceiling

  void addRound(Measuring& measuring);
};

void Rounds::addRound(Measuring& measuring) {
  const Run least = measuring.runCeiling();
  const Run plainRun = measuring.runRoad(kPlainClient, "error");
  const Run filteredRun = measuring.runRoad(kFilteredClient, "error");
  const Run loggingRun = measuring.runRoad(kFilteredClient, "default");
  const Run digestRun = measuring.runRoad(kDigestClient, "error");
  ceiling.add(least);
  plain.add(plainRun);
  filtered.add(filteredRun);
  logging.add(loggingRun);
  digest.add(digestRun);
  plainRatio.add(plainRun.microseconds / least.microseconds);
  filteredRatio.add(filteredRun.microseconds / least.microseconds);
  loggingRatio.add(loggingRun.microseconds / filteredRun.microseconds);
  digestRatio.add(digestRun.microseconds / least.microseconds);
  if (least.instructions > 0) instructionRatio.add(filteredRun.instructions / least.instructions);
}

void addSeries(FigureTable& figures, const std::string& name, const Series& series, std::optional<Goal> rate) {
  figures.add({name + ": CPU per event", series.microseconds, " us"});
  figures.add({name + ": events per second", series.eventsPerSecond, "", 0, rate});
  figures.add({name + ": bytes per event", series.bytes, "", 1});
}

void addInstructions(FigureTable& figures, const Rounds& rounds, const std::string& refusal) {
  if (!refusal.empty()) return figures.addNote("Instructions per event were not counted: " + refusal + ".");
  figures.add({"ceiling: instructions per event", rounds.ceiling.instructions, "", 0});
  figures.add({"daemon, filters and white list: instructions per event", rounds.filtered.instructions, "", 0});
  figures.add({"daemon, filters and white list: instructions, ratio to ceiling", rounds.instructionRatio});
}

void addRounds(FigureTable& figures, const Rounds& rounds) {
  const Goal rate{Goal::Kind::AtLeast, 130000};
  addSeries(figures, "ceiling", rounds.ceiling, {});
  addSeries(figures, "daemon, no rules", rounds.plain, rate);
  figures.add({"daemon, no rules: CPU ratio to ceiling", rounds.plainRatio, "", 2, Goal{Goal::Kind::AtMost, 1.36}});
  figures.add({"daemon, no rules: peak memory", rounds.plain.peakMegabytes, " MB", 1, Goal{Goal::Kind::AtMost, 20}});
  figures.add({"client: CPU per event", rounds.plain.clientMicroseconds, " us"});
  addSeries(figures, "daemon, filters and white list", rounds.filtered, rate);
  figures.add({"daemon, filters and white list: CPU ratio to ceiling", rounds.filteredRatio, "", 2,
               Goal{Goal::Kind::AtMost, 1.6}});
  addSeries(figures, "daemon, the same, log at default", rounds.logging, {});
  figures.add({"log at default: CPU ratio to log at error", rounds.loggingRatio, "", 2, Goal{Goal::Kind::AtMost, 1.3}});
  addSeries(figures, "daemon, the same with a digest in every event", rounds.digest, {});
  figures.add({"daemon, the same with a digest in every event: CPU ratio to ceiling", rounds.digestRatio});
}

}  // namespace

void measureBatchedEvents(const RoadOptions& options, Report& report) {
  Measuring measuring(options.events);
  Rounds rounds;
  for (uint64_t round = 1; round <= options.rounds; ++round) {
    std::fprintf(stderr, "batched events, round %llu of %llu\n", static_cast<unsigned long long>(round),
                 static_cast<unsigned long long>(options.rounds));
    rounds.addRound(measuring);
  }
  addRounds(report.figures, rounds);
  addInstructions(report.figures, rounds, measuring.refusal());
  report.figures.addNote(fmt::format(
      "Batched: {} events of 10 fields per run, {} rounds of runs in turn; ratios are taken within a round.",
      options.events, options.rounds));
  report.sentEvents += measuring.instance().expectedEvents();
  report.arrivedEvents += measuring.instance().arrivedEvents();
}

}  // namespace telvane::bench
