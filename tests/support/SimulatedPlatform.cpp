#include "tests/support/SimulatedPlatform.h"

#include <utility>

namespace telvane::testing {

namespace {

FixedDeviceAnswers usualDevice() {
  return {{"UniqueDeviceID", "00112233445566778899aabbccddeeff00112233"},
          {"ProductVersion", "12.5"},
          {"BuildVersion", "6.1.0-13"},
          {"HWModelStr", "SimulatedBoard"},
          {"SerialNumber", "SIM0001"},
          {"ProductType", "Simulated1,1"},
          {"DeviceName", "simulated"}};
}

}  // namespace

SimulatedPlatform::SimulatedPlatform(Surroundings surroundings, std::string name, int processIdentifier, uint64_t seed,
                                     SimulatedProcessOptions options)
    : _surroundings(std::move(surroundings)),
      _storage(options.storage ? options.storage : std::make_shared<SimulatedStorage>(_surroundings.clock)),
      _dispatch(_surroundings.scheduler, name),
      _gate(options.flowLimit),
      _peer(std::make_shared<SimulatedPeer>(
          SimulatedPeer{name, processIdentifier, std::move(options.entitlements), &_dispatch, &_gate})),
      _log(&_surroundings.clock, name, options.leastImportant, _surroundings.logObserver),
      _random(seed),
      _faultyFiles(_storage->files),
      _submittableLogs(_faultyFiles),
      _datagramSockets(_surroundings.datagrams, _dispatch),
      _sandboxExtensions(_faultyFiles),
      _deviceAnswers(usualDevice()),
      _urlSessions(_surroundings.network.newProvider(name, _dispatch.process(), _faultyFiles, &_gate)),
      _localService(_surroundings.services.newService(_peer)),
      _platform{_surroundings.clock,
                _random,
                _dispatch,
                _log,
                _faultyFiles,
                _storage->userDefaults,
                _deviceAnswers,
                _locale,
                _consent,
                _clientBundle,
                *_urlSessions,
                _transactions,
                *_localService,
                _submittableLogs,
                _processMemory,
                _datagramSockets,
                _sandboxExtensions,
                _wirelessDiagnostics,
                _powerLog} {}

SimulatedPlatform::~SimulatedPlatform() { kill(); }

void SimulatedPlatform::kill() {
  if (!std::exchange(_peer->isAlive, false)) return;
  _surroundings.services.cutLines(_peer);
  _dispatch.end();
  _surroundings.network.endProcess(_dispatch.process());
  _surroundings.services.releaseEnds(_peer);
}

}  // namespace telvane::testing
