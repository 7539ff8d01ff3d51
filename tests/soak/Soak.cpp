#include "tests/soak/Soak.h"

#include <fmt/format.h>
#include <signal.h>

#include <algorithm>
#include <filesystem>
#include <iostream>
#include <sstream>
#include <thread>

#include "foundation/Description.h"
#include "interfaces/AgentKeys.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tests/soak/MemoryTrend.h"
#include "tests/soak/SoakKeys.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using Lock = std::lock_guard<std::mutex>;

constexpr char kStatusProgram[] = "telvanectl";
constexpr auto kRound = 8s;
constexpr auto kPause = 20ms;
constexpr int kReleaseTimeout = 2;
// The collector is away in every third round, so that in the others nothing can be lost to that.
constexpr size_t kRoundsPerAbsence = 3;
constexpr size_t kMostAbsences = 2;
constexpr uint64_t kMostMillisecondsAway = 1500;
// What a daemon at rest may take more than at the end of the first round.
constexpr size_t kDescriptorSlack = 6;
constexpr int64_t kMemorySlack = 32 << 20;
// What it may take more on average in the last third of the rounds than in the middle third. About 1.4 MiB are in use
// at rest; the rest is kept by the allocator's arenas, one for each thread, each as large as its worst moment so far.
constexpr int64_t kMemoryMargin = 4 << 20;

// A sanitizer keeps freed memory and writes down every access, so that the figure says nothing of the daemon.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kIsMemoryTelling = false;
#else
constexpr bool kIsMemoryTelling = true;
#endif

constexpr const char* kCutOff = "exceeds number of allowed active connections for clientType";
constexpr const char* kExpectedErrors[] = {
    kCutOff,
    // One that was cut off goes on asking: its next call opens a session that has been told nothing.
    "missing clientType in its sessionInfo (null). Session terminated...",
    // None is there before the first one has come.
    "loadStorebagFromDisk: could not load storebag '",
    "has been called more than once for session",
    // What a bag sets for all backends stands beside them in the section.
    "TelvaneBackend(newBackendWithName): release_timeout",
    // Wrong one-shot messages.
    "sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo",
    "sendOneMessageWithSessionInfo: userInfo must be present and valid!!! Aborting method...",
};

}  // namespace

Soak::Soak(SoakOptions options)
    : _options(options),
      _choice(options.seed),
      _collector(_instance.serverCertificate(), ~options.seed, _ledger, _mutex),
      _clients(_instance, _ledger, _mutex, _choice) {
  publishStorebags();
  _storebagServer = std::make_unique<WireServer>(
      _instance.serverCertificate(), [this](const WireRequest& request) { return answerStorebag(request); });
  _instance.givenStorebagServer(_storebagServer->url("/bags"));
  _instance.grant(kStatusProgram);
}

Soak::~Soak() = default;

void Soak::publishStorebags() {
  Dictionary bag = openBag(_collector.url());
  Dictionary section = *bag[kEnvironmentRelease].dictionary();
  Dictionary profile = *section["splunk"].dictionary();
  Dictionary entry = *(*profile[kProfileClients].array())[0].dictionary();
  entry.set(kClientEntryEventBlacklist, Array{Value(kSoakBarredCategory)});
  profile.set(kProfileClients, Array{Value(entry)});
  section.set("splunk", profile);
  bag.set(kEnvironmentRelease, section);
  bag.set(kStorebagReleaseTimeout, kReleaseTimeout);
  const std::string envelope = _instance.signedEnvelope(bag);
  for (const ClientType& type : allClientTypes()) _envelopes["/bags/" + std::string(type.storebagName)] = envelope;
}

WireServer::Answer Soak::answerStorebag(const WireRequest& request) {
  const std::string target = request.target();
  const auto envelope = _envelopes.find(target.substr(0, target.find('?')));
  return envelope != _envelopes.end() ? WireServer::answer(200, envelope->second) : WireServer::answer(404);
}

std::vector<std::string> Soak::run() {
  const auto deadline = Clock::now() + _options.duration;
  _instance.launchDaemon({"--log-level", _options.logFile.empty() ? "error" : "info", "--idle-exit", "0"});
  if (!eventually([this] { return std::filesystem::exists(_instance.socketPath()); })) return {"no daemon"};
  _footprints.push_back(footprint(status()));
  do {
    runRound();
    if (!_instance.daemon().isRunning()) {
      fault("the daemon is gone");  // what follows says how, and what it wrote at last
      break;
    }
    checkAtRest();
  } while (_faults.empty() && Clock::now() < deadline);
  if (_footprints.size() > 1) checkFootprint();
  stopDaemon();
  if (!_options.logFile.empty()) std::filesystem::copy_file(_instance.path("daemon.err"), _options.logFile);
  checkLog();
  printFigures();
  return _faults;
}

void Soak::runRound() {
  const auto start = Clock::now();
  ++_rounds;
  _firstOfRound = _ledger.sessions();
  _absencesLeft = _rounds % kRoundsPerAbsence == 2 ? 1 + _choice.below(kMostAbsences) : 0;
  while (Clock::now() < start + kRound) {
    if (!_instance.daemon().isRunning()) return;
    letCollectorGoAndCome();
    const uint64_t chance = _choice.below(100);
    if (chance < 40 && _clients.running() < static_cast<size_t>(_options.clients)) _clients.startOne();
    if (chance >= 40 && chance < 45) _clients.killOne();
    if (chance >= 45) _clients.letOneGo();
    _clients.sweep();
    std::this_thread::sleep_for(kPause);  // the pace of the choices; nothing is waited for
  }
  _return = {};
  letCollectorGoAndCome();
  _clients.waitForAll();
  _busy += Clock::now() - start;
}

void Soak::letCollectorGoAndCome() {
  if (_collector.isAway()) {
    if (Clock::now() < _return) return;
    excuseRound();
    _collector.comeBack();
  } else if (_absencesLeft > 0 && inPercent(1)) {
    --_absencesLeft;
    _collector.goAway();
    excuseRound();
    _return = Clock::now() + std::chrono::milliseconds(_choice.below(kMostMillisecondsAway));
  }
}

// Also those that have ended: what they sent one by one may still wait for a connection.
void Soak::excuseRound() {
  const Lock lock(_mutex);
  for (auto session = _firstOfRound; session < _ledger.sessions(); ++session) {
    _ledger.excuse(session, SoakLedger::Reason::CollectorAway);
  }
}

Dictionary Soak::status() {
  const std::string name = "status";
  for (const char* ending : {".out", ".err"}) std::filesystem::remove(_instance.path(name + ending));
  const int exitStatus = _instance.startProgram(kStatusProgram, {"status", "--json"}, name)->wait();
  const std::string errors = _instance.read(name + ".err");
  if (exitStatus != 0 || !errors.empty()) {
    fault(fmt::format("{} ended with {}: {}", kStatusProgram, exitStatus, errors));
  }
  const auto parsed = json::parse(_instance.read(name + ".out"));
  return parsed.has_value() && parsed->isDictionary() ? *parsed->dictionary() : Dictionary();
}

void Soak::checkAtRest() {
  Dictionary last;
  const bool isAtRest = eventually([this, &last] {
    if (!_faults.empty()) return true;
    last = status();
    const auto is = [&last](const Key& key, int64_t number) {
      return last.contains(key) && last[key].integerValue() == number;
    };
    const Dictionary* clientTypes = last[kStatusClientTypes].dictionary();
    // The one that asks is a session, too, and holds a transaction.
    return is(kStatusSessions, 1) && is(kStatusTransactions, 1) && is(kStatusConnectivityHelpers, 0) &&
           is(kStatusHierarchies, 0) && is(kStatusSharedData, 0) && clientTypes != nullptr && clientTypes->empty();
  });
  if (!isAtRest) fault("left over after everybody has gone: " + description(Value(last)));
  _footprints.push_back(footprint(last));
  checkLedger();
  const Lock lock(_mutex);
  std::cout << "round " << _rounds << ": " << _footprints.back().memoryBytes / 1024 << " KiB, "
            << _footprints.back().descriptors << " descriptors; " << _ledger.summary() << std::endl;
}

void Soak::checkLedger() {
  for (std::string& line : _clients.takeFaults()) fault(std::move(line));
  for (std::string& line : _collector.takeFaults()) fault(std::move(line));
  const Lock lock(_mutex);
  for (std::string& line : _ledger.faults(SoakLedger::Missing::IsFault)) fault(std::move(line));
  // A run in which little is delivered proves nothing, whatever the reasons are.
  constexpr size_t kDeliveredPerEvent = 4;
  if (_ledger.taken() * kDeliveredPerEvent < _ledger.events()) fault("less than a quarter of the events was delivered");
}

Soak::Footprint Soak::footprint(const Dictionary& status) {
  Footprint now;
  std::error_code error;
  const std::filesystem::directory_iterator all(fmt::format("/proc/{}/fd", _instance.daemon().pid()), error);
  for (const auto& each : all) {
    static_cast<void>(each);
    ++now.descriptors;
  }
  now.memoryBytes = status[kStatusMemoryBytes].integerValue();
  return now;
}

void Soak::checkFootprint() {
  const Footprint& first = _footprints[1];
  std::vector<int64_t> memory;
  for (size_t round = 1; round < _footprints.size(); ++round) {
    const Footprint& now = _footprints[round];
    memory.push_back(now.memoryBytes);
    if (now.descriptors > first.descriptors + kDescriptorSlack) {
      fault(
          fmt::format("{} descriptors after round {}, {} after the first", now.descriptors, round, first.descriptors));
    }
    if (kIsMemoryTelling && now.memoryBytes > first.memoryBytes + kMemorySlack) {
      fault(fmt::format("{} bytes of memory after round {}, {} after the first", now.memoryBytes, round,
                        first.memoryBytes));
    }
  }
  std::string growth = memoryGrowth(memory, kMemoryMargin);
  if (kIsMemoryTelling && !growth.empty()) fault(std::move(growth));
}

void Soak::stopDaemon() {
  _instance.daemon().signal(SIGTERM);
  const int exitStatus = _instance.daemon().wait();
  if (exitStatus != 0) fault(fmt::format("the daemon ended with {}", exitStatus));
}

// Whatever is no log line was written by somebody else: the C library, a sanitizer.
void Soak::checkLog() {
  constexpr size_t kMostStrange = 100;
  std::istringstream lines(_instance.daemonLog());
  std::string strange;
  size_t strangeLines = 0;
  for (std::string line; std::getline(lines, line);) {
    if (line.find(" telvaned[") == std::string::npos) {
      if (++strangeLines <= kMostStrange) strange += "\n" + line;
      continue;
    }
    const bool isExpected = std::any_of(std::begin(kExpectedErrors), std::end(kExpectedErrors),
                                        [&line](auto part) { return line.find(part) != std::string::npos; });
    if (!isExpected && line.find("<error>") != std::string::npos) fault("the daemon says " + line);
    if (line.find(kCutOff) != std::string::npos) ++_cutOffs;
  }
  constexpr size_t kEnoughToMeet = 300;
  if (_cutOffs == 0 && _ledger.sessions() >= kEnoughToMeet) fault("no session was one too many of its client type");
  if (strangeLines > 0) fault(fmt::format("the daemon wrote {} lines that are no log:{}", strangeLines, strange));
}

void Soak::printFigures() {
  const Lock lock(_mutex);
  const auto kib = [](const Footprint& footprint) { return footprint.memoryBytes / 1024; };
  std::string memory;
  std::string descriptors;
  for (const Footprint& each : _footprints) {
    memory += fmt::format(" {}", kib(each));
    descriptors += fmt::format(" {}", each.descriptors);
  }
  std::string accounts;
  for (const auto& [what, count] : _ledger.accounts()) accounts += fmt::format("\n  {:>9} {}", count, what);
  const double seconds = std::max(_busy.count(), 1e-3);
  std::cout << fmt::format(
                   "rounds: {}; with the collector away: {} times\n"
                   "client processes: {} started, {} of them killed\n"
                   "sessions: {} opened and closed in {:.0f} s of rounds, {:.1f} per second; {} of them one-shot "
                   "messages; {} cut off; {} moves between hierarchies\n"
                   "events: {}{}\n"
                   "memory in KiB, before the first round and at rest after each:{}\n"
                   "descriptors, likewise:{}",
                   _rounds, _collector.absences(), _clients.started(), _clients.killed(), _ledger.sessions(), seconds,
                   static_cast<double>(_ledger.sessions()) / seconds, _clients.oneShots(), _cutOffs, _clients.moves(),
                   _ledger.events(), accounts, memory, descriptors)
            << std::endl;
}

}  // namespace telvane::testing
