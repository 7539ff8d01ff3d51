#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "tests/endtoend/WireServer.h"
#include "tests/soak/SoakLedger.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

// The server that a soak's events are posted to, and a bad one: at times it is slow, answers 503, breaks connections,
// and goes away for a while, when connections to it are refused. Enters in the ledger what came and what became of it.
//
// The seed decides what it does with a post, the posts' order which post that is. Its threads take the mutex, which
// guards the ledger; what is called here must not hold it.
class SoakCollector {
 public:
  SoakCollector(TestCertificates::Server certificate, uint64_t seed, SoakLedger& ledger, std::mutex& mutex);

  std::string url() const { return _url; }
  // Breaks all connections. What is posted from now on is lost.
  void goAway();
  // Listens on its port again.
  void comeBack();
  bool isAway() const noexcept { return _server == nullptr; }
  size_t absences() const noexcept { return _absences; }
  // What came that is no post of events, one line each.
  std::vector<std::string> takeFaults();

 private:
  struct Decision {
    SoakLedger::Answer fate = SoakLedger::Answer::Taken;
    WireServer::Answer answer;
    std::chrono::milliseconds delay{};
  };
  void listen(uint16_t port);
  WireServer::Answer answer(const WireRequest& request);
  Decision decide(bool hasNumbers);
  // The numbers of the events in a post that have one; those that a session sends by itself have none.
  std::vector<int64_t> numbersIn(const WireRequest& request);

  const TestCertificates::Server _certificate;
  SeededGenerator _choice;
  SoakLedger& _ledger;
  std::mutex& _mutex;
  std::vector<std::string> _faults;
  bool _isLeaving = false;
  size_t _absences = 0;
  uint16_t _port = 0;
  std::string _url;
  std::unique_ptr<WireServer> _server;
};

}  // namespace telvane::testing
