#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/ipc/Connection.h"
#include "tests/support/SimulatedChannel.h"

namespace telvane::testing {

class SimulatedServiceHub;

// One end of a simulated connection, behind the handle that its owner holds. What arrives is sorted out between jobs;
// only the owner's handlers, replies and calls run on the connection's queue, in the order of arrival.
class SimulatedConnectionEnd final : public std::enable_shared_from_this<SimulatedConnectionEnd> {
 public:
  enum class Side { Connecting, Accepting };

  SimulatedConnectionEnd(SimulatedServiceHub& hub, std::shared_ptr<SimulatedPeer> peer, Side side,
                         std::string serviceName);

  // The operations of ipc::Connection, for the handle.
  void setExportedObject(std::shared_ptr<ipc::ExportedObject> object);
  void setInterruptionHandler(Job handler);
  void setInvalidationHandler(Job handler);
  void resume();
  void send(ipc::Invocation invocation, ipc::Connection::ErrorHandler onError);
  void sendWithReply(ipc::Invocation invocation, ipc::ReplyBlock reply, ipc::Connection::ErrorHandler onError);
  void invalidate();
  bool peerHasEntitlement(const std::string& name) const;
  PeerIdentity peerIdentity() const;
  bool hasEnded() const noexcept { return _state == State::Invalid || _isDeaf; }
  std::string description() const;
  // The handle is gone: like invalidate(), but the handlers are not called.
  void letGo();

  // For the hub and the channels.
  //
  // Ties this end to a line. other: the process at the other end.
  void attach(std::shared_ptr<SimulatedChannel> incoming, std::shared_ptr<SimulatedChannel> outgoing,
              std::shared_ptr<SimulatedPeer> other);
  // Keeps the handle of an accepted connection until it is invalidated.
  void keepHandle(std::shared_ptr<ipc::Connection> handle);
  bool canReceive() const { return _side == Side::Connecting || _state != State::Suspended; }
  void receive(SimulatedChannel& channel, SimulatedMessage message);
  // There is no line and will be none: refused (ECONNREFUSED), nobody there (ENOENT), or not allowed.
  void becomeInvalid(int errorNumber);
  // The other side is gone.
  void lineLost();
  // This side's process has ended. The line is cut first, and what the end holds let go later, when nothing of the
  // process runs any more.
  void cutLine();
  void vanish();
  // The process that this end is in.
  const SimulatedPeer& peer() const { return *_peer; }
  const std::string& serviceName() const { return _serviceName; }
  std::shared_ptr<SimulatedPeer> sharedPeer() const { return _peer; }

 private:
  // Suspended: not resumed. Disconnected: interrupted, the next call connects again.
  enum class State { Suspended, Connecting, Connected, Disconnected, Invalid };
  struct Pending {
    ipc::ReplyBlock reply;
    ipc::Connection::ErrorHandler onError;
  };
  using PendingCalls = std::map<uint64_t, Pending>;

  void route(SimulatedMessage message);
  void flush();
  void accepted();
  void execute(SimulatedMessage message);
  void settle(SimulatedMessage message);
  void endLocally();
  void failCall(uint64_t call);
  void postInvalidation(PendingCalls failed, Error error);
  void release();
  static void fail(PendingCalls& calls, const Error& error);

  SimulatedServiceHub& _hub;
  const std::shared_ptr<SimulatedPeer> _peer;
  const Side _side;
  const std::string _serviceName;
  const std::shared_ptr<SimulatedSerialQueue> _queue;
  State _state = State::Suspended;
  bool _isDeaf = false;  // ended on this side: nothing that comes is of interest
  std::shared_ptr<ipc::ExportedObject> _exported;
  Job _interruptionHandler;
  Job _invalidationHandler;
  std::vector<SimulatedMessage> _waitingForLine;
  PendingCalls _pending;
  uint64_t _lastCall = 0;
  std::shared_ptr<SimulatedChannel> _incoming;
  std::shared_ptr<SimulatedChannel> _outgoing;
  std::shared_ptr<SimulatedPeer> _other;
  std::shared_ptr<ipc::Connection> _keptHandle;
  // Ended on this side while connecting: stays until what was sent before has found its line.
  std::shared_ptr<SimulatedConnectionEnd> _selfUntilSent;
};

}  // namespace telvane::testing
