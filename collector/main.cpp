#include <iostream>

#include "collector/Collector.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/system/Environment.h"
#include "platform/system/FileSizeSignal.h"
#include "platform/system/PosixFileSystem.h"
#include "platform/system/TerminationSignals.h"

namespace {

// So that the same chance can be had again.
void sayLoss(const telvane::CollectorOptions& options) {
  if (options.dashboardLossPercent == 0) return;
  std::cout << "dropping " << options.dashboardLossPercent << " of 100 datagrams and acknowledgements; again with "
            << "--dashboard-seed " << options.dashboardLossSeed << std::endl;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace telvane;
  takeFileSizeLimitAsError();
  TerminationSignals signals;
  const auto parsed = parseCollectorOptions(argc, argv);
  if (const int* status = std::get_if<int>(&parsed)) return *status;
  PosixFileSystem files(Paths{});
  ThreadedDispatch dispatch;
  // One write for each line, since the collector's threads say them.
  const auto collector = Collector::start(std::get<CollectorOptions>(parsed), files, [](const std::string& line) {
    std::cout << line + "\n" << std::flush;
  });
  if (collector.has_error()) {
    std::cerr << "telvane-collector: " << collector.error().description() << "\n";
    return 1;
  }
  std::cout << (*collector)->address() << std::endl;
  if (const DashboardReceiver* dashboard = (*collector)->dashboard()) {
    std::cout << description(dashboard->address()) << std::endl;
    sayLoss(std::get<CollectorOptions>(parsed));
  }
  const auto ended = dispatch.newSemaphore(0);
  const auto started =
      signals.start(dispatch.newSerialQueue("signals", QualityOfService::Default), [ended](int) { ended->signal(); });
  if (started.has_error()) {
    std::cerr << "telvane-collector: " << started.error().description() << "\n";
    return 1;
  }
  ended->wait();
  return 0;
}
