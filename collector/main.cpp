#include <iostream>

#include "collector/Collector.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "platform/system/Environment.h"
#include "platform/system/PosixFileSystem.h"
#include "platform/system/TerminationSignals.h"

int main(int argc, char** argv) {
  using namespace telvane;
  TerminationSignals signals;
  const auto parsed = parseCollectorOptions(argc, argv);
  if (const int* status = std::get_if<int>(&parsed)) return *status;
  PosixFileSystem files(Paths{});
  ThreadedDispatch dispatch;
  const auto collector = Collector::start(std::get<CollectorOptions>(parsed), files);
  if (collector.has_error()) {
    std::cerr << "telvane-collector: " << collector.error().description() << "\n";
    return 1;
  }
  std::cout << (*collector)->address() << std::endl;
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
