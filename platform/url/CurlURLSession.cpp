#include "platform/url/CurlURLSession.h"

#include <algorithm>
#include <utility>

#include "platform/url/UploadFile.h"

namespace telvane {

namespace {

Error sessionError(URLErrorCode code, const char* text) {
  return Error::withDescription(kPlatformErrorDomain, static_cast<int64_t>(code), text);
}

Error cancelledError() { return sessionError(URLErrorCode::Cancelled, "The request was cancelled"); }

Error timedOutError() {
  return sessionError(URLErrorCode::TimedOut, "The request timed out while it waited for a network");
}

Error invalidatedError() { return sessionError(URLErrorCode::SessionInvalidated, "The session has been invalidated"); }

}  // namespace

CurlURLSession::CurlURLSession(std::shared_ptr<const CurlEnvironment> environment,
                               URLSessionConfiguration configuration, std::shared_ptr<URLSessionDelegate> delegate,
                               std::shared_ptr<SerialQueue> delegateQueue)
    : _environment(std::move(environment)),
      _configuration(std::move(configuration)),
      _delegateQueue(std::move(delegateQueue)),
      _delegate(std::move(delegate)) {}

Result<std::shared_ptr<URLSessionTask>> CurlURLSession::newDataTask(URLRequest request) {
  if (!isActive()) return invalidatedError();
  if (const Result<void> usable = CurlTransfer::check(request); !usable) return usable.error();
  if (request.bodyFile != nullptr) request.body = Data();
  return std::shared_ptr<URLSessionTask>(std::make_shared<CurlURLSessionTask>(shared_from_this(), std::move(request)));
}

Result<std::shared_ptr<URLSessionTask>> CurlURLSession::newUploadTask(URLRequest request, const std::string& path) {
  Result<std::unique_ptr<UploadFile>> file = UploadFile::open(path);
  if (!file) return file.error();
  request.bodyFile = std::move(*file);
  return newDataTask(std::move(request));
}

bool CurlURLSession::isActive() const {
  const MutexLock lock(_mutex);
  return _state == State::Active;
}

void CurlURLSession::finishTasksAndInvalidate() {
  {
    const MutexLock lock(_mutex);
    if (_state != State::Active) return;
    _state = State::Finishing;
  }
  _environment->loop->post([self = shared_from_this()] {
    self->enterLoop();
    self->endIfFinished();
  });
}

void CurlURLSession::cancelUnlessFinishing() {
  {
    const MutexLock lock(_mutex);
    if (_state != State::Active) return;
    _state = State::Finishing;
  }
  _environment->loop->post([self = shared_from_this()] {
    self->enterLoop();
    self->cancelAll();
    self->endIfFinished();
  });
}

void CurlURLSession::resume(std::shared_ptr<CurlURLSessionTask> task) {
  State state = State::Invalid;
  {
    const MutexLock lock(_mutex);
    if (_state == State::Invalid) return;
    state = _state;
    ++_resumedTasks;
  }
  if (_environment->flowGate != nullptr) _environment->flowGate->add(task->heldBytes());
  const auto allowed = task->request().timeout.value_or(_environment->options.resourceTimeout);
  const Time deadline = std::chrono::steady_clock::now() + allowed;
  _environment->loop->post([self = shared_from_this(), task = std::move(task), state, deadline]() mutable {
    self->start(std::move(task), state, deadline);
  });
}

void CurlURLSession::enterLoop() {
  CurlLoop& loop = *_environment->loop;
  if (!_multi) {
    loop.join(shared_from_this());
    _multi = std::make_unique<CurlMulti>(loop, *this);
  }
  loop.noteChanged(*this);
}

void CurlURLSession::start(std::shared_ptr<CurlURLSessionTask> task, State stateAtResume, Time deadline) {
  enterLoop();
  CurlURLSessionTask* key = task.get();
  Running& running = _running[key];
  running.task = std::move(task);
  running.deadline = deadline;
  running.retryDelay = _environment->options.firstRetryDelay;
  if (stateAtResume != State::Active) return complete(running, invalidatedError());
  if (_isCancelled) return complete(running, cancelledError());
  tryNow(running);
}

void CurlURLSession::tryNow(Running& running) {
  const auto remaining = std::chrono::ceil<std::chrono::milliseconds>(running.deadline - CurlLoop::Time::clock::now());
  if (remaining.count() <= 0) return complete(running, timedOutError());
  running.transfer = std::make_unique<CurlTransfer>(*_environment, *_multi, *running.task, _events, remaining);
}

void CurlURLSession::socketReady(int socket, int events) {
  if (_multi) _multi->socketReady(socket, events);
}

void CurlURLSession::timerFired() {
  if (_multi) _multi->timerFired();
}

void CurlURLSession::turnEnded() {
  while (_multi) {
    const CurlMulti::Done done = _multi->nextDone();
    if (done.handle == nullptr) break;
    transferDone(done);
  }
  flush();
}

void CurlURLSession::transferDone(const CurlMulti::Done& done) {
  Running& running = _running.at(&CurlTransfer::taskOf(done.handle));
  std::optional<Error> error = running.transfer->finish(done.result);
  if (error && isWorthWaiting(*error)) return waitForNetwork(running);
  complete(running, std::move(error));
}

bool CurlURLSession::isWorthWaiting(const Error& error) const {
  if (!_configuration.waitsForConnectivity) return false;
  const auto code = static_cast<URLErrorCode>(error.code());
  return code == URLErrorCode::NotConnectedToNetwork || code == URLErrorCode::CannotFindHost;
}

void CurlURLSession::waitForNetwork(Running& running) {
  running.transfer = nullptr;
  const auto remaining = std::chrono::ceil<std::chrono::milliseconds>(running.deadline - CurlLoop::Time::clock::now());
  if (remaining.count() <= 0) return complete(running, timedOutError());
  const std::chrono::milliseconds delay = std::min(running.retryDelay, remaining);
  running.retryDelay = std::min(running.retryDelay * 2, _environment->options.longestRetryDelay);
  _environment->log.info("URLSession <{}>:<{}> waits for a network, tries again in {} ms", _description,
                         running.task->taskDescription(), delay.count());
  if (!_retryQueue) _retryQueue = _environment->dispatch.newSerialQueue("telvane.url.retry");
  Job retry = [self = weak_from_this(), task = running.task.get()] {
    const std::shared_ptr<CurlURLSession> session = self.lock();
    if (session) session->_environment->loop->post([session, task] { session->retry(task); });
  };
  running.retryTimer = _environment->dispatch.newTimer(_retryQueue, delay, delay / 10, std::move(retry), Job());
}

void CurlURLSession::retry(CurlURLSessionTask* task) {
  const auto found = _running.find(task);
  if (found == _running.end() || found->second.transfer) return;
  _environment->loop->noteChanged(*this);
  Running& running = found->second;
  const bool hasTime = running.deadline > CurlLoop::Time::clock::now();
  if (hasTime && !_environment->options.connectivityProbe->hasNetwork()) return waitForNetwork(running);
  tryNow(running);
}

void CurlURLSession::complete(Running& running, std::optional<Error> error) {
  const std::shared_ptr<CurlURLSessionTask> task = std::move(running.task);
  _running.erase(task.get());
  task->releaseRequest();
  if (_environment->flowGate != nullptr) _environment->flowGate->subtract(task->heldBytes());
  _events.didComplete(*task, std::move(error));
  {
    const MutexLock lock(_mutex);
    --_resumedTasks;
  }
  endIfFinished();
}

void CurlURLSession::cancel(CurlURLSessionTask* task) {
  const auto found = _running.find(task);
  if (found == _running.end()) return;
  _environment->loop->noteChanged(*this);
  complete(found->second, cancelledError());
}

void CurlURLSession::cancelAll() {
  _isCancelled = true;
  while (!_running.empty()) complete(_running.begin()->second, cancelledError());
}

void CurlURLSession::endIfFinished() {
  {
    const MutexLock lock(_mutex);
    if (_state != State::Finishing || _resumedTasks > 0) return;
    _state = State::Invalid;
  }
  _events.didBecomeInvalid();
  _multi = nullptr;
  _environment->loop->leave(*this);
}

void CurlURLSession::loopEnded() {
  {
    const MutexLock lock(_mutex);
    if (_state == State::Active) _state = State::Finishing;
  }
  cancelAll();
  endIfFinished();
  flush();
  _multi = nullptr;
}

void CurlURLSession::flush() {
  std::vector<CurlEvents::Event> events = _events.take();
  if (events.empty()) return;
  _delegateQueue->async([self = shared_from_this(), events = std::move(events)]() mutable { self->deliver(events); });
}

void CurlURLSession::deliver(std::vector<CurlEvents::Event>& events) {
  for (CurlEvents::Event& event : events) {
    if (auto* head = std::get_if<CurlEvents::Head>(&event.what)) {
      deliver(*event.task, *head);
    } else if (auto* body = std::get_if<CurlEvents::Body>(&event.what)) {
      deliver(*event.task, *body);
    } else if (auto* sent = std::get_if<CurlEvents::Sent>(&event.what)) {
      _delegate->didSendBodyData(*this, *event.task, sent->total, sent->expected);
    } else if (auto* completed = std::get_if<CurlEvents::Completed>(&event.what)) {
      deliver(*event.task, *completed);
    } else {
      std::exchange(_delegate, nullptr)->didBecomeInvalidWithError(*this, std::nullopt);
    }
  }
}

void CurlURLSession::deliver(CurlURLSessionTask& task, CurlEvents::Head& head) {
  task.setResponse(std::move(head.response));
  if (_delegate->didReceiveResponse(*this, task) == URLSessionDelegate::ResponseDisposition::Allow) return;
  task.refuse();
  _environment->loop->post([self = shared_from_this(), held = task.shared_from_this()] { self->cancel(held.get()); });
}

void CurlURLSession::deliver(CurlURLSessionTask& task, CurlEvents::Body& body) {
  if (task.isRefused()) return;
  _delegate->didReceiveData(*this, task, Data(std::move(body.bytes)));
}

void CurlURLSession::deliver(CurlURLSessionTask& task, CurlEvents::Completed& completed) {
  // The transfer may have ended well before the loop heard of the refusal.
  if (task.isRefused()) completed.error = cancelledError();
  _delegate->didCompleteWithError(*this, task, completed.error);
}

}  // namespace telvane
