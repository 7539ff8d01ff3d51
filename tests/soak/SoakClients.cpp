#include "tests/soak/SoakClients.h"

#include <fmt/format.h>
#include <signal.h>

#include <filesystem>
#include <sstream>
#include <utility>

#include "interfaces/ClientTypes.h"
#include "interfaces/SessionKeys.h"
#include "tests/soak/SoakKeys.h"

namespace telvane::testing {
namespace {

using Lock = std::lock_guard<std::mutex>;

constexpr char kLibraryClient[] = "telvane-scripted-client";
constexpr char kWireClient[] = "telvane-soak-client";
constexpr auto kPatience = std::chrono::seconds(240);
// A session that is one too many is never told, and that is not to hold a round up. One that is told later is worth
// nothing, and takes its family along, but such are few.
constexpr auto kPatienceOfConfiguration = std::chrono::seconds(5);
constexpr uint64_t kMostEventsAtOnce = 30;
constexpr uint64_t kLevels = 4;
constexpr uint64_t kCrowdedTypes = 2;

constexpr std::string_view kFinished = "finished";
constexpr std::string_view kExceeded = "Exceeded maximum active reporting session limit for userInfo='";
constexpr std::string_view kNoIdentifiers = "Could not retrieve identifiers from sessionInfo";

}  // namespace

SoakClients::SoakClients(Instance& instance, SoakLedger& ledger, std::mutex& mutex, SeededGenerator& choice)
    : _instance(instance), _ledger(ledger), _mutex(mutex), _choice(choice) {
  _instance.grant(kLibraryClient);
  _instance.grant(kWireClient);
}

std::vector<std::string> SoakClients::takeFaults() { return std::exchange(_faults, {}); }

void SoakClients::startOne() {
  Client client;
  client.name = fmt::format("client{}", ++_started);
  const bool isByHand = inPercent(25);
  const std::string script = isByHand ? scriptByHand(client) : scriptOfSessions(client);
  const std::string file = client.name + ".plist";
  _instance.givenFile(file, script);
  client.process = _instance.startProgram(isByHand ? kWireClient : kLibraryClient, {_instance.path(file)}, client.name);
  _running.push_back(std::move(client));
}

Dictionary SoakClients::newSessionInfo(SoakLedger::Session session) {
  constexpr int32_t kClientTypes = kLastClientType - kFirstClientType + 1;
  // All are used, and some by so many that not all are let in.
  const uint64_t types = inPercent(30) ? kCrowdedTypes : kClientTypes;
  return {{kTelvaneSessionInfoClientType, kFirstClientType + static_cast<int32_t>(below(types))},
          {kTelvaneSessionInfoSessionID, session},
          {kTelvaneSessionInfoBatchEvent, inPercent(70)},
          {kTelvaneSessionInfoRequireUserInfo, true}};
}

Dictionary SoakClients::newUserInfo() {
  static constexpr const char* kNames[] = {"player", "Player", "writer", "reader"};
  return {{kTelvaneUserInfoClientName, kNames[below(std::size(kNames))]},
          {kTelvaneUserInfoServiceName, inPercent(50) ? "movies" : "MOVIES"}};
}

SoakClients::Event SoakClients::newEvent(SoakLedger::Session session) {
  const bool isBarred = inPercent(10);
  const int64_t number = _ledger.sendEvent(session, isBarred ? SoakLedger::Road::Filtered : SoakLedger::Road::Posted);
  return {isBarred ? kSoakBarredCategory : kSoakCategory, Dictionary{{kSoakNumber, number}}};
}

std::string SoakClients::scriptOfSessions(Client& client) {
  ClientScript script;
  const Lock lock(_mutex);
  const uint64_t sessions = 1 + below(6);
  for (uint64_t i = 1; i <= sessions; ++i) addSession(script, client, i == sessions);
  return script.text();
}

// All that a session sends stands before a flush that is answered, so that nothing is still on its way to the daemon
// when the client ends.
void SoakClients::addSession(ClientScript& script, Client& client, bool isLast) {
  if (inPercent(20)) ++_hierarchies;
  const bool isCorrelated = inPercent(40);
  const std::string token = fmt::format("h{}", _hierarchies);
  const auto session =
      _ledger.openSession(isCorrelated ? token : fmt::format("{}.{}", client.name, client.sessions.size()));
  client.sessions.push_back(session);
  Dictionary info = newSessionInfo(session);
  if (isCorrelated) {
    info.set(kTelvaneSessionInfoHierarchyToken,
             Dictionary{{kTelvaneHierarchyTokenTokenID, token}, {kTelvaneHierarchyTokenLevel, below(kLevels)}});
  }
  if (isCorrelated && inPercent(20)) {
    script.openAggregating(info, newUserInfo());
  } else {
    script.open(info, newUserInfo());
  }
  script.configure(kPatienceOfConfiguration);
  for (uint64_t steps = 1 + below(4); steps > 0; --steps) {
    for (uint64_t events = 1 + below(kMostEventsAtOnce); events > 0; --events) {
      Event event = newEvent(session);
      script.send(static_cast<uint16_t>(event.category), 1, std::move(event.payload));
    }
    if (inPercent(30)) script.flush();
    if (inPercent(30)) script.fetchStates(newUserInfo());
    if (inPercent(30)) script.share({{Key("soakShared"), 1}});
  }
  script.flush();
  if (isLast || inPercent(20)) script.wait();
}

std::string SoakClients::scriptByHand(Client& client) {
  WireScript script;
  const Lock lock(_mutex);
  for (uint64_t steps = 1 + below(6); steps > 0; --steps) {
    if (inPercent(50)) {
      addOneShot(script, client);
    } else {
      addMovingSession(script, client);
    }
  }
  script.wait();
  return script.text();
}

// Moves between two hierarchies that this client has for itself: what disables a backend goes along with a session that
// moves, so they are one family.
void SoakClients::addMovingSession(WireScript& script, Client& client) {
  const auto session = _ledger.openSession(client.name);
  client.sessions.push_back(session);
  Dictionary info = newSessionInfo(session);
  const auto enterHierarchy = [this, &info, &client](const char* which) {
    info.set(kTelvaneSessionInfoHierarchyToken, Dictionary{{kTelvaneHierarchyTokenTokenID, client.name + which},
                                                           {kTelvaneHierarchyTokenLevel, below(kLevels)}});
  };
  const auto sendSome = [this, &script, session] {
    for (uint64_t events = 1 + below(kMostEventsAtOnce); events > 0; --events) {
      Event event = newEvent(session);
      script.send(event.category, std::move(event.payload));
    }
    if (inPercent(30)) script.flush();
  };
  const Dictionary userInfo = newUserInfo();
  enterHierarchy(".a");
  script.open(info, userInfo).configure();
  sendSome();
  for (uint64_t moves = 1 + below(3); moves > 0; --moves) {
    enterHierarchy(inPercent(50) ? ".a" : ".b");
    script.tellAgain(info, userInfo);
    ++_moves;
    sendSome();
  }
  script.flush();
}

void SoakClients::addOneShot(WireScript& script, Client& client) {
  const auto session = _ledger.openSession(fmt::format("{}.shot{}", client.name, client.oneShots.size()));
  ++_oneShots;
  Dictionary info = newSessionInfo(session);
  const uint64_t chance = below(100);
  if (chance < 80) {
    Event event = newEvent(session);
    script.sendOneShot(info, newUserInfo(), event.category, std::move(event.payload));
    client.oneShots.push_back({session, kFinished});
    return;
  }
  // Wrong ones: none of them may be posted.
  const Dictionary payload{{kSoakNumber, _ledger.sendEvent(session, SoakLedger::Road::Filtered)}};
  const bool hasUserInfo = chance < 90;
  if (hasUserInfo) info.remove(kTelvaneSessionInfoSessionID.view());
  script.sendOneShot(info, hasUserInfo ? Value(newUserInfo()) : Value(), kSoakCategory, payload);
  client.oneShots.push_back({session, hasUserInfo ? kNoIdentifiers : kFinished});
}

void SoakClients::killOne() {
  if (_running.empty()) return;
  const auto chosen = _running.begin() + static_cast<ptrdiff_t>(below(_running.size()));
  chosen->process->signal(SIGKILL);
  ++_killed;
  settle(*chosen, true);
  _running.erase(chosen);
}

void SoakClients::letOneGo() {
  if (!_running.empty()) _running[below(_running.size())].process->closeInput();
}

void SoakClients::sweep() {
  std::erase_if(_running, [this](Client& client) {
    if (client.process->isRunning()) return false;
    settle(client, false);
    return true;
  });
}

void SoakClients::waitForAll() {
  for (Client& client : _running) client.process->closeInput();
  for (Client& client : _running) settle(client, false);
  _running.clear();
}

std::vector<std::string> SoakClients::answers(const std::string& text, std::string_view heading) {
  std::vector<std::string> found;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    if (line.starts_with(heading)) found.push_back(line.substr(heading.size()));
  }
  return found;
}

void SoakClients::settle(Client& client, bool isKilled) {
  const int exitStatus = client.process->wait(kPatience);
  const std::string said = _instance.read(client.name + ".out");
  const std::string errors = _instance.read(client.name + ".err");
  // One that is to be killed may have ended, well or not, just before. A sanitizer speaks up on standard error.
  const bool isBad = exitStatus != 0 && !(isKilled && exitStatus == -SIGKILL);
  if (isBad || !errors.empty()) fault(fmt::format("{} ended with {}: {}", client.name, exitStatus, errors));
  settleSessions(client, answers(said, "configured: "), isKilled);
  settleOneShots(client, answers(said, "one-shot: "), isKilled);
  for (const char* ending : {".out", ".err", ".plist"}) std::filesystem::remove(_instance.path(client.name + ending));
}

void SoakClients::settleSessions(const Client& client, const std::vector<std::string>& said, bool isKilled) {
  const Lock lock(_mutex);
  for (size_t i = 0; i < client.sessions.size(); ++i) {
    if (isKilled) _ledger.excuse(client.sessions[i], SoakLedger::Reason::Killed);
    const bool isConfigured = i < said.size() && said[i] == "[splunk]";
    if (i < said.size() && !isConfigured) _ledger.excuseFamily(client.sessions[i], SoakLedger::Reason::Unconfigured);
  }
  if (isKilled || said.size() == client.sessions.size()) return;
  fault(fmt::format("{} configured {} of {} sessions", client.name, said.size(), client.sessions.size()));
}

void SoakClients::settleOneShots(const Client& client, const std::vector<std::string>& said, bool isKilled) {
  const Lock lock(_mutex);
  for (size_t i = 0; i < client.oneShots.size(); ++i) {
    const OneShot& oneShot = client.oneShots[i];
    if (isKilled) _ledger.excuse(oneShot.session, SoakLedger::Reason::Killed);
    if (i >= said.size()) continue;
    const bool isOneTooMany = said[i].starts_with(kExceeded);
    if (isOneTooMany) _ledger.excuse(oneShot.session, SoakLedger::Reason::OneTooMany);
    if (isOneTooMany || said[i] == oneShot.expectedAnswer) continue;
    fault(
        fmt::format("{} was told '{}' of a one-shot message, not '{}'", client.name, said[i], oneShot.expectedAnswer));
  }
  if (isKilled || said.size() == client.oneShots.size()) return;
  fault(fmt::format("{} had {} of {} one-shot messages answered", client.name, said.size(), client.oneShots.size()));
}

}  // namespace telvane::testing
