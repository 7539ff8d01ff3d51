#pragma once

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "daemon/TelvanedService.h"
#include "interfaces/ClientSessionInterface.h"
#include "platform/ipc/Connection.h"
#include "tests/soak/SoakLedger.h"
#include "tests/support/SeededGenerator.h"
#include "tests/support/SimulatedWorld.h"
#include "tests/support/StorebagBuilder.h"

namespace telvane::testing {

// A daemon's long life on a simulated machine: client processes open sessions of all client types, configure, send,
// share, change their user info, flush, leave and are killed, against a collector that fails, slows down and falls
// silent. The seed decides every choice; the same seed is the same life, step by step.
//
// A check that fails is a gtest failure of the caller's test; SimulatedWorld's seed trace names the run.
class SimulatedSoak {
 public:
  explicit SimulatedSoak(uint64_t seed);
  ~SimulatedSoak();
  SimulatedSoak(const SimulatedSoak&) = delete;
  SimulatedSoak& operator=(const SimulatedSoak&) = delete;

  // So many choices, with a check now and then.
  void live(int steps);
  // Everybody leaves; afterwards nothing may be left of anybody.
  void endAndCheck();

  const SoakLedger& ledger() const noexcept { return _ledger; }
  // What everybody logged, for who looks for the reason of a failure.
  const std::string& log() const noexcept { return _world.text(); }
  size_t killedProcesses() const noexcept { return _killedProcesses; }
  size_t cutOffSessions() const noexcept { return _cutOffSessions; }

 private:
  using Operation = ClientSessionOperation;
  // One session's client side.
  struct Client {
    SoakLedger::Session session;
    int32_t clientType;
    std::string token;  // of the hierarchy, empty without one
    std::string userInfoKey;
    SimulatedPlatform* process;
    std::shared_ptr<ipc::Connection> connection;
    std::shared_ptr<bool> isInvalidated = std::make_shared<bool>(false);
    std::shared_ptr<bool> isFinished = std::make_shared<bool>(false);  // all that it sent has been worked off
    bool isConfigured = false;                                         // has asked for it
    bool isLeaving = false;
  };

  uint64_t below(uint64_t bound) { return _choice.below(bound); }
  bool inPercent(uint64_t percent) { return below(100) < percent; }
  NetworkAnswer answerPost(const URLRequest& request);
  NetworkAnswer answerStorebag(const URLRequest& request);
  void startDaemon();

  void step();
  void letTimePass();
  void open();
  void sendOneShot();
  void sendEvents(Client& client);
  void changeUserInfo(Client& client);
  void share(Client& client);
  void configure(Client& client);
  void leave(Client& client);
  void kill();

  Client newClient();
  Dictionary newUserInfo(std::string& key);
  Dictionary newSessionInfo(Client& client);
  Client* anyClient();
  void tell(Client& client, Operation operation, Array arguments);
  void ask(Client& client, Operation operation, Array arguments, std::function<void(const Array& answer)> then = {});
  // Lets go of clients that have left or have been cut off.
  void sweep();
  void check();
  // Empty when the daemon counts what is there; else what differs.
  std::string differences();
  void checkLog();

  SimulatedWorld _world;
  SeededGenerator _choice;
  SoakLedger _ledger;
  SimulatedPlatform& _daemon;
  std::unique_ptr<TelvanedService> _service;
  std::vector<std::string> _envelopes;
  std::vector<SimulatedPlatform*> _clientProcesses;
  std::vector<Client> _clients;
  std::vector<uint64_t> _hierarchies;  // the newest number of each
  uint64_t _families = 0;
  size_t _killedProcesses = 0;
  size_t _cutOffSessions = 0;
  size_t _sessionsMade = 0;
  size_t _sessionsEnded = 0;
  size_t _helpersMade = 0;
  size_t _helpersEnded = 0;
};

}  // namespace telvane::testing
