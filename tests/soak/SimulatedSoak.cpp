#include "tests/soak/SimulatedSoak.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <map>

#include "interfaces/AgentKeys.h"
#include "interfaces/BackendNames.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/Matchers.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

constexpr char kStorebagServer[] = "https://bags.example/root";
constexpr Key kNumber{"soakNumber"};
constexpr int kCategory = 21;
constexpr int kBarredCategory = 22;
constexpr int kClientProcesses = 8;
constexpr size_t kMostClients = 60;
constexpr size_t kHierarchies = 5;
constexpr int kStepsBetweenChecks = 150;
// Seconds that an unused helper stays; a bag has one of them.
constexpr int kReleaseTimeouts[] = {1, 2, 5};
// Longer than a silent server, a release time-out and the longest wait for a storebag together.
constexpr auto kPatience = 15min;

// What a daemon may complain of in such a life.
constexpr const char* kExpectedErrors[] = {
    "exceeds number of allowed active connections for clientType",
    "has been called more than once for session",
    // What a bag sets for all backends stands beside them in the section.
    "TelvaneBackend(newBackendWithName): release_timeout",
    "could not load storebag '",
};

// The numbers of the events in a post's body that have one; those that a session sends by itself have none.
std::vector<int64_t> soakNumbers(const Value& body) {
  std::vector<int64_t> numbers;
  const Array* events = body.isDictionary() ? (*body.dictionary())[kBodyEvents].array() : nullptr;
  if (events == nullptr) {
    ADD_FAILURE() << "a post without events";
    return numbers;
  }
  for (const Value& event : *events) {
    const Dictionary* fields = event.dictionary();
    if (fields != nullptr && fields->contains(kNumber)) numbers.push_back((*fields)[kNumber].integerValue());
  }
  return numbers;
}

}  // namespace

SimulatedSoak::SimulatedSoak(uint64_t seed)
    : _world(seed), _choice(seed), _daemon(_world.makeProcess("telvaned")), _hierarchies(kHierarchies) {
  // With whole seconds and no latency things meet at the same instant; with latency they pass each other on the way.
  if (inPercent(50)) _world.services().setLatency({0ms, 2ms});
  if (inPercent(50)) _world.scheduler().setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
  for (const int timeout : kReleaseTimeouts) {
    Dictionary client = StorebagBuilder::permissiveClient();
    client.set(kClientEntryEventBlacklist, Array{Value(kBarredCategory)});
    StorebagBuilder bag;
    bag.set(kEnvironmentRelease, StorebagBuilder::section(kTelvaneBackendHTTPPost.view().data(), client));
    _envelopes.push_back(bag.set(kStorebagReleaseTimeout, timeout).envelope());
  }
  for (int i = 0; i < kClientProcesses; ++i) {
    _clientProcesses.push_back(
        &_world.makeProcess(fmt::format("client{}", i), {.entitlements = {kTelvanedEntitlement}}));
  }
  startDaemon();
}

SimulatedSoak::~SimulatedSoak() {
  _clients.clear();
  _world.end();
  _service.reset();
}

void SimulatedSoak::startDaemon() {
  _daemon.clientBundle().setPublicKey(StorebagBuilder::publicKey());
  _daemon.log().allowErrors();  // checkLog() looks at them
  EXPECT_TRUE(isOk(_daemon.userDefaults().setObject(kTelvaneDefaultsSuite.view(), kDefaultsStorebagURL.view(),
                                                    Value(kStorebagServer))));
  _world.network().answerWith(StorebagBuilder::kPostURL, [this](const auto& request) { return answerPost(request); });
  _world.network().answerWith(kStorebagServer, [this](const auto& request) { return answerStorebag(request); });
  _service = std::make_unique<TelvanedService>(_daemon.platform());
  EXPECT_TRUE(isOk(_service->start()));
}

NetworkAnswer SimulatedSoak::answerPost(const URLRequest& request) {
  constexpr int kServiceUnavailable = 503;
  const Value body = RecordingConnectivity::bodyValue(request);
  const std::vector<int64_t> numbers = soakNumbers(body);
  SoakLedger::Answer fate = SoakLedger::Answer::Taken;
  NetworkAnswer answer = NetworkAnswer::ok().after(std::chrono::seconds(below(3)));
  const uint64_t chance = below(100);
  // A post without a number could not be accounted to the session that it disables.
  if (chance < 4 && !numbers.empty()) {
    fate = SoakLedger::Answer::ServerError;
    answer = NetworkAnswer::status(kServiceUnavailable).after(std::chrono::seconds(below(2)));
  } else if (chance < 10) {
    fate = SoakLedger::Answer::ConnectionBroken;
    answer = NetworkAnswer::failure(URLErrorCode::NetworkConnectionLost).after(std::chrono::seconds(below(5)));
  } else if (chance < 12) {
    fate = SoakLedger::Answer::ConnectionBroken;
    answer = NetworkAnswer::silence();
  } else if (chance < 16) {
    answer = NetworkAnswer::ok().after(std::chrono::seconds(10 + below(40)));
  }
  for (const int64_t number : numbers) _ledger.arrive(number, fate);
  return answer;
}

NetworkAnswer SimulatedSoak::answerStorebag(const URLRequest& request) {
  // Slow, but it answers: a bag is asked for once in a daemon's life, and who asks for a lost one again waits for ever.
  return NetworkAnswer::ok(_envelopes[request.url.size() % _envelopes.size()])
      .withHeader("Cache-Control", "max-age=600")
      .after(std::chrono::seconds(below(3)));
}

void SimulatedSoak::live(int steps) {
  for (int i = 1; i <= steps; ++i) {
    step();
    letTimePass();
    sweep();
    if (i % kStepsBetweenChecks == 0) check();
    if (::testing::Test::HasFailure()) return;
  }
}

void SimulatedSoak::letTimePass() {
  const uint64_t chance = below(100);
  if (chance < 50) return;  // the next step meets this one on its way
  if (chance < 75) {
    _world.runUntilIdle();
  } else if (chance < 97) {
    _world.advance(std::chrono::seconds(1 + below(6)));
  } else {
    _world.advance(std::chrono::minutes(1 + below(120)));
  }
}

void SimulatedSoak::step() {
  const uint64_t chance = below(100);
  if (chance < 2) return kill();
  if (chance < 5) return sendOneShot();
  if (_clients.empty() || (chance < 30 && _clients.size() < kMostClients)) return open();
  Client* client = anyClient();
  if (client == nullptr) return;
  if (chance < 70) return sendEvents(*client);
  if (chance < 76) return ask(*client, Operation::FlushMessages, {});
  if (chance < 82) return changeUserInfo(*client);
  if (chance < 86) return share(*client);
  if (chance < 88) return configure(*client);  // once more, or at last
  return leave(*client);
}

SimulatedSoak::Client* SimulatedSoak::anyClient() {
  Client& client = _clients[below(_clients.size())];
  return client.isLeaving ? nullptr : &client;
}

void SimulatedSoak::tell(Client& client, Operation operation, Array arguments) {
  client.connection->send({static_cast<uint16_t>(operation), std::move(arguments), {}}, {});
}

void SimulatedSoak::ask(Client& client, Operation operation, Array arguments,
                        std::function<void(const Array& answer)> then) {
  client.connection->sendWithReply({static_cast<uint16_t>(operation), std::move(arguments), {}},
                                   [then = std::move(then)](const Array& answer) {
                                     if (then) then(answer);
                                   },
                                   {});
}

Dictionary SimulatedSoak::newUserInfo(std::string& key) {
  static constexpr const char* kClientNames[] = {"player", "Player", "writer", "reader"};
  static constexpr const char* kServiceNames[] = {"movies", "MOVIES", "songs"};
  const std::string client = kClientNames[below(std::size(kClientNames))];
  const std::string service = kServiceNames[below(std::size(kServiceNames))];
  key = client + ":" + service;
  std::transform(key.begin(), key.end(), key.begin(), [](unsigned char c) { return std::tolower(c); });
  return {{kTelvaneUserInfoClientName, client}, {kTelvaneUserInfoServiceName, service}};
}

SimulatedSoak::Client SimulatedSoak::newClient() {
  Client client{};
  client.process = _clientProcesses[below(_clientProcesses.size())];
  // Half of them crowd into a few client types, so that some are one too many.
  constexpr uint64_t kCrowdedTypes = 4;
  client.clientType =
      kFirstClientType +
      static_cast<int32_t>(below(inPercent(50) ? kCrowdedTypes : kLastClientType - kFirstClientType + 1));
  client.connection = client.process->platform().localService.newConnection(kTelvanedServiceName).value();
  const auto onEnd = [isInvalidated = client.isInvalidated] { *isInvalidated = true; };
  client.connection->setInterruptionHandler(onEnd);
  client.connection->setInvalidationHandler(onEnd);
  client.connection->resume();
  return client;
}

Dictionary SimulatedSoak::newSessionInfo(Client& client) {
  constexpr uint32_t kIdentifiers = 1000;
  Dictionary info{{kTelvaneSessionInfoClientType, client.clientType},
                  {kTelvaneSessionInfoSessionID, below(kIdentifiers)},
                  {kTelvaneSessionInfoClientVersion, 3},
                  {kTelvaneSessionInfoBatchEvent, inPercent(70)},
                  {kTelvaneSessionInfoRequireUserInfo, true}};
  if (!client.token.empty()) {
    info.set(kTelvaneSessionInfoHierarchyToken,
             Dictionary{{kTelvaneHierarchyTokenTokenID, client.token}, {kTelvaneHierarchyTokenLevel, below(4)}});
  }
  return info;
}

void SimulatedSoak::open() {
  Client client = newClient();
  if (inPercent(40)) {
    const size_t hierarchy = below(kHierarchies);
    if (inPercent(15)) ++_hierarchies[hierarchy];
    client.token = fmt::format("h{}.{}", hierarchy, _hierarchies[hierarchy]);
  }
  client.session = _ledger.openSession(client.token.empty() ? fmt::format("alone{}", ++_families) : client.token);
  Dictionary info = newSessionInfo(client);
  Dictionary userInfo = newUserInfo(client.userInfoKey);
  tell(client, Operation::SetSessionInfo, {std::move(info), std::move(userInfo), Value(), inPercent(30)});
  if (inPercent(85)) configure(client);
  _clients.push_back(std::move(client));
}

void SimulatedSoak::configure(Client& client) {
  client.isConfigured = true;
  ask(client, Operation::StartConfig, {}, [this, session = client.session](const Array& answer) {
    const bool hasBackend = !answer.empty() && answer[0].array() != nullptr && !answer[0].array()->empty();
    if (!hasBackend) _ledger.excuseFamily(session, SoakLedger::Reason::Unconfigured);
  });
}

void SimulatedSoak::sendEvents(Client& client) {
  constexpr uint64_t kMostAtOnce = 60;
  // Without backends it has nowhere to go, which the daemon must get over.
  if (!client.isConfigured) _ledger.excuse(client.session, SoakLedger::Reason::Unconfigured);
  const uint64_t count = 1 + below(inPercent(10) ? kMostAtOnce : 5);
  for (uint64_t i = 0; i < count; ++i) {
    const bool isBarred = inPercent(10);
    const int64_t number =
        _ledger.sendEvent(client.session, isBarred ? SoakLedger::Road::Filtered : SoakLedger::Road::Posted);
    ask(client, Operation::SendMessageWithDictionary,
        {Dictionary{{kTelvaneMessageParametersCategory, isBarred ? kBarredCategory : kCategory},
                    {kTelvaneMessageParametersType, 1},
                    {kTelvaneMessageParametersPayload, Dictionary{{kNumber, number}}}}});
  }
}

void SimulatedSoak::sendOneShot() {
  Client client = newClient();
  client.session = _ledger.openSession(fmt::format("one-shot{}", ++_families));
  Dictionary info = newSessionInfo(client);
  info.set(kTelvaneSessionInfoBatchEvent, true);
  const int64_t number = _ledger.sendEvent(client.session);
  client.isLeaving = true;
  ask(client, Operation::SendMessageWithSessionInfo,
      {std::move(info), newUserInfo(client.userInfoKey), kCategory, 1, Dictionary{{kNumber, number}}},
      [this, session = client.session, isFinished = client.isFinished](const Array& answer) {
        *isFinished = true;
        const std::string_view text = answer.empty() ? std::string_view() : answer[0].text();
        if (text.starts_with("Exceeded")) _ledger.excuse(session, SoakLedger::Reason::OneTooMany);
        if (text == "storebag not available") _ledger.excuse(session, SoakLedger::Reason::Unconfigured);
      });
  _clients.push_back(std::move(client));
}

void SimulatedSoak::changeUserInfo(Client& client) {
  Value userInfo;
  if (inPercent(80)) userInfo = newUserInfo(client.userInfoKey);
  ask(client, Operation::FetchStates, {std::move(userInfo)});
}

void SimulatedSoak::share(Client& client) {
  const String key(fmt::format("shared{}", below(3)));
  if (inPercent(30)) return tell(client, Operation::UpdateSharedDataForKey, {Value(key), Value()});
  if (inPercent(50)) return tell(client, Operation::UpdateSharedDataForKey, {Value(key), Value(below(100))});
  Dictionary shared;
  shared.set(key, Value(below(100)));
  tell(client, Operation::UpdateSharedDataWithDictionary, {std::move(shared)});
}

// The connection goes when all that was sent on it has been worked off, as it does in a client that ends in peace.
void SimulatedSoak::leave(Client& client) {
  client.isLeaving = true;
  if (inPercent(50)) tell(client, Operation::FinishSessionGracefully, {});
  ask(client, Operation::FetchStates, {Value()},
      [isFinished = client.isFinished](const Array&) { *isFinished = true; });
}

void SimulatedSoak::kill() {
  SimulatedPlatform*& process = _clientProcesses[below(_clientProcesses.size())];
  process->kill();
  ++_killedProcesses;
  std::erase_if(_clients, [this, process](const Client& client) {
    if (client.process != process) return false;
    _ledger.excuse(client.session, SoakLedger::Reason::Killed);
    return true;
  });
  process = &_world.restart(*process);
}

void SimulatedSoak::sweep() {
  std::erase_if(_clients, [this](Client& client) {
    if (*client.isInvalidated) {
      ++_cutOffSessions;
      _ledger.excuse(client.session, SoakLedger::Reason::OneTooMany);
      return true;
    }
    if (!*client.isFinished) return false;
    client.connection->invalidate();
    return true;
  });
}

void SimulatedSoak::check() {
  std::string different;
  SimulatedScheduler::Duration waited{};
  do {
    _world.advance(1s);
    waited += 1s;
    sweep();
    different = differences();
  } while (!different.empty() && waited < kPatience);
  EXPECT_EQ(different, "") << _ledger.summary();
  const auto faults = _ledger.faults(SoakLedger::Missing::MayStillCome);
  EXPECT_TRUE(faults.empty()) << faults.size() << " faults, the first: " << faults.front();
  checkLog();
}

std::string SimulatedSoak::differences() {
  std::map<std::string, int64_t> expected;
  std::set<std::string> helpers;
  std::set<std::string> hierarchies;
  expected["sessions"] = static_cast<int64_t>(_clients.size());
  for (const Client& client : _clients) {
    ++expected[fmt::format("clientType {} {}", client.clientType, clientType(client.clientType)->senderName)];
    if (!client.userInfoKey.empty()) helpers.insert(client.userInfoKey);
    if (!client.token.empty()) hierarchies.insert(client.token);
  }
  expected["helpers"] = static_cast<int64_t>(helpers.size());
  expected["hierarchies"] = static_cast<int64_t>(hierarchies.size());

  const Dictionary status = _service->agent().daemonStatus();
  std::map<std::string, int64_t> actual;
  actual["sessions"] = status[kStatusSessions].integerValue();
  actual["helpers"] = status[kStatusConnectivityHelpers].integerValue();
  actual["hierarchies"] = status[kStatusHierarchies].integerValue();
  for (const DictionaryEntry& entry : *status[kStatusClientTypes].dictionary()) {
    actual[fmt::format("clientType {}", entry.key.view())] = entry.value.integerValue();
  }
  std::string text;
  if (expected != actual) {
    text = fmt::format("expected {}\nbut the daemon has {}\n", ::testing::PrintToString(expected),
                       ::testing::PrintToString(actual));
  }
  const int64_t withSharedData = status[kStatusSharedData].integerValue();
  if (withSharedData > expected["hierarchies"]) text += fmt::format("shared data of {} hierarchies\n", withSharedData);
  const int64_t transactions = status[kStatusTransactions].integerValue();
  if (transactions < expected["sessions"]) text += fmt::format("only {} transactions\n", transactions);
  const bool isHeld = _daemon.transactions().open() == 1;
  if (isHeld != (transactions > 0)) text += fmt::format("{} transactions, held: {}\n", transactions, isHeld);
  if (_clients.empty() && transactions != 0) text += fmt::format("{} transactions left over\n", transactions);
  return text;
}

void SimulatedSoak::checkLog() {
  RecordingLog& log = _daemon.log();
  for (const LogLine& line : log.lines()) {
    if (line.level != LogLevel::Error) continue;
    const bool isExpected = std::any_of(std::begin(kExpectedErrors), std::end(kExpectedErrors),
                                        [&line](auto part) { return line.message.find(part) != std::string::npos; });
    EXPECT_TRUE(isExpected) << line.text();
  }
  _sessionsMade += log.count("initWithSessionDelegate: Initialized session with UUID");
  _sessionsEnded += log.count("dealloc: TelvanedSession dealloc:");
  _helpersMade += log.count("ReportingSessionConnectivityHelper created with delegate");
  _helpersEnded += log.count("ReportingSessionConnectivityHelper dealloced with ID");
  log.clear();
}

void SimulatedSoak::endAndCheck() {
  for (Client& client : _clients) {
    if (!client.isLeaving) leave(client);
  }
  check();
  _world.advance(kPatience);
  EXPECT_EQ(differences(), "");
  EXPECT_TRUE(_clients.empty());
  checkLog();
  EXPECT_EQ(_sessionsMade, _sessionsEnded);
  // One helper fetches the storebags and stays as long as the daemon.
  EXPECT_EQ(_helpersMade, _helpersEnded + 1);
  EXPECT_EQ(_daemon.transactions().open(), 0);
  EXPECT_EQ(_daemon.transactions().surplusEnds(), 0);
  const auto faults = _ledger.faults(SoakLedger::Missing::IsFault);
  EXPECT_TRUE(faults.empty()) << faults.size() << " faults, the first: " << faults.front() << "\n" << _ledger.summary();
}

}  // namespace telvane::testing
