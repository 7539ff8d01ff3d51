#include "tests/support/SimulatedConnectionEnd.h"

#include <fmt/format.h>

#include <cerrno>
#include <utility>

#include "tests/support/SimulatedServiceHub.h"

namespace telvane::testing {

namespace {

// The codes are those that the real connection reports.
Error connectionError(int code, const char* text) { return Error::withDescription(kPlatformErrorDomain, code, text); }

Error interrupted() { return connectionError(ECONNRESET, "The connection was interrupted"); }

Error invalidated() { return connectionError(ECANCELED, "The connection has been invalidated"); }

Error replyDropped() { return connectionError(ENOMSG, "A call was left without an answer"); }

// The answer of one call on its way back. Let go unanswered, it says so.
class ReplyTicket {
 public:
  ReplyTicket(std::shared_ptr<SimulatedChannel> channel, uint64_t call) : _channel(std::move(channel)), _call(call) {}
  ReplyTicket(ReplyTicket&&) noexcept = default;
  ReplyTicket& operator=(ReplyTicket&&) = delete;
  ~ReplyTicket() {
    if (_channel != nullptr) _channel->push(SimulatedMessage{SimulatedMessage::Kind::ReplyDropped, _call});
  }

  void answer(Array values) {
    SimulatedMessage message{SimulatedMessage::Kind::Reply, _call};
    message.values = std::move(values);
    if (const auto channel = std::exchange(_channel, nullptr)) channel->push(std::move(message));
  }

 private:
  std::shared_ptr<SimulatedChannel> _channel;
  uint64_t _call;
};

}  // namespace

SimulatedConnectionEnd::SimulatedConnectionEnd(SimulatedServiceHub& hub, std::shared_ptr<SimulatedPeer> peer, Side side,
                                               std::string serviceName)
    : _hub(hub),
      _peer(std::move(peer)),
      _side(side),
      _serviceName(std::move(serviceName)),
      _queue(_peer->dispatch->newSimulatedQueue("connection " + _serviceName)) {}

void SimulatedConnectionEnd::setExportedObject(std::shared_ptr<ipc::ExportedObject> object) {
  if (_state != State::Invalid) _exported = std::move(object);
}

void SimulatedConnectionEnd::setInterruptionHandler(Job handler) {
  if (_state != State::Invalid) _interruptionHandler = std::move(handler);
}

void SimulatedConnectionEnd::setInvalidationHandler(Job handler) {
  if (_state != State::Invalid) _invalidationHandler = std::move(handler);
}

void SimulatedConnectionEnd::resume() {
  if (_state != State::Suspended) return;
  if (_side == Side::Connecting) {
    _state = State::Connecting;
    return _hub.connect(shared_from_this());
  }
  _state = State::Connected;
  flush();
  if (_incoming != nullptr) _incoming->resume();
}

void SimulatedConnectionEnd::send(ipc::Invocation invocation, ipc::Connection::ErrorHandler onError) {
  SimulatedMessage message{SimulatedMessage::Kind::Call, ++_lastCall};
  message.invocation = std::move(invocation);
  message.wantsExecuted = static_cast<bool>(onError);
  if (onError) _pending.emplace(message.call, Pending{nullptr, std::move(onError)});
  route(std::move(message));
}

void SimulatedConnectionEnd::sendWithReply(ipc::Invocation invocation, ipc::ReplyBlock reply,
                                           ipc::Connection::ErrorHandler onError) {
  SimulatedMessage message{SimulatedMessage::Kind::Call, ++_lastCall, true};
  message.invocation = std::move(invocation);
  _pending.emplace(message.call, Pending{std::move(reply), std::move(onError)});
  route(std::move(message));
}

void SimulatedConnectionEnd::route(SimulatedMessage message) {
  switch (_state) {
    case State::Connected:
      return _outgoing->push(std::move(message));
    case State::Invalid:
      return failCall(message.call);
    case State::Disconnected:
      _state = State::Connecting;
      _hub.connect(shared_from_this());
      break;
    case State::Suspended:
    case State::Connecting:
      break;
  }
  _waitingForLine.push_back(std::move(message));
}

void SimulatedConnectionEnd::flush() {
  for (SimulatedMessage& message : std::exchange(_waitingForLine, {})) _outgoing->push(std::move(message));
}

void SimulatedConnectionEnd::failCall(uint64_t call) {
  PendingCalls failed;
  failed.insert(_pending.extract(call));
  _queue->post([failed = std::move(failed)]() mutable { fail(failed, invalidated()); });
}

void SimulatedConnectionEnd::invalidate() {
  if (_state == State::Invalid) return;
  endLocally();
  postInvalidation(std::exchange(_pending, {}), invalidated());
}

void SimulatedConnectionEnd::letGo() {
  if (_state == State::Invalid) return;
  const Job interruptionHandler = std::exchange(_interruptionHandler, nullptr);
  const Job invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  invalidate();
}

void SimulatedConnectionEnd::endLocally() {
  _isDeaf = true;
  if (_state == State::Suspended) _waitingForLine.clear();
  if (_state == State::Connecting) {
    _selfUntilSent = shared_from_this();
  } else if (_outgoing != nullptr) {
    _outgoing->push(SimulatedMessage{SimulatedMessage::Kind::Closed});
  }
  _state = State::Invalid;
}

void SimulatedConnectionEnd::becomeInvalid(int errorNumber) {
  const auto keepsAlive = std::exchange(_selfUntilSent, nullptr);
  _waitingForLine.clear();
  if (_state == State::Invalid) return;
  _state = State::Invalid;
  postInvalidation(std::exchange(_pending, {}), connectionError(errorNumber, "The connection was refused"));
}

void SimulatedConnectionEnd::postInvalidation(PendingCalls failed, Error error) {
  _queue->post([self = shared_from_this(), failed = std::move(failed), error = std::move(error)]() mutable {
    fail(failed, error);
    if (Job handler = std::exchange(self->_invalidationHandler, nullptr)) handler();
    self->release();
  });
}

void SimulatedConnectionEnd::release() {
  _interruptionHandler = nullptr;
  _exported = nullptr;
  // Last: it may be what keeps this object.
  const auto handle = std::exchange(_keptHandle, nullptr);
}

void SimulatedConnectionEnd::attach(std::shared_ptr<SimulatedChannel> incoming,
                                    std::shared_ptr<SimulatedChannel> outgoing, std::shared_ptr<SimulatedPeer> other) {
  _incoming = std::move(incoming);
  _outgoing = std::move(outgoing);
  _other = std::move(other);
}

void SimulatedConnectionEnd::keepHandle(std::shared_ptr<ipc::Connection> handle) {
  if (_state != State::Invalid) _keptHandle = std::move(handle);
}

void SimulatedConnectionEnd::receive(SimulatedChannel& channel, SimulatedMessage message) {
  if (&channel != _incoming.get()) return;  // of a line that was lost since
  switch (message.kind) {
    case SimulatedMessage::Kind::Accepted:
      return accepted();
    case SimulatedMessage::Kind::Refused:
      return becomeInvalid(ECONNREFUSED);
    case SimulatedMessage::Kind::Closed:
      return lineLost();
    case SimulatedMessage::Kind::Call:
      return execute(std::move(message));
    case SimulatedMessage::Kind::Executed:
    case SimulatedMessage::Kind::Reply:
    case SimulatedMessage::Kind::ReplyDropped:
      return settle(std::move(message));
  }
}

void SimulatedConnectionEnd::accepted() {
  const auto keepsAlive = std::exchange(_selfUntilSent, nullptr);
  flush();
  if (_isDeaf) return _outgoing->push(SimulatedMessage{SimulatedMessage::Kind::Closed});
  _state = State::Connected;
}

void SimulatedConnectionEnd::execute(SimulatedMessage message) {
  _queue->post([self = shared_from_this(), out = _outgoing, message = std::move(message)]() mutable {
    if (self->_isDeaf) return;
    ipc::ReplyBlock reply;
    if (message.wantsReply) {
      reply = [ticket = ReplyTicket(out, message.call)](Array values) mutable { ticket.answer(std::move(values)); };
    }
    // Held on its own: the call may set another object or end the connection.
    if (const auto object = self->_exported) object->invoke(std::move(message.invocation), std::move(reply));
    if (message.wantsExecuted) out->push(SimulatedMessage{SimulatedMessage::Kind::Executed, message.call});
  });
}

void SimulatedConnectionEnd::settle(SimulatedMessage message) {
  auto settled = _pending.extract(message.call);
  if (settled.empty() || message.kind == SimulatedMessage::Kind::Executed) return;
  _queue->post([pending = std::move(settled.mapped()), message = std::move(message)]() mutable {
    if (message.kind == SimulatedMessage::Kind::Reply) {
      if (pending.reply) pending.reply(std::move(message.values));
    } else if (pending.onError) {
      pending.onError(replyDropped());
    }
  });
}

void SimulatedConnectionEnd::lineLost() {
  const auto keepsAlive = std::exchange(_selfUntilSent, nullptr);
  if (_state == State::Invalid) return;
  attach(nullptr, nullptr, _other);
  _waitingForLine.clear();
  const bool isOver = _side == Side::Accepting;
  _state = isOver ? State::Invalid : State::Disconnected;
  _queue->post([self = shared_from_this(), isOver, failed = std::exchange(_pending, {})]() mutable {
    fail(failed, interrupted());
    if (self->_interruptionHandler) self->_interruptionHandler();
    if (!isOver) return;
    if (Job handler = std::exchange(self->_invalidationHandler, nullptr)) handler();
    self->release();
  });
}

void SimulatedConnectionEnd::cutLine() {
  if (_outgoing != nullptr) _outgoing->cut();
}

void SimulatedConnectionEnd::vanish() {
  _isDeaf = true;
  _state = State::Invalid;
  attach(nullptr, nullptr, nullptr);
  const auto pending = std::exchange(_pending, {});
  const auto waiting = std::exchange(_waitingForLine, {});
  const Job invalidationHandler = std::exchange(_invalidationHandler, nullptr);
  const auto keepsAlive = std::exchange(_selfUntilSent, nullptr);
  release();
}

bool SimulatedConnectionEnd::peerHasEntitlement(const std::string& name) const {
  return _side == Side::Accepting && _other != nullptr && _other->entitlements.count(name) != 0;
}

PeerIdentity SimulatedConnectionEnd::peerIdentity() const {
  return _other != nullptr ? _other->identity : PeerIdentity();
}

std::string SimulatedConnectionEnd::description() const {
  if (_other == nullptr) return "service " + _serviceName;
  return fmt::format("pid {} ({})", _other->processIdentifier, _other->name);
}

void SimulatedConnectionEnd::fail(PendingCalls& calls, const Error& error) {
  for (auto& [call, pending] : calls) {
    if (pending.onError) pending.onError(error);
  }
}

}  // namespace telvane::testing
