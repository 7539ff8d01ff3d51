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
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using Lock = std::lock_guard<std::mutex>;

constexpr char kClientProgram[] = "telvane-scripted-client";
constexpr char kStatusProgram[] = "telvanectl";
constexpr Key kNumber{"soakNumber"};
constexpr int kCategory = 21;
constexpr int kBarredCategory = 22;
constexpr auto kRound = 8s;
constexpr auto kPause = 20ms;
constexpr auto kClientPatience = 120s;
constexpr int kReleaseTimeout = 2;
// What a daemon at rest may take more than at the end of the first round.
constexpr size_t kDescriptorSlack = 6;
constexpr int64_t kMemorySlack = 16 << 20;

constexpr const char* kExpectedErrors[] = {
    "exceeds number of allowed active connections for clientType",
    "could not load storebag '",
    "has been called more than once for session",
    // What a bag sets for all backends stands beside them in the section.
    "TelvaneBackend(newBackendWithName): release_timeout",
};

}  // namespace

Soak::Soak(SoakOptions options) : _options(options), _choice(options.seed), _serverChoice(~options.seed) {
  _server = std::make_unique<WireServer>(_instance.serverCertificate(),
                                         [this](const WireRequest& request) { return answer(request); });
  publishStorebags();
  _instance.givenStorebagServer(_server->url("/bags"));
  _instance.grant(kClientProgram);
  _instance.grant(kStatusProgram);
}

Soak::~Soak() = default;

void Soak::publishStorebags() {
  const Lock lock(_mutex);
  Dictionary bag = openBag(_server->url("/events"));
  Dictionary section = *bag[kEnvironmentRelease].dictionary();
  Dictionary profile = *section["splunk"].dictionary();
  Dictionary entry = *(*profile[kProfileClients].array())[0].dictionary();
  entry.set(kClientEntryEventBlacklist, Array{Value(kBarredCategory)});
  profile.set(kProfileClients, Array{Value(entry)});
  section.set("splunk", profile);
  bag.set(kEnvironmentRelease, section);
  bag.set(kStorebagReleaseTimeout, kReleaseTimeout);
  const std::string envelope = _instance.signedEnvelope(bag);
  for (const ClientType& type : allClientTypes()) _envelopes["/bags/" + std::string(type.storebagName)] = envelope;
}

WireServer::Answer Soak::answer(const WireRequest& request) {
  if (!request.isGet()) return answerPost(request);
  const std::string target = request.target();
  const Lock lock(_mutex);
  const auto envelope = _envelopes.find(target.substr(0, target.find('?')));
  return envelope != _envelopes.end() ? WireServer::answer(200, envelope->second) : WireServer::answer(404);
}

std::vector<int64_t> Soak::numbersIn(const WireRequest& request) {
  URLRequest post;
  post.headers.push_back({"Content-Encoding", request.header("Content-Encoding").value_or("")});
  post.body = Data::copyOf(request.body);
  const Value body = RecordingConnectivity::bodyValue(post);
  const Array* events = body.isDictionary() ? (*body.dictionary())[kBodyEvents].array() : nullptr;
  if (events == nullptr) fault("a post without events: " + request.head);
  std::vector<int64_t> numbers;
  for (const Value& event : events != nullptr ? *events : Array()) {
    const Dictionary* fields = event.dictionary();
    if (fields != nullptr && fields->contains(kNumber)) numbers.push_back((*fields)[kNumber].integerValue());
  }
  return numbers;
}

WireServer::Answer Soak::answerPost(const WireRequest& request) {
  WireServer::Answer result = WireServer::answer(200);
  SoakLedger::Answer fate = SoakLedger::Answer::Taken;
  std::chrono::milliseconds delay{};
  {
    const Lock lock(_mutex);
    const std::vector<int64_t> numbers = numbersIn(request);
    const uint64_t chance = _serverChoice.below(100);
    // A post without a number could not be accounted to the session that it disables.
    if (chance < 4 && !numbers.empty()) {
      fate = SoakLedger::Answer::ServerError;
      result = WireServer::answer(503);
    } else if (chance < 10) {
      fate = SoakLedger::Answer::ConnectionBroken;
      result = {"", WireServer::Then::Reset};
    } else if (chance < 20) {
      delay = std::chrono::milliseconds(_serverChoice.below(1500));
    }
    for (const int64_t number : numbers) _ledger.arrive(number, fate);
  }
  std::this_thread::sleep_for(delay);  // a slow server, not a waiting test
  return result;
}

std::vector<std::string> Soak::run() {
  const auto deadline = std::chrono::steady_clock::now() + _options.duration;
  _instance.launchDaemon({"--log-level", _options.logFile.empty() ? "error" : "info", "--idle-exit", "0"});
  if (!eventually([this] { return std::filesystem::exists(_instance.socketPath()); })) return {"no daemon"};
  do {
    runRound();
    waitForAll();
    checkAtRest();
    const Lock lock(_mutex);
    if (!_faults.empty()) break;
  } while (std::chrono::steady_clock::now() < deadline);
  stopDaemon();
  if (!_options.logFile.empty()) std::filesystem::copy_file(_instance.path("daemon.err"), _options.logFile);
  checkLog();
  const Lock lock(_mutex);
  std::cout << "clients: " << _clientsMade << ", killed: " << _killed << "; " << _ledger.summary() << std::endl;
  // A run in which little is delivered proves nothing, whatever the reasons are.
  constexpr size_t kDeliveredPerEvent = 4;
  if (_ledger.taken() * kDeliveredPerEvent < _ledger.events()) fault("less than a quarter of the events was delivered");
  return _faults;
}

void Soak::runRound() {
  const auto end = std::chrono::steady_clock::now() + kRound;
  while (std::chrono::steady_clock::now() < end) {
    const uint64_t chance = below(100);
    if (chance < 40 && _clients.size() < static_cast<size_t>(_options.clients)) startClient();
    if (chance >= 40 && chance < 45) killAClient();
    if (chance >= 45) letAClientGo();
    sweep();
    std::this_thread::sleep_for(kPause);  // the pace of the choices; nothing is waited for
  }
}

Dictionary Soak::newUserInfo() {
  static constexpr const char* kNames[] = {"player", "Player", "writer", "reader"};
  return {{kTelvaneUserInfoClientName, kNames[below(std::size(kNames))]},
          {kTelvaneUserInfoServiceName, inPercent(50) ? "movies" : "MOVIES"}};
}

void Soak::startClient() {
  Client client;
  client.name = fmt::format("client{}", ++_clientsMade);
  ClientScript script;
  const uint64_t sessions = 1 + below(6);
  {
    const Lock lock(_mutex);
    for (uint64_t i = 1; i <= sessions; ++i) addSession(script, client, i == sessions);
  }
  const std::string file = client.name + ".plist";
  _instance.givenFile(file, script.text());
  client.process = _instance.startProgram(kClientProgram, {_instance.path(file)}, client.name);
  _clients.push_back(std::move(client));
}

// All that a session sends stands before a flush that is answered, so that nothing is still on its way to the daemon
// when the client ends.
void Soak::addSession(ClientScript& script, Client& client, bool isLast) {
  constexpr int32_t kClientTypes = kLastClientType - kFirstClientType + 1;
  if (inPercent(20)) ++_hierarchies;
  const bool isCorrelated = inPercent(40);
  const std::string token = fmt::format("h{}", _hierarchies);
  const auto session =
      _ledger.openSession(isCorrelated ? token : fmt::format("{}.{}", client.name, client.sessions.size()));
  client.sessions.push_back(session);
  Dictionary info{{kTelvaneSessionInfoClientType, kFirstClientType + static_cast<int32_t>(below(kClientTypes))},
                  {kTelvaneSessionInfoSessionID, session},
                  {kTelvaneSessionInfoBatchEvent, inPercent(70)},
                  {kTelvaneSessionInfoRequireUserInfo, true}};
  if (isCorrelated) {
    info.set(kTelvaneSessionInfoHierarchyToken,
             Dictionary{{kTelvaneHierarchyTokenTokenID, token}, {kTelvaneHierarchyTokenLevel, below(4)}});
  }
  script.open(info, newUserInfo()).configure();
  for (uint64_t steps = 1 + below(4); steps > 0; --steps) {
    for (uint64_t events = 1 + below(30); events > 0; --events) {
      const bool isBarred = inPercent(10);
      const int64_t number =
          _ledger.sendEvent(session, isBarred ? SoakLedger::Road::Filtered : SoakLedger::Road::Posted);
      script.send(isBarred ? kBarredCategory : kCategory, 1, Dictionary{{kNumber, number}});
    }
    if (inPercent(30)) script.flush();
    if (inPercent(30)) script.fetchStates(newUserInfo());
    if (inPercent(30)) script.share({{Key("soakShared"), 1}});
  }
  script.flush();
  if (isLast || inPercent(20)) script.wait();
}

void Soak::killAClient() {
  if (_clients.empty()) return;
  const auto chosen = _clients.begin() + static_cast<ptrdiff_t>(below(_clients.size()));
  chosen->process->signal(SIGKILL);
  ++_killed;
  settle(*chosen, true);
  _clients.erase(chosen);
}

void Soak::letAClientGo() {
  if (_clients.empty()) return;
  _clients[below(_clients.size())].process->closeInput();
}

void Soak::settle(Client& client, bool isKilled) {
  const int exitStatus = client.process->wait(kClientPatience);
  std::istringstream said(_instance.read(client.name + ".out"));
  const Lock lock(_mutex);
  if (!isKilled && exitStatus != 0) {
    fault(fmt::format("{} ended with {}: {}", client.name, exitStatus, _instance.read(client.name + ".err")));
  }
  size_t session = 0;
  for (std::string line; std::getline(said, line);) {
    if (!line.starts_with("configured: ")) continue;
    if (line != "configured: [splunk]" && session < client.sessions.size()) {
      _ledger.excuseFamily(client.sessions[session], SoakLedger::Reason::Unconfigured);
    }
    ++session;
  }
  if (isKilled) {
    for (const auto killed : client.sessions) _ledger.excuse(killed, SoakLedger::Reason::Killed);
  } else if (session != client.sessions.size()) {
    fault(fmt::format("{} configured {} of {} sessions", client.name, session, client.sessions.size()));
  }
  for (const char* ending : {".out", ".err", ".plist"}) std::filesystem::remove(_instance.path(client.name + ending));
}

void Soak::sweep() {
  std::erase_if(_clients, [this](Client& client) {
    if (client.process->isRunning()) return false;
    settle(client, false);
    return true;
  });
}

void Soak::waitForAll() {
  for (Client& client : _clients) client.process->closeInput();
  for (Client& client : _clients) settle(client, false);
  _clients.clear();
}

Dictionary Soak::status() {
  const std::string name = "status";
  std::filesystem::remove(_instance.path(name + ".out"));
  _instance.startProgram(kStatusProgram, {"status", "--json"}, name)->wait();
  const auto parsed = json::parse(_instance.read(name + ".out"));
  return parsed.has_value() && parsed->isDictionary() ? *parsed->dictionary() : Dictionary();
}

void Soak::checkAtRest() {
  ++_rounds;
  Dictionary last;
  const bool isAtRest = eventually([this, &last] {
    last = status();
    const auto is = [&last](const Key& key, int64_t number) {
      return last.contains(key) && last[key].integerValue() == number;
    };
    const Dictionary* clientTypes = last[kStatusClientTypes].dictionary();
    // The one that asks is a session, too, and holds a transaction.
    return is(kStatusSessions, 1) && is(kStatusTransactions, 1) && is(kStatusConnectivityHelpers, 0) &&
           is(kStatusHierarchies, 0) && is(kStatusSharedData, 0) && clientTypes != nullptr && clientTypes->empty();
  });
  const Footprint now = footprint(last);
  const Lock lock(_mutex);
  if (!isAtRest) fault("left over after everybody has gone: " + description(Value(last)));
  for (std::string& line : _ledger.faults(SoakLedger::Missing::IsFault)) fault(std::move(line));
  checkFootprint(now);
  std::cout << "round " << _rounds << ": " << now.memoryBytes / 1024 << " KiB, " << now.descriptors << " descriptors; "
            << _ledger.summary() << std::endl;
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

void Soak::checkFootprint(const Footprint& now) {
  if (_rounds == 1) {
    _first = now;
    return;
  }
  if (now.descriptors > _first.descriptors + kDescriptorSlack) {
    fault(fmt::format("{} descriptors, {} after the first round", now.descriptors, _first.descriptors));
  }
  if (now.memoryBytes > _first.memoryBytes + kMemorySlack) {
    fault(fmt::format("{} bytes of memory, {} after the first round", now.memoryBytes, _first.memoryBytes));
  }
}

void Soak::stopDaemon() {
  _instance.daemon().signal(SIGTERM);
  const int exitStatus = _instance.daemon().wait();
  const Lock lock(_mutex);
  if (exitStatus != 0) fault(fmt::format("the daemon ended with {}", exitStatus));
}

void Soak::checkLog() {
  std::istringstream lines(_instance.daemonLog());
  const Lock lock(_mutex);
  for (std::string line; std::getline(lines, line);) {
    const bool isExpected = std::any_of(std::begin(kExpectedErrors), std::end(kExpectedErrors),
                                        [&line](auto part) { return line.find(part) != std::string::npos; });
    if (!isExpected && line.find("<error>") != std::string::npos) fault("the daemon says " + line);
  }
}

}  // namespace telvane::testing
