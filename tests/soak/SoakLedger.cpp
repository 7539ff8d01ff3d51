#include "tests/soak/SoakLedger.h"

#include <fmt/format.h>

namespace telvane::testing {

SoakLedger::Session SoakLedger::openSession(std::string family) {
  _sessions.push_back({std::move(family), {}});
  return _sessions.size() - 1;
}

int64_t SoakLedger::sendEvent(Session session, Road road) {
  _events.push_back({session, road});
  return static_cast<int64_t>(_events.size()) - 1;
}

void SoakLedger::note(Family& family, Reason reason) {
  if (!family.isExcused || family.reason == Reason::CollectorAway) family = {true, reason};
}

void SoakLedger::excuse(Session session, Reason reason) { note(_sessions[session].own, reason); }

void SoakLedger::excuseFamily(Session session, Reason reason) { note(_families[_sessions[session].family], reason); }

void SoakLedger::arrive(int64_t number, Answer answer) {
  if (number < 0 || static_cast<size_t>(number) >= _events.size()) {
    _unknownNumbers.push_back(number);
    return;
  }
  Event& event = _events[static_cast<size_t>(number)];
  const bool hasBroken = event.arrivals > 0 && event.answer == Answer::ConnectionBroken;
  const bool mayRepeat = hasBroken && _repeats == Repeats::MayFollowBrokenConnections;
  if (event.arrivals > 0 && !mayRepeat) event.isRepeated = true;
  ++event.arrivals;
  event.answer = answer;
  if (answer == Answer::ServerError) excuseFamily(event.session, Reason::DisabledByServer);
}

const SoakLedger::Family& SoakLedger::excuseOf(const Event& event) const {
  const Client& client = _sessions[event.session];
  const auto family = _families.find(client.family);
  if (family == _families.end()) return client.own;
  const bool hasReason = client.own.isExcused && client.own.reason != Reason::CollectorAway;
  return hasReason || !family->second.isExcused ? client.own : family->second;
}

std::vector<std::string> SoakLedger::faults(Missing missing) const {
  std::vector<std::string> lines;
  for (const int64_t number : _unknownNumbers) lines.push_back(fmt::format("nobody sent the event {}", number));
  for (size_t number = 0; number < _events.size(); ++number) {
    const Event& event = _events[number];
    const auto say = [&](std::string_view what) {
      lines.push_back(fmt::format("event {} of session {} of family {} {}", number, event.session,
                                  _sessions[event.session].family, what));
    };
    if (event.isRepeated) say(fmt::format("came {} times", event.arrivals));
    if (event.road == Road::Filtered && event.arrivals > 0) say("came although it is filtered");
    const bool isMissing = event.road == Road::Posted && event.arrivals == 0 && !excuseOf(event).isExcused;
    if (isMissing && missing == Missing::IsFault) say("is missing without a reason");
  }
  return lines;
}

const char* SoakLedger::name(Reason reason) {
  switch (reason) {
    case Reason::Unconfigured:
      return "dropped, no backend";
    case Reason::OneTooMany:
      return "dropped, session cut off";
    case Reason::Killed:
      return "lost with a killed client";
    case Reason::DisabledByServer:
      return "dropped, backend disabled by the server";
    case Reason::CollectorAway:
      return "lost while the collector was away";
  }
  return "";
}

const char* SoakLedger::name(Answer answer) {
  switch (answer) {
    case Answer::Taken:
      return "delivered";
    case Answer::ServerError:
      return "refused by the server";
    case Answer::ConnectionBroken:
      return "lost on a broken connection";
  }
  return "";
}

std::map<std::string, size_t> SoakLedger::accounts() const {
  std::map<std::string, size_t> counts;
  for (const Event& event : _events) {
    if (event.arrivals > 0) {
      ++counts[name(event.answer)];
    } else if (event.road == Road::Filtered) {
      ++counts["filtered"];
    } else {
      ++counts[excuseOf(event).isExcused ? name(excuseOf(event).reason) : "unaccounted for"];
    }
  }
  return counts;
}

std::string SoakLedger::summary() const {
  std::string text = fmt::format("{} sessions, {} events", _sessions.size(), _events.size());
  for (const auto& [what, count] : accounts()) text += fmt::format("; {} {}", count, what);
  return text;
}

size_t SoakLedger::taken() const {
  size_t count = 0;
  for (const Event& event : _events) count += event.arrivals > 0 && event.answer == Answer::Taken ? 1 : 0;
  return count;
}

}  // namespace telvane::testing
