#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "tests/endtoend/ClientScript.h"
#include "tests/endtoend/Instance.h"
#include "tests/endtoend/WireServer.h"
#include "tests/soak/SoakLedger.h"
#include "tests/soak/SoakOptions.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

// A real daemon's life in rounds: client processes with several sessions each come, report, leave and are killed,
// against a server that is slow, answers 503 and breaks connections. The seed decides every choice; how they meet is
// the machine's. Between two rounds everybody is gone, and then nothing may be left of anybody: no session, helper,
// hierarchy, shared data, transaction or descriptor, no event without an account, and no growing memory.
class Soak {
 public:
  explicit Soak(SoakOptions options);
  ~Soak();
  Soak(const Soak&) = delete;
  Soak& operator=(const Soak&) = delete;

  // Returns what was found wrong, one line each; empty when all is well. Says on standard output how it goes.
  std::vector<std::string> run();

 private:
  struct Client {
    std::string name;
    std::vector<SoakLedger::Session> sessions;  // in the order in which they are configured
    std::unique_ptr<ChildProcess> process;
  };
  // What a daemon at rest takes.
  struct Footprint {
    size_t descriptors = 0;
    int64_t memoryBytes = 0;
  };

  uint64_t below(uint64_t bound) { return _choice.below(bound); }
  bool inPercent(uint64_t percent) { return below(100) < percent; }
  void fault(std::string text) { _faults.push_back(std::move(text)); }
  WireServer::Answer answer(const WireRequest& request);
  WireServer::Answer answerPost(const WireRequest& request);
  // The numbers of the events in a post that have one; those that a session sends by itself have none.
  std::vector<int64_t> numbersIn(const WireRequest& request);
  void publishStorebags();

  void runRound();
  void startClient();
  void addSession(ClientScript& script, Client& client, bool isLast);
  Dictionary newUserInfo();
  void killAClient();
  void letAClientGo();
  // Takes the client's end into account.
  void settle(Client& client, bool isKilled);
  void sweep();
  void waitForAll();

  void checkAtRest();
  Dictionary status();
  Footprint footprint(const Dictionary& status);
  void checkFootprint(const Footprint& now);
  void checkLog();
  void stopDaemon();

  const SoakOptions _options;
  SeededGenerator _choice;
  std::mutex _mutex;  // the server's threads meet the program's
  SeededGenerator _serverChoice;
  SoakLedger _ledger{SoakLedger::Repeats::MayFollowBrokenConnections};
  Instance _instance;
  std::map<std::string, std::string> _envelopes;
  std::unique_ptr<WireServer> _server;
  std::vector<Client> _clients;
  std::vector<std::string> _faults;
  size_t _clientsMade = 0;
  size_t _hierarchies = 0;
  size_t _killed = 0;
  size_t _rounds = 0;
  Footprint _first;
};

}  // namespace telvane::testing
