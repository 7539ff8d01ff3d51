#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "tests/endtoend/Instance.h"
#include "tests/endtoend/WireServer.h"
#include "tests/soak/SoakClients.h"
#include "tests/soak/SoakCollector.h"
#include "tests/soak/SoakLedger.h"
#include "tests/soak/SoakOptions.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

// A real daemon's life in rounds: client processes with several sessions each come, report, leave and are killed,
// against a server that is slow, answers 503, breaks connections and goes away. The seed decides every choice; how they
// meet is the machine's. Between two rounds everybody is gone, and then nothing may be left of anybody: no session,
// helper, hierarchy, shared data, transaction or descriptor, no event without an account, and no growing memory. No
// process may write anything but its log lines, so that a sanitizer's report fails the soak.
class Soak {
 public:
  explicit Soak(SoakOptions options);
  ~Soak();
  Soak(const Soak&) = delete;
  Soak& operator=(const Soak&) = delete;

  // Returns what was found wrong, one line each; empty when all is well. Says on standard output how it goes, and the
  // figures at the end.
  std::vector<std::string> run();

 private:
  // What a daemon at rest takes.
  struct Footprint {
    size_t descriptors = 0;
    int64_t memoryBytes = 0;
  };

  bool inPercent(uint64_t percent) { return _choice.below(100) < percent; }
  void fault(std::string text) { _faults.push_back(std::move(text)); }
  WireServer::Answer answerStorebag(const WireRequest& request);
  void publishStorebags();

  void runRound();
  void letCollectorGoAndCome();
  // Accounts what the sessions of this round miss to the collector's absence.
  void excuseRound();

  void checkAtRest();
  Dictionary status();
  Footprint footprint(const Dictionary& status);
  void checkFootprint();
  void checkLedger();
  void checkLog();
  void stopDaemon();
  void printFigures();

  const SoakOptions _options;
  SeededGenerator _choice;
  std::mutex _mutex;  // the collector's threads meet the program's: guards the ledger
  SoakLedger _ledger{SoakLedger::Repeats::MayFollowBrokenConnections};
  Instance _instance;
  std::map<std::string, std::string> _envelopes;  // constant once the storebags' server runs
  // The storebags come from a server of their own, which stays: one that could not be fetched is not asked for again
  // before long, and its client type would have nothing to do.
  std::unique_ptr<WireServer> _storebagServer;
  SoakCollector _collector;
  SoakClients _clients;
  std::vector<std::string> _faults;
  size_t _rounds = 0;
  size_t _cutOffs = 0;  // sessions that were one too many, by the daemon's log
  SoakLedger::Session _firstOfRound = 0;
  size_t _absencesLeft = 0;  // in this round
  std::chrono::steady_clock::time_point _return;
  std::chrono::duration<double> _busy{};  // in rounds, until everybody is gone
  std::vector<Footprint> _footprints;     // before the first round and after each
};

}  // namespace telvane::testing
