#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>

#include "platform/FlowGate.h"
#include "platform/ipc/Connection.h"
#include "tests/support/SimulatedDispatch.h"

namespace telvane::testing {

class SimulatedConnectionEnd;

// A simulated process, as its peers and the machine see it.
struct SimulatedPeer {
  std::string name;
  int processIdentifier = 0;
  std::set<std::string> entitlements;
  SimulatedDispatch* dispatch = nullptr;
  FlowGate* gate = nullptr;  // may be null: always open
  bool isAlive = true;
  PeerIdentity identity{};
};

// What goes through a channel.
struct SimulatedMessage {
  enum class Kind { Accepted, Refused, Call, Executed, Reply, ReplyDropped, Closed };
  Kind kind = Kind::Call;
  uint64_t call = 0;
  bool wantsReply = false;
  bool wantsExecuted = false;
  ipc::Invocation invocation;
  Array values;
};

// How long a message is under way, by the seed between the two.
struct SimulatedLatency {
  std::chrono::nanoseconds minimum{0};
  std::chrono::nanoseconds maximum{0};
};

// One direction of a line between two processes. Messages arrive in the order in which they were sent, each after a
// latency of its own, and each arrival is a step of its own that the seed may put behind others'. Calls wait while the
// receiver is not resumed or its process's flow gate is closed.
class SimulatedChannel : public std::enable_shared_from_this<SimulatedChannel> {
 public:
  SimulatedChannel(SimulatedScheduler& scheduler, SimulatedLatency latency, std::shared_ptr<SimulatedPeer> sender,
                   std::weak_ptr<SimulatedConnectionEnd> receiver);

  // Sends; nothing after Closed, nothing from a process that has ended.
  void push(SimulatedMessage message);
  // Nothing arrives until open() is called, with what is then put in front of everything.
  void hold() { _isHeld = true; }
  void open(SimulatedMessage first);
  // The receiver can take more.
  void resume() { schedulePump(); }
  // The sending process has ended: a part of what is under way, chosen by the seed, is lost; then the line is closed.
  void cut();

 private:
  struct UnderWay {
    SimulatedScheduler::Time arrival;
    SimulatedMessage message;
  };
  void enqueue(SimulatedMessage message);
  void schedulePump();
  void pump();
  bool waitsForGate(SimulatedConnectionEnd& receiver);

  SimulatedScheduler& _scheduler;
  const SimulatedLatency _latency;
  const std::shared_ptr<SimulatedPeer> _sender;
  const std::weak_ptr<SimulatedConnectionEnd> _receiver;
  std::deque<UnderWay> _messages;
  SimulatedScheduler::Time _lastArrival{};
  bool _isHeld = false;
  bool _isClosed = false;
  bool _isScheduled = false;
};

}  // namespace telvane::testing
