#include "tests/support/SimulatedChannel.h"

#include <fcntl.h>

#include <algorithm>
#include <utility>

#include "tests/support/SimulatedConnectionEnd.h"

namespace telvane::testing {

namespace {

// The kernel gives the receiver a descriptor of its own number; the sender's is closed.
ipc::Descriptor duplicate(const ipc::Descriptor& descriptor) {
  return descriptor.isValid() ? ipc::Descriptor(::fcntl(descriptor.get(), F_DUPFD_CLOEXEC, 0)) : ipc::Descriptor();
}

}  // namespace

SimulatedChannel::SimulatedChannel(SimulatedScheduler& scheduler, SimulatedLatency latency,
                                   std::shared_ptr<SimulatedPeer> sender,
                                   std::weak_ptr<SimulatedConnectionEnd> receiver)
    : _scheduler(scheduler), _latency(latency), _sender(std::move(sender)), _receiver(std::move(receiver)) {}

void SimulatedChannel::push(SimulatedMessage message) {
  if (_isClosed || !_sender->isAlive) return;
  _isClosed = message.kind == SimulatedMessage::Kind::Closed;
  enqueue(std::move(message));
}

void SimulatedChannel::open(SimulatedMessage first) {
  _messages.push_front(UnderWay{_scheduler.now() + _latency.minimum, std::move(first)});
  _isHeld = false;
  schedulePump();
}

void SimulatedChannel::cut() {
  std::deque<UnderWay> lost;
  const size_t kept = _scheduler.choose(_messages.size() + 1);
  while (_messages.size() > kept) {
    lost.push_back(std::move(_messages.back()));
    _messages.pop_back();
  }
  if (std::exchange(_isClosed, true) && lost.empty()) return;
  _isHeld = false;
  enqueue(SimulatedMessage{SimulatedMessage::Kind::Closed});
}

void SimulatedChannel::enqueue(SimulatedMessage message) {
  message.invocation.descriptor = duplicate(message.invocation.descriptor);
  const auto spread = static_cast<size_t>((_latency.maximum - _latency.minimum).count()) + 1;
  const auto latency = _latency.minimum + std::chrono::nanoseconds(_scheduler.choose(spread));
  _lastArrival = std::max(_lastArrival, _scheduler.now() + latency);
  _messages.push_back(UnderWay{_lastArrival, std::move(message)});
  schedulePump();
}

void SimulatedChannel::schedulePump() {
  if (_isScheduled || _isHeld || _messages.empty()) return;
  _isScheduled = true;
  auto deliver = [self = shared_from_this()] {
    self->_isScheduled = false;
    self->pump();
  };
  const auto remaining = _messages.front().arrival - _scheduler.now();
  if (remaining <= std::chrono::nanoseconds::zero()) {
    return _scheduler.schedule(SimulatedScheduler::kNoProcess, "delivery from " + _sender->name, std::move(deliver));
  }
  _scheduler.startTimer(SimulatedScheduler::kNoProcess, remaining, [self = shared_from_this()] {
    self->_isScheduled = false;
    self->schedulePump();
  });
}

void SimulatedChannel::pump() {
  if (_isHeld || _messages.empty()) return;
  const auto receiver = _receiver.lock();
  if (receiver == nullptr || !receiver->peer().isAlive) {
    const auto lost = std::exchange(_messages, {});
    return;
  }
  if (!receiver->canReceive() || waitsForGate(*receiver)) return;
  SimulatedMessage message = std::move(_messages.front().message);
  _messages.pop_front();
  schedulePump();
  receiver->receive(*this, std::move(message));
}

bool SimulatedChannel::waitsForGate(SimulatedConnectionEnd& receiver) {
  FlowGate* gate = receiver.peer().gate;
  if (_messages.front().message.kind != SimulatedMessage::Kind::Call || gate == nullptr || gate->isOpen()) return false;
  _isScheduled = true;
  gate->whenOpen([self = weak_from_this()] {
    const auto channel = self.lock();
    if (channel == nullptr) return;
    channel->_isScheduled = false;
    channel->schedulePump();
  });
  return true;
}

}  // namespace telvane::testing
