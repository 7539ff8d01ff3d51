#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "tests/endtoend/ClientScript.h"
#include "tests/endtoend/Instance.h"
#include "tests/soak/SoakLedger.h"
#include "tests/soak/WireScript.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

// The client processes of a soak. Most use the library: several sessions each, of which some belong to hierarchies that
// span the processes, and some of those aggregate. The others speak to the daemon by hand: they send messages without a
// session, right and wrong ones, and look at the answers, and move sessions from one hierarchy to another. What they do
// is chosen at their start; how long they live, and whether they are killed, is the soak's choice.
//
// Owned by the soak and called on its thread. The mutex guards the ledger; what is called here must not hold it.
class SoakClients {
 public:
  // Grants the programs what they need.
  SoakClients(Instance& instance, SoakLedger& ledger, std::mutex& mutex, SeededGenerator& choice);

  void startOne();
  void killOne();
  // Lets one go on to its end, which it waits with.
  void letOneGo();
  // Takes the ends of those into account that have ended.
  void sweep();
  // Lets all end.
  void waitForAll();

  size_t running() const noexcept { return _running.size(); }
  size_t started() const noexcept { return _started; }
  size_t killed() const noexcept { return _killed; }
  size_t moves() const noexcept { return _moves; }
  size_t oneShots() const noexcept { return _oneShots; }
  // What was found wrong since the last call, one line each.
  std::vector<std::string> takeFaults();

 private:
  // A message without a session, which is a session of its own to the daemon.
  struct OneShot {
    SoakLedger::Session session;
    std::string_view expectedAnswer;
  };
  struct Client {
    std::string name;
    std::vector<SoakLedger::Session> sessions;  // in the order in which they are configured
    std::vector<OneShot> oneShots;              // in the order in which they are sent
    std::unique_ptr<ChildProcess> process;
  };

  uint64_t below(uint64_t bound) { return _choice.below(bound); }
  bool inPercent(uint64_t percent) { return below(100) < percent; }
  void fault(std::string text) { _faults.push_back(std::move(text)); }

  std::string scriptOfSessions(Client& client);
  void addSession(ClientScript& script, Client& client, bool isLast);
  std::string scriptByHand(Client& client);
  void addMovingSession(WireScript& script, Client& client);
  void addOneShot(WireScript& script, Client& client);
  Dictionary newSessionInfo(SoakLedger::Session session);
  Dictionary newUserInfo();
  struct Event {
    int category;
    Dictionary payload;
  };
  Event newEvent(SoakLedger::Session session);

  // Takes the client's end into account; waits for it.
  void settle(Client& client, bool isKilled);
  void settleSessions(const Client& client, const std::vector<std::string>& said, bool isKilled);
  void settleOneShots(const Client& client, const std::vector<std::string>& said, bool isKilled);
  // What stands behind the heading in those lines that begin with it.
  static std::vector<std::string> answers(const std::string& text, std::string_view heading);

  Instance& _instance;
  SoakLedger& _ledger;
  std::mutex& _mutex;
  SeededGenerator& _choice;
  std::vector<Client> _running;
  std::vector<std::string> _faults;
  size_t _hierarchies = 0;
  size_t _started = 0;
  size_t _killed = 0;
  size_t _moves = 0;
  size_t _oneShots = 0;
};

}  // namespace telvane::testing
