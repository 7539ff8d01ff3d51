#include "tests/support/ScriptedURLSessionTask.h"

#include <utility>

namespace telvane::testing {

ScriptedURLSessionTask::ScriptedURLSessionTask(std::shared_ptr<ScriptedURLSession> session, URLRequest request,
                                               bool isUpload)
    : _session(std::move(session)), _isUpload(isUpload), _request(std::move(request)) {}

void ScriptedURLSessionTask::resume() {
  if (_state != State::Suspended) return;
  _state = State::WaitingForConnectivity;
  const auto& environment = _session->environment();
  _record =
      &environment.network.record(RecordedRequest{environment.processName, _session->sessionDescription(), _description,
                                                  _request, _session->configuration(), _isUpload, scheduler().now()});
  if (environment.gate != nullptr && !_isUpload) environment.gate->add(_request.body.size());
  const bool wasActive = _session->isActive();
  _session->started(shared_from_this());
  if (!wasActive) return complete(networkError(URLErrorCode::SessionInvalidated));
  const std::chrono::nanoseconds allowed = _request.timeout.value_or(ScriptedNetwork::kResourceTimeout);
  _timeout = scheduler().startTimer(
      process(), allowed, [self = shared_from_this()] { self->complete(networkError(URLErrorCode::TimedOut)); });
  if (environment.network._isConnected) return leave();
  if (!_session->configuration().waitsForConnectivity) complete(networkError(URLErrorCode::NotConnectedToNetwork));
}

void ScriptedURLSessionTask::connectivityCame() {
  if (_state == State::WaitingForConnectivity) leave();
}

void ScriptedURLSessionTask::connectionBroke() {
  if (_state == State::Running) complete(networkError(URLErrorCode::NetworkConnectionLost));
}

void ScriptedURLSessionTask::cancel() { complete(networkError(URLErrorCode::Cancelled)); }

void ScriptedURLSessionTask::vanish() {
  stopTimers();
  _state = State::Completed;
}

void ScriptedURLSessionTask::leave() {
  _state = State::Running;
  _record->leftAt = scheduler().now();
  _answer = _session->environment().network.answerFor(_request);
  restartIdleTimer();
  if (_answer.response || _answer.error) after(_answer.delay, &ScriptedURLSessionTask::headCame);
}

void ScriptedURLSessionTask::headCame() {
  restartIdleTimer();
  if (!_answer.response) return complete(_answer.error);
  if (_answer.response->url.empty()) _answer.response->url = _request.url;
  _session->tellDelegate(
      [self = shared_from_this(), size = static_cast<int64_t>(_request.body.size())](auto& delegate) {
        if (size > 0) delegate.didSendBodyData(*self->_session, *self, size, size);
      });
  deliverHead();
}

void ScriptedURLSessionTask::deliverHead() {
  _session->tellDelegate([self = shared_from_this()](URLSessionDelegate& delegate) {
    self->_response = self->_answer.response;
    const auto disposition = delegate.didReceiveResponse(*self->_session, *self);
    if (disposition == URLSessionDelegate::ResponseDisposition::Cancel) return self->cancel();
    if (self->_state == State::Running) self->after(self->_answer.pieceDelay, &ScriptedURLSessionTask::nextPiece);
  });
}

void ScriptedURLSessionTask::nextPiece() {
  restartIdleTimer();
  if (_nextPiece == _answer.pieces.size()) return complete(_answer.error);
  _session->tellDelegate([self = shared_from_this(), piece = std::move(_answer.pieces[_nextPiece])](
                             URLSessionDelegate& delegate) { delegate.didReceiveData(*self->_session, *self, piece); });
  ++_nextPiece;
  // After the last piece the end is known at once.
  if (_nextPiece == _answer.pieces.size()) return complete(_answer.error);
  after(_answer.pieceDelay, &ScriptedURLSessionTask::nextPiece);
}

void ScriptedURLSessionTask::complete(std::optional<Error> error) {
  if (std::exchange(_state, State::Completed) == State::Completed) return;
  stopTimers();
  _record->completedAt = scheduler().now();
  _record->error = error;
  const size_t bodySize = _request.body.size();
  _request.body = Data();
  const auto self = shared_from_this();
  _session->tellDelegate([self, error = std::move(error)](URLSessionDelegate& delegate) {
    delegate.didCompleteWithError(*self->_session, *self, error);
  });
  FlowGate* gate = _session->environment().gate;
  if (gate != nullptr && !_isUpload) gate->subtract(bodySize);
  _session->completed(self);
}

void ScriptedURLSessionTask::restartIdleTimer() {
  scheduler().cancelTimer(_idleTimer);
  if (_request.timeout) return;  // its own time-out is all that counts
  _idleTimer = scheduler().startTimer(process(), ScriptedNetwork::kIdleTimeout, [self = shared_from_this()] {
    self->complete(networkError(URLErrorCode::TimedOut));
  });
}

void ScriptedURLSessionTask::after(std::chrono::nanoseconds delay, void (ScriptedURLSessionTask::*step)()) {
  const auto& environment = _session->environment();
  auto run = [self = shared_from_this(), step] {
    if (self->_state == State::Running) (*self.*step)();
  };
  auto arrive = [&scheduler = environment.scheduler, process = environment.process, run = std::move(run)]() mutable {
    scheduler.schedule(process, "network", std::move(run));
  };
  if (delay > std::chrono::nanoseconds::zero()) {
    _stepTimer = scheduler().startTimer(environment.process, delay, std::move(arrive));
  } else {
    arrive();
  }
}

void ScriptedURLSessionTask::stopTimers() {
  for (SimulatedScheduler::TimerID timer : {_timeout, _idleTimer, _stepTimer}) scheduler().cancelTimer(timer);
}

}  // namespace telvane::testing
