#include "tests/support/SimulatedWorld.h"

#include <utility>

namespace telvane::testing {

SimulatedWorld::SimulatedWorld(uint64_t seed)
    : _scheduler(seed), _clock(_scheduler), _network(_scheduler), _services(_scheduler), _datagrams(_scheduler) {}

SimulatedWorld::~SimulatedWorld() { end(); }

SimulatedPlatform& SimulatedWorld::makeProcess(std::string name, SimulatedProcessOptions options) {
  SimulatedPlatform::Surroundings surroundings{
      _scheduler, _clock,     _network,
      _services,  _datagrams, [this](const LogLine& line) { _text += line.text() + "\n"; }};
  const int processIdentifier = ++_lastProcessIdentifier;
  // Chance of one process does not depend on how much another one took.
  const uint64_t seed = SeededGenerator(_scheduler.seed() + static_cast<uint64_t>(processIdentifier)).next();
  _processes.push_back(std::make_unique<SimulatedPlatform>(std::move(surroundings), std::move(name), processIdentifier,
                                                           seed, std::move(options)));
  return *_processes.back();
}

SimulatedPlatform& SimulatedWorld::restart(const SimulatedPlatform& process) {
  if (process.isAlive()) throw SimulationFailure(process.name() + " is still alive");
  return makeProcess(process.name(), {.entitlements = process.entitlements(), .storage = process.storage()});
}

void SimulatedWorld::end() {
  for (const auto& process : _processes) process->kill();
}

}  // namespace telvane::testing
