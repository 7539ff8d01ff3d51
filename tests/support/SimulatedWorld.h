#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/ScriptedNetwork.h"
#include "tests/support/SimulatedClock.h"
#include "tests/support/SimulatedDatagramNetwork.h"
#include "tests/support/SimulatedPlatform.h"
#include "tests/support/SimulatedScheduler.h"
#include "tests/support/SimulatedServiceHub.h"

namespace telvane::testing {

// A machine with its processes and a network, in one thread under a virtual clock. The same seed gives the same run, to
// the byte of the log.
//
//   SimulatedWorld world(seed);
//   SimulatedPlatform& daemon = world.makeProcess("telvaned");
//   SimulatedPlatform& client = world.makeProcess("client", {.entitlements = {"com.example.right"}});
//   world.network().answer("https://collector.example/", NetworkAnswer::ok());
//   Daemon program(daemon.platform());
//   world.runUntilIdle();                      // time stands still
//   world.advance(std::chrono::minutes(15));
//   world.end();                               // before the objects that the processes' jobs refer to
class SimulatedWorld {
 public:
  explicit SimulatedWorld(uint64_t seed = 1);
  ~SimulatedWorld();
  SimulatedWorld(const SimulatedWorld&) = delete;
  SimulatedWorld& operator=(const SimulatedWorld&) = delete;

  // Makes a process, which lives until the world ends or kills it, and whose parts can be looked at afterwards too.
  SimulatedPlatform& makeProcess(std::string name, SimulatedProcessOptions options = {});
  // Makes a process of the same name, entitlements and storage, as after a crash. REQUIRES: !process.isAlive().
  SimulatedPlatform& restart(const SimulatedPlatform& process);
  // Ends all processes. To be called before objects go that jobs of the processes refer to. Idempotent.
  void end();

  // Verbs of the test, as the scheduler's.
  void runUntilIdle() { _scheduler.runUntilIdle(); }
  void advance(SimulatedScheduler::Duration duration) { _scheduler.advance(duration); }
  ::testing::AssertionResult runUntil(const std::function<bool()>& condition,
                                      SimulatedScheduler::Duration within = std::chrono::minutes(1)) {
    return _scheduler.runUntil(condition, within);
  }

  SimulatedScheduler& scheduler() noexcept { return _scheduler; }
  SimulatedClock& clock() noexcept { return _clock; }
  ScriptedNetwork& network() noexcept { return _network; }
  SimulatedServiceHub& services() noexcept { return _services; }
  SimulatedDatagramNetwork& datagrams() noexcept { return _datagrams; }
  // The log lines of all processes in the order in which they were written.
  const std::string& text() const noexcept { return _text; }

 private:
  SimulatedScheduler _scheduler;
  SimulatedClock _clock;
  ScriptedNetwork _network;
  SimulatedServiceHub _services;
  SimulatedDatagramNetwork _datagrams;
  std::string _text;
  int _lastProcessIdentifier = 100;
  std::vector<std::unique_ptr<SimulatedPlatform>> _processes;
};

}  // namespace telvane::testing
