// The whole road of an event, from a client's call to the collector, beside the least that it can cost. Prints a table
// that can be copied into a note, the goals beside the figures. Fails when an event is lost or comes twice; a goal that
// is missed is said in the table only, since a busy host can miss any.
#include <curl/curl.h>
#include <fmt/format.h>

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <thread>

#include "bench/BatchedEvents.h"
#include "bench/ManySessions.h"
#include "bench/MemoryOverTime.h"
#include "bench/RealTimeEvents.h"
#include "bench/RoadOptions.h"

namespace {

using namespace telvane::bench;

void describe(FigureTable& figures) {
  figures.addNote(
      fmt::format("Measured on {} cores. Times are CPU time of the whole process unless they are from call to arrival.",
                  std::thread::hardware_concurrency()));
#ifndef NDEBUG
  figures.addNote("Built for development: these figures say nothing about speed.");
#endif
}

void measure(const RoadOptions& options) {
  Report report;
  if (options.includes("batched")) measureBatchedEvents(options, report);
  if (options.includes("realtime")) measureRealTimeEvents(options, report);
  if (options.includes("sessions")) measureManySessions(options, report);
  if (options.includes("memory")) measureMemoryOverTime(options, report);
  report.figures.add("events of all runs, each counted where it arrived",
                     fmt::format("{} of {}", report.arrivedEvents, report.sentEvents), "all, once",
                     report.arrivedEvents == report.sentEvents);
  describe(report.figures);
  std::fputs(report.figures.text().c_str(), stdout);
}

}  // namespace

int main(int argc, char** argv) {
  const auto parsed = parseRoadOptions(argc, argv);
  if (const int* status = std::get_if<int>(&parsed)) return *status;
  curl_global_init(CURL_GLOBAL_DEFAULT);
  try {
    measure(std::get<RoadOptions>(parsed));
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "telvane-bench-road: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
