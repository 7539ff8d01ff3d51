#include "tests/soak/SoakCollector.h"

#include <chrono>
#include <stdexcept>
#include <thread>
#include <utility>

#include "interfaces/EventKeys.h"
#include "tests/soak/SoakKeys.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using Lock = std::lock_guard<std::mutex>;

// For answers that were entered as given to get out.
constexpr auto kLastAnswers = 100ms;
constexpr auto kPortPatience = 20s;
constexpr auto kPortStep = 20ms;
constexpr uint64_t kMostDelay = 1500;

}  // namespace

SoakCollector::SoakCollector(TestCertificates::Server certificate, uint64_t seed, SoakLedger& ledger, std::mutex& mutex)
    : _certificate(std::move(certificate)), _choice(seed), _ledger(ledger), _mutex(mutex) {
  listen(0);
  _port = _server->port();
  _url = _server->url("/events");
}

void SoakCollector::listen(uint16_t port) {
  _server = std::make_unique<WireServer>(
      _certificate, [this](const WireRequest& request) { return answer(request); }, port);
}

void SoakCollector::goAway() {
  {
    const Lock lock(_mutex);
    _isLeaving = true;
  }
  ++_absences;
  std::this_thread::sleep_for(kLastAnswers);
  _server.reset();
}

// Meanwhile somebody's outgoing connection may have taken the port.
void SoakCollector::comeBack() {
  {
    const Lock lock(_mutex);
    _isLeaving = false;
  }
  const auto deadline = std::chrono::steady_clock::now() + kPortPatience;
  while (_server == nullptr) {
    try {
      listen(_port);
    } catch (const std::runtime_error&) {
      if (std::chrono::steady_clock::now() > deadline) throw;
      std::this_thread::sleep_for(kPortStep);
    }
  }
}

std::vector<std::string> SoakCollector::takeFaults() {
  const Lock lock(_mutex);
  return std::exchange(_faults, {});
}

std::vector<int64_t> SoakCollector::numbersIn(const WireRequest& request) {
  URLRequest post;
  post.headers.push_back({"Content-Encoding", request.header("Content-Encoding").value_or("")});
  post.body = Data::copyOf(request.body);
  const Value body = RecordingConnectivity::bodyValue(post);
  const Array* events = body.isDictionary() ? (*body.dictionary())[kBodyEvents].array() : nullptr;
  if (events == nullptr) {
    const Lock lock(_mutex);
    _faults.push_back("a post without events: " + request.head);
    return {};
  }
  std::vector<int64_t> numbers;
  for (const Value& event : *events) {
    const Dictionary* fields = event.dictionary();
    if (fields != nullptr && fields->contains(kSoakNumber)) numbers.push_back((*fields)[kSoakNumber].integerValue());
  }
  return numbers;
}

SoakCollector::Decision SoakCollector::decide(bool hasNumbers) {
  const Lock lock(_mutex);
  const uint64_t chance = _choice.below(100);
  // A post without a number could not be accounted to the session that it disables.
  if (chance < 4 && hasNumbers) {
    return {.fate = SoakLedger::Answer::ServerError, .answer = WireServer::answer(503)};
  }
  if (chance < 10) {
    return {.fate = SoakLedger::Answer::ConnectionBroken, .answer = {"", WireServer::Then::Reset}};
  }
  Decision decision{.answer = WireServer::answer(200)};
  if (chance < 20) decision.delay = std::chrono::milliseconds(_choice.below(kMostDelay));
  return decision;
}

WireServer::Answer SoakCollector::answer(const WireRequest& request) {
  const std::vector<int64_t> numbers = numbersIn(request);
  Decision decision = decide(!numbers.empty());
  std::this_thread::sleep_for(decision.delay);  // a slow server, not a waiting test
  const Lock lock(_mutex);
  if (_isLeaving) decision = {.fate = SoakLedger::Answer::ConnectionBroken, .answer = {"", WireServer::Then::Reset}};
  for (const int64_t number : numbers) _ledger.arrive(number, decision.fate);
  return std::move(decision.answer);
}

}  // namespace telvane::testing
