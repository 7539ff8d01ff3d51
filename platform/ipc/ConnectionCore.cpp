#include "platform/ipc/ConnectionCore.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <iterator>
#include <utility>

#include "platform/ipc/UnixSocket.h"
#include "platform/ipc/WireCoding.h"

namespace telvane::ipc {

namespace {

constexpr std::chrono::milliseconds kRefusalTime{1000};

Error connectionError(int code, std::string text) {
  return Error::withDescription(kPlatformErrorDomain, code, String(text));
}

Error interruptionError(const std::string& description) {
  return connectionError(ECONNRESET, fmt::format("The connection to {} was interrupted", description));
}

Error invalidError(const std::string& description) {
  return connectionError(ECANCELED, fmt::format("The connection to {} has been invalidated", description));
}

// Whether there is no such service, as far as this process is concerned; anything else may pass.
bool isAbsence(int64_t code) {
  return code == ENOENT || code == ECONNREFUSED || code == ENOTDIR || code == EACCES || code == EPERM ||
         code == ENAMETOOLONG;
}

void tellOutcome(OutgoingCall& call, const Error& dropped) {
  if (call.outcome == OutgoingCall::Outcome::Answered) {
    call.reply(std::move(call.answer));
  } else if (call.outcome == OutgoingCall::Outcome::Dropped && call.onError) {
    call.onError(dropped);
  }
}

bool hasHandlers(const std::vector<OutgoingCall>& calls) {
  for (const auto& call : calls) {
    if (call.reply || call.onError) return true;
  }
  return false;
}

}  // namespace

std::shared_ptr<ConnectionCore> ConnectionCore::newConnecting(Parts parts, std::string path) {
  std::shared_ptr<ConnectionCore> core(new ConnectionCore(std::move(parts), std::move(path)));
  core->_executor = std::make_shared<CallExecutor>(core->_parts.queue, core->_parts.gate, [weak = std::weak_ptr(core)] {
    if (const auto self = weak.lock()) self->postPump();
  });
  return core;
}

std::shared_ptr<ConnectionCore> ConnectionCore::newAccepting(Parts parts) {
  return newConnecting(std::move(parts), {});
}

ConnectionCore::ConnectionCore(Parts parts, std::string path)
    : _parts(std::move(parts)), _path(std::move(path)), _outbox(_parts.limits) {}

void ConnectionCore::setInterruptionHandler(Job handler) {
  auto kept = std::make_shared<Job>(std::move(handler));
  MutexLock lock(_mutex);
  _interruptionHandler.swap(kept);
}

void ConnectionCore::setInvalidationHandler(Job handler) {
  MutexLock lock(_mutex);
  std::swap(_invalidationHandler, handler);
}

void ConnectionCore::setOnInvalidated(Job job) {
  MutexLock lock(_mutex);
  _onInvalidated = std::move(job);
}

void ConnectionCore::resume() {
  {
    MutexLock lock(_mutex);
    if (_life != Life::New) return;
    _life = Life::Resumed;
  }
  _executor->resume();
  if (_path.empty()) return postPump();
  const bool isPosted = _parts.loop->post([self = shared_from_this()] { self->connect(); });
  if (!isPosted) invalidate();
}

void ConnectionCore::send(OutgoingCall call) {
  const auto measure = wirecoding::measure(call.invocation.arguments);
  if (measure.isTooDeep) {
    return fail(std::move(call.onError), connectionError(EINVAL, "An argument is nested deeper than 64 levels"));
  }
  switch (_outbox.add(call, measure.wireBytes, measure.textBytes)) {
    case Outbox::Admission::Queued:
      return;
    case Outbox::Admission::QueuedMustPump:
      return postPump();
    case Outbox::Admission::Full:
      if (call.invocation.isDroppedSilently) return;
      return fail(std::move(call.onError),
                  connectionError(ENOBUFS, fmt::format("Too many calls wait for {}", description())));
    case Outbox::Admission::Closed:
      return fail(std::move(call.onError), invalidError(description()));
  }
}

void ConnectionCore::fail(Connection::ErrorHandler onError, Error error) {
  if (!onError) return;
  _parts.queue->async([onError = std::move(onError), error = std::move(error)]() mutable { onError(error); });
}

// When the service has ended its connections, there is no loop any more, and this one is over too.
void ConnectionCore::postPump() {
  if (!_parts.loop->post([self = shared_from_this()] { self->pump(); })) invalidate();
}

bool ConnectionCore::hasBeenResumed() {
  MutexLock lock(_mutex);
  return _life != Life::New;
}

bool ConnectionCore::becomeInvalid(Life& before) {
  _hasEnded.store(true, std::memory_order_release);
  MutexLock lock(_mutex);
  before = std::exchange(_life, Life::Invalid);
  return before != Life::Invalid;
}

void ConnectionCore::letGo() {
  auto trash = std::make_shared<std::pair<std::shared_ptr<Job>, Job>>();
  {
    MutexLock lock(_mutex);
    if (_life == Life::Invalid) return;
    std::swap(trash->first, _interruptionHandler);
    std::swap(trash->second, _invalidationHandler);
  }
  // What they hold goes on the queue, where nothing of this connection runs meanwhile.
  _parts.queue->async([trash = std::move(trash)]() mutable { trash = nullptr; });
  invalidate();
}

void ConnectionCore::invalidate() {
  Life before = Life::New;
  if (!becomeInvalid(before)) return;
  _outbox.close();
  _executor->close();
  const auto deliver = before == Life::Resumed ? Deliver::Yes : Deliver::No;
  const bool isPosted = _parts.loop->post([self = shared_from_this(), deliver] { self->closeOnLoop(deliver); });
  if (!isPosted) finish(takeWaiting(), invalidError(description()));
}

// Fails what has no answer, then tells of the end, behind whatever runs for this connection now.
void ConnectionCore::finish(std::vector<OutgoingCall> unanswered, Error error) {
  _executor->addBarrier(
      [self = shared_from_this(), unanswered = std::move(unanswered), error = std::move(error)]() mutable {
        for (auto& call : unanswered) {
          if (call.onError && call.outcome == OutgoingCall::Outcome::Open) call.onError(error);
        }
        unanswered.clear();
        self->runInvalidationHandler();
      });
}

void ConnectionCore::runInterruptionHandler() {
  const auto handler = [this] {
    MutexLock lock(_mutex);
    return _interruptionHandler;
  }();
  if (handler && *handler) (*handler)();
}

void ConnectionCore::runInvalidationHandler() {
  Job handler;
  Job onInvalidated;
  std::shared_ptr<Job> interruptionHandler;
  {
    MutexLock lock(_mutex);
    std::swap(handler, _invalidationHandler);
    std::swap(onInvalidated, _onInvalidated);
    std::swap(interruptionHandler, _interruptionHandler);
  }
  if (handler) handler();
  handler = nullptr;
  _executor->releaseObject();
  if (onInvalidated) onInvalidated();
}

void ConnectionCore::logDropped(uint64_t count) {
  if (count == 0) return;
  _parts.log.error("localConnection: {} calls to {} were dropped, because {} MiB waited for it already", count,
                   description(), _parts.limits.maximumWaitingBytes >> 20);
}

void ConnectionCore::attach(Descriptor socket, Job onAsked) {
  _onAsked = std::move(onAsked);
  _parts.loop->add(shared_from_this());
  _outbox.standStill();
  _line = newLine(Line::Side::Accepting, std::move(socket));
  if (!_line) leave();
}

std::shared_ptr<Line> ConnectionCore::newLine(Line::Side side, Descriptor socket) {
  ++_lineNumber;
  std::shared_ptr<Line> line;
  KJ_IF_MAYBE (failure, kj::runCatchingExceptions([&] {
                 line = std::make_shared<Line>(*this, *_parts.loop, _parts.limits, side, std::move(socket));
               })) {
    _parts.log.error("localConnection: no line to {}: {}", description(), failure->getDescription().cStr());
  }
  return line;
}

void ConnectionCore::decide(bool isAccepted) {
  _parts.loop->post([self = shared_from_this(), isAccepted] {
    if (self->_line) self->_line->decide(isAccepted);
  });
}

void ConnectionCore::connect() {
  if (_line || _isConnecting || _isClosing) return;
  _isConnecting = true;
  _parts.loop->add(shared_from_this());
  _outbox.standStill();
  tryConnect(0);
}

void ConnectionCore::tryConnect(unsigned attempts) {
  if (!_isConnecting) return;
  constexpr unsigned kMostAttempts = 3000;
  auto socket = unixsocket::connectTo(_path);
  if (!socket && socket.error().code() == EAGAIN && attempts < kMostAttempts) {
    _retry = _parts.loop->after(_parts.limits.connectPause,
                                [self = shared_from_this(), attempts] { self->tryConnect(attempts + 1); });
    return;
  }
  _isConnecting = false;
  if (!socket) return cannotConnect(socket.error());
  _line = newLine(Line::Side::Connecting, std::move(*socket));
  if (!_line) cannotConnect(connectionError(ENOMEM, "No memory for a connection"));
}

void ConnectionCore::cannotConnect(const Error& error) {
  if (isAbsence(error.code())) return refuseToGoOn(error);
  _parts.log.error("localConnection: {}", error.description());
  auto unanswered = takeEverything();
  leave();
  if (!_isClosing) interrupted(std::move(unanswered));
}

// The service is not there, or does not want us.
void ConnectionCore::refuseToGoOn(const Error& error) {
  auto unanswered = takeEverything();
  leave();
  Life before = Life::New;
  if (!becomeInvalid(before)) return;
  _outbox.close();
  _executor->close();
  _isClosing = true;
  finish(std::move(unanswered), error);
}

void ConnectionCore::pump() {
  if (!hasBeenResumed()) return _outbox.standStill();
  if (!_line) {
    if (!_outbox.isEmpty() && !_path.empty()) connect();
    return;
  }
  if (!_line->isOpen()) return _outbox.standStill();
  while (auto batch = _outbox.take(_line->batchesUnderWay())) _line->deliver(std::move(*batch));
  if (_isClosing) tryFarewell();
}

void ConnectionCore::closeOnLoop(Deliver deliver) {
  if (_isClosing) return;
  auto handlers = _line ? _line->takeHandlers() : std::vector<OutgoingCall>();
  auto waiting = _outbox.takeHandlers();
  std::move(waiting.begin(), waiting.end(), std::back_inserter(handlers));
  // What wants no answer is delivered still, so nobody hears of a failure; its handler only goes, where handlers go.
  for (auto& call : handlers) {
    if (deliver == Deliver::Yes && !call.reply) call.outcome = OutgoingCall::Outcome::Answered;
  }
  finish(std::move(handlers), invalidError(description()));
  if (deliver == Deliver::Yes && !_line && !_outbox.isEmpty()) connect();
  _isClosing = true;
  // A peer that was refused reads that before it closes its end.
  const bool isRefused = deliver == Deliver::No && _line && _path.empty() && !_onAsked;
  if ((deliver == Deliver::No && !isRefused) || (!_line && !_isConnecting)) {
    takeEverything();
    return leave();
  }
  const auto patience = isRefused ? std::min(kRefusalTime, _parts.limits.lingerTime) : _parts.limits.lingerTime;
  _linger = _parts.loop->after(patience, [self = shared_from_this()] { self->endNow(); });
  if (!isRefused) pump();
}

void ConnectionCore::tryFarewell() {
  const bool isBusy = !_outbox.isEmpty() || _line->batchesUnderWay() > 0 || _executor->isExecuting();
  if (isBusy || std::exchange(_hasSaidFarewell, true)) return;
  _line->farewell();
}

void ConnectionCore::endNow() {
  const auto undelivered = takeEverything();
  if (!undelivered.empty()) {
    _parts.log.error("localConnection: {} calls to {} could not be delivered in time", undelivered.size(),
                     description());
  }
  leave();
}

// Takes the line down, after the event that runs now, and leaves the loop unless the next call connects again.
void ConnectionCore::leave() {
  _isConnecting = false;
  _parts.loop->cancel(std::exchange(_linger, 0));
  _parts.loop->cancel(std::exchange(_retry, 0));
  _onAsked = nullptr;
  if (_line) _parts.loop->post([line = std::exchange(_line, nullptr)]() mutable { line = nullptr; });
  _parts.loop->remove(shared_from_this());
}

std::vector<OutgoingCall> ConnectionCore::takeWaiting() {
  std::vector<OutgoingCall> calls;
  for (auto& batch : _outbox.takeAll()) {
    std::move(batch.calls.begin(), batch.calls.end(), std::back_inserter(calls));
  }
  return calls;
}

std::vector<OutgoingCall> ConnectionCore::takeEverything() {
  size_t memoryBytes = 0;
  auto calls = _line ? _line->takeUnanswered(memoryBytes) : std::vector<OutgoingCall>();
  auto waiting = takeWaiting();
  std::move(waiting.begin(), waiting.end(), std::back_inserter(calls));
  _outbox.settle(memoryBytes);
  logDropped(_outbox.takeDropped());
  return calls;
}

void ConnectionCore::lineAsked() {
  if (Job asked = std::exchange(_onAsked, nullptr)) asked();
}

void ConnectionCore::lineOpened() { pump(); }

void ConnectionCore::lineRefused() {
  refuseToGoOn(connectionError(ECONNREFUSED, fmt::format("The connection to {} was refused", description())));
}

void ConnectionCore::lineReceived(uint64_t batch, std::vector<IncomingCall> calls) {
  const std::weak_ptr weak(shared_from_this());
  const uint64_t line = _lineNumber;
  const auto onLine = [weak, line](auto&& act) {
    const auto self = weak.lock();
    if (!self) return;
    self->_parts.loop->post([self, line, act = std::forward<decltype(act)>(act)]() mutable {
      if (self->_line && self->_lineNumber == line) act(*self->_line);
    });
  };
  _executor->add(
      std::move(calls),
      [onLine, batch, weak](Replies replies) {
        if (const auto self = weak.lock()) {
          for (auto& reply : replies) self->checkReply(reply);
        }
        onLine([batch, replies = std::move(replies)](Line& to) mutable { to.finishBatch(batch, std::move(replies)); });
      },
      [onLine, weak](Reply reply) {
        if (const auto self = weak.lock()) self->checkReply(reply);
        onLine([reply = std::move(reply)](Line& to) mutable { to.answer(std::move(reply)); });
      });
}

// What cannot cross is dropped, so that the caller's error handler hears of it.
void ConnectionCore::checkReply(Reply& reply) {
  const bool isTooLarge = reply.wireBytes > _parts.limits.maximumMessageBytes / 2;
  if (!reply.isTooDeep && !isTooLarge) return;
  _parts.log.error("localConnection: a reply to {} was dropped: it is {}", description(),
                   reply.isTooDeep ? "nested too deep" : "too large");
  reply = Reply{.replyID = reply.replyID, .isDropped = true};
}

void ConnectionCore::lineDelivered(OutgoingBatch batch) {
  logDropped(_outbox.settle(batch.memoryBytes));
  if (hasHandlers(batch.calls)) lineAnswered(std::move(batch.calls));
  pump();
}

void ConnectionCore::lineAnswered(std::vector<OutgoingCall> calls) {
  _parts.queue->async([self = shared_from_this(), calls = std::move(calls)]() mutable {
    const Error dropped =
        connectionError(ENOMSG, fmt::format("A call to {} was left without an answer", self->description()));
    for (auto& call : calls) tellOutcome(call, dropped);
  });
}

void ConnectionCore::lineDrained() { leave(); }

void ConnectionCore::lineEnded(const std::string& reason) {
  if (!_line) return;
  if (_path.empty()) _hasEnded.store(true, std::memory_order_release);
  if (!reason.empty()) _parts.log.error("localConnection: connection to {} ended: {}", description(), reason);
  const bool wasNeverAsked = static_cast<bool>(_onAsked);
  auto unanswered = takeEverything();
  leave();
  if (wasNeverAsked) return;  // nobody knows of this connection
  if (!_isClosing) return interrupted(std::move(unanswered));
  if (unanswered.empty()) return;
  _parts.log.error("localConnection: {} calls to {} were lost, because it ended the connection", unanswered.size(),
                   description());
}

// Behind what has come before the end: that is executed still. On the accepting side perhaps even before the listener's
// delegate has decided; then it hears of the end once it has.
void ConnectionCore::interrupted(std::vector<OutgoingCall> unanswered) {
  const bool isOver = _path.empty();
  if (isOver) {
    _outbox.close();
    _isClosing = true;
  }
  _executor->addBarrier([self = shared_from_this(), unanswered = std::move(unanswered), isOver]() mutable {
    self->tellInterruption(std::move(unanswered), isOver);
  });
}

void ConnectionCore::tellInterruption(std::vector<OutgoingCall> unanswered, bool isOver) {
  const Error error = interruptionError(description());
  for (auto& call : unanswered) {
    if (call.onError) call.onError(error);
  }
  unanswered.clear();
  runInterruptionHandler();
  if (!isOver) return;
  Life before = Life::New;
  becomeInvalid(before);
  runInvalidationHandler();
}

}  // namespace telvane::ipc
