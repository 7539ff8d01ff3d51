#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace telvane::testing {

// The accounts of a soak run: every event has a number, and in the end it has arrived, or there is a reason why it did
// not. What is neither, what came twice, and what came although it had to be dropped are faults. Not for several
// threads.
//
// Sessions belong to families (a hierarchy, or the session alone), because a disabled backend disables those of the
// sessions below it.
class SoakLedger {
 public:
  using Session = uint64_t;
  // What the collector did with a post that reached it.
  enum class Answer { Taken, ServerError, ConnectionBroken };
  // Why events of a session may be missing.
  enum class Reason { Unconfigured, OneTooMany, Killed, DisabledByServer, CollectorAway };
  // Whether the daemon is to post it, or to drop it by the storebag's lists.
  enum class Road { Posted, Filtered };

  // A real URL session repeats a post on a kept connection that broke; a simulated one never does.
  enum class Repeats { AreFaults, MayFollowBrokenConnections };
  explicit SoakLedger(Repeats repeats = Repeats::AreFaults) : _repeats(repeats) {}

  // family: unique among sessions that do not belong together.
  Session openSession(std::string family);
  // Returns the number that the event has to carry.
  int64_t sendEvent(Session session, Road road = Road::Posted);
  // From here on, and for what was sent before: what is missing is accounted to this, unless there was a reason before.
  // That the collector was away is only a reason where there is no other: who was there at the time need not have lost
  // anything by it.
  void excuse(Session session, Reason reason);
  void excuseFamily(Session session, Reason reason);
  // The collector was posted this event; a server error disables the session's family.
  void arrive(int64_t number, Answer answer);

  // One line per fault; empty when all is accounted for. missing: whether what has not come yet is to be a fault too.
  enum class Missing { MayStillCome, IsFault };
  std::vector<std::string> faults(Missing missing) const;
  // How many events there are of each kind: delivered, filtered, or lost and why.
  std::map<std::string, size_t> accounts() const;
  // The same in one line.
  std::string summary() const;
  size_t taken() const;
  size_t sessions() const noexcept { return _sessions.size(); }
  size_t events() const noexcept { return _events.size(); }

 private:
  struct Event {
    Session session;
    Road road;
    int arrivals = 0;
    bool isRepeated = false;  // came again without a reason
    Answer answer = Answer::Taken;
  };
  struct Family {
    bool isExcused = false;
    Reason reason = Reason::Unconfigured;
  };
  struct Client {
    std::string family;
    Family own;
  };

  static void note(Family& family, Reason reason);
  static const char* name(Reason reason);
  static const char* name(Answer answer);
  const Family& excuseOf(const Event& event) const;

  const Repeats _repeats;
  std::vector<Client> _sessions;
  std::map<std::string, Family> _families;
  std::vector<Event> _events;
  std::vector<int64_t> _unknownNumbers;
};

}  // namespace telvane::testing
