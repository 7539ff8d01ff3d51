#pragma once

#include <functional>
#include <memory>
#include <set>
#include <string>

#include "platform/FlowGate.h"
#include "platform/Platform.h"
#include "tests/support/CountingTransactions.h"
#include "tests/support/FaultyFileSystem.h"
#include "tests/support/FixedClientBundle.h"
#include "tests/support/FixedConsent.h"
#include "tests/support/FixedDeviceAnswers.h"
#include "tests/support/FixedLocale.h"
#include "tests/support/FixedProcessMemory.h"
#include "tests/support/MemoryExtensions.h"
#include "tests/support/MemoryFileSystem.h"
#include "tests/support/MemorySubmittableLogs.h"
#include "tests/support/MemoryUserDefaults.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/RecordingPowerLog.h"
#include "tests/support/ScriptedNetwork.h"
#include "tests/support/ScriptedWirelessDiagnostics.h"
#include "tests/support/SeededRandom.h"
#include "tests/support/SimulatedClock.h"
#include "tests/support/SimulatedDatagramNetwork.h"
#include "tests/support/SimulatedDatagramSockets.h"
#include "tests/support/SimulatedDispatch.h"
#include "tests/support/SimulatedServiceHub.h"

namespace telvane::testing {

// What outlives a process: its files and settings.
struct SimulatedStorage {
  explicit SimulatedStorage(const Clock& clock) : files(clock) {}
  MemoryFileSystem files;
  MemoryUserDefaults userDefaults;
};

struct SimulatedProcessOptions {
  std::set<std::string> entitlements;
  // Shared with another process of the same user; a new one of its own when null.
  std::shared_ptr<SimulatedStorage> storage;
  LogLevel leastImportant = LogLevel::Info;
  uint64_t flowLimit = FlowGate::kDefaultLimit;
};

// One process of a SimulatedWorld, as the Platform that its code is given. Made and kept by the world. The parts are
// there for the test to set and to look at.
class SimulatedPlatform {
 public:
  // The world's parts, which outlive every process.
  struct Surroundings {
    SimulatedScheduler& scheduler;
    SimulatedClock& clock;
    ScriptedNetwork& network;
    SimulatedServiceHub& services;
    SimulatedDatagramNetwork& datagrams;
    RecordingLog::Observer logObserver;
  };

  SimulatedPlatform(Surroundings surroundings, std::string name, int processIdentifier, uint64_t seed,
                    SimulatedProcessOptions options);
  ~SimulatedPlatform();
  SimulatedPlatform(const SimulatedPlatform&) = delete;
  SimulatedPlatform& operator=(const SimulatedPlatform&) = delete;

  Platform& platform() noexcept { return _platform; }
  const std::string& name() const noexcept { return _peer->name; }
  int processIdentifier() const noexcept { return _peer->processIdentifier; }
  bool isAlive() const noexcept { return _peer->isAlive; }

  RecordingLog& log() noexcept { return _log; }
  SimulatedDispatch& dispatch() noexcept { return _dispatch; }
  MemoryFileSystem& files() noexcept { return _storage->files; }
  // Stands between the process and its files.
  FaultyFileSystem& fileFaults() noexcept { return _faultyFiles; }
  MemoryUserDefaults& userDefaults() noexcept { return _storage->userDefaults; }
  std::shared_ptr<SimulatedStorage> storage() const noexcept { return _storage; }
  MemorySubmittableLogs& submittableLogs() noexcept { return _submittableLogs; }
  FixedProcessMemory& processMemory() noexcept { return _processMemory; }
  SimulatedDatagramSockets& datagramSockets() noexcept { return _datagramSockets; }
  MemoryExtensions& sandboxExtensions() noexcept { return _sandboxExtensions; }
  ScriptedWirelessDiagnostics& wirelessDiagnostics() noexcept { return _wirelessDiagnostics; }
  RecordingPowerLog& powerLog() noexcept { return _powerLog; }
  FixedDeviceAnswers& deviceAnswers() noexcept { return _deviceAnswers; }
  FixedLocale& locale() noexcept { return _locale; }
  FixedConsent& consent() noexcept { return _consent; }
  FixedClientBundle& clientBundle() noexcept { return _clientBundle; }
  CountingTransactions& transactions() noexcept { return _transactions; }
  FlowGate& flowGate() noexcept { return _gate; }
  // What it is granted; asked by its peers each time anew.
  void grant(const std::string& entitlement) { _peer->entitlements.insert(entitlement); }
  const std::set<std::string>& entitlements() const noexcept { return _peer->entitlements; }

  // Runs the job as a thread of this process, on no queue.
  void spawn(std::string label, Job job) { _dispatch.spawn(std::move(label), std::move(job)); }
  // Ends the process at once, like a kill: nothing of it runs again, what it was about to send may be lost, its peers
  // are interrupted. Objects that the test made for it are the test's to destroy, afterwards. Idempotent.
  void kill();

 private:
  const Surroundings _surroundings;
  const std::shared_ptr<SimulatedStorage> _storage;
  SimulatedDispatch _dispatch;
  FlowGate _gate;
  const std::shared_ptr<SimulatedPeer> _peer;
  RecordingLog _log;
  SeededRandom _random;
  FaultyFileSystem _faultyFiles;
  MemorySubmittableLogs _submittableLogs;
  FixedProcessMemory _processMemory;
  SimulatedDatagramSockets _datagramSockets;
  MemoryExtensions _sandboxExtensions;
  ScriptedWirelessDiagnostics _wirelessDiagnostics;
  RecordingPowerLog _powerLog;
  FixedDeviceAnswers _deviceAnswers;
  FixedLocale _locale;
  FixedConsent _consent;
  FixedClientBundle _clientBundle;
  CountingTransactions _transactions;
  const std::unique_ptr<URLSessionProvider> _urlSessions;
  const std::unique_ptr<ipc::Service> _localService;
  Platform _platform;
};

}  // namespace telvane::testing
