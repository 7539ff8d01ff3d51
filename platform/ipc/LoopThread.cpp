#include "platform/ipc/LoopThread.h"

#include <kj/debug.h>
#include <kj/exception.h>

#include <system_error>

#include "platform/ipc/EpollPort.h"

namespace telvane::ipc {

namespace {

// What the library would print goes to our log, and it takes no back traces: a host's standard error is not ours, and
// a peer that misbehaves is no reason to walk the stack.
class QuietLibrary final : public kj::ExceptionCallback {
 public:
  explicit QuietLibrary(Log& log) : _log(log) {}
  void logMessage(kj::LogSeverity, const char*, int, int, kj::String&& text) override {
    _log.info("localConnection: {}", std::string_view(text.begin(), text.size()));
  }
  StackTraceMode stackTraceMode() override { return StackTraceMode::NONE; }

 private:
  Log& _log;
};

thread_local const LoopThread* currentLoop = nullptr;

}  // namespace

struct LoopThread::Delayed {
  kj::Promise<void> promise;
};

LoopThread::LoopThread(Log& log) : _log(log) {}

LoopThread::~LoopThread() = default;

bool LoopThread::isCurrent() const noexcept { return currentLoop == this; }

bool LoopThread::post(Job job) {
  bool mustWake = false;
  {
    MutexLock lock(_mutex);
    if (_phase == Phase::Ended || (_phase == Phase::New && !start())) return false;
    mustWake = _jobs.empty() && !isCurrent();
    _jobs.push_back(std::move(job));
  }
  if (mustWake) _port->wake();
  return true;
}

bool LoopThread::start() {
  try {
    // On first use the library makes statics of its own. Made here, not on the new thread: a fork of the host in the
    // middle of that would leave them half-made in the child for ever, whose loop would wait for them.
    static_cast<void>(kj::getExceptionCallback());
    _port = std::make_shared<EpollPort>();
    _thread = Thread("telvane-ipc", [this] { run(); });
  } catch (const kj::Exception& failure) {
    _log.error("localConnection: no event loop: {}", failure.getDescription().cStr());
    return false;
  } catch (const std::system_error& failure) {
    _log.error("localConnection: no thread for the event loop: {}", failure.what());
    return false;
  }
  _phase = Phase::Running;
  return true;
}

void LoopThread::stop(std::chrono::milliseconds patience) {
  {
    MutexLock lock(_mutex);
    if (_phase == Phase::New) _phase = Phase::Ended;
    if (_phase != Phase::Running) return;
    _phase = Phase::Stopping;
    _patience = patience;
  }
  _isStopping.store(true);
  _port->wake();
  _thread.join();
}

void LoopThread::remove(const std::shared_ptr<LoopResident>& resident) {
  if (_residents.erase(resident) != 0) post([resident] {});
}

// The job runs as a posted one, because a promise must not be destroyed by its own continuation.
uint64_t LoopThread::after(std::chrono::milliseconds delay, Job job) {
  const uint64_t id = ++_lastDelayed;
  auto promise = _port->timer()
                     .afterDelay(delay.count() * kj::MILLISECONDS)
                     .then([this, id, job = std::move(job)]() mutable {
                       post([this, id, job = std::move(job)]() mutable {
                         if (_delayed.erase(id) != 0) job();
                       });
                     })
                     .eagerlyEvaluate(nullptr);
  _delayed.emplace(id, std::unique_ptr<Delayed>(new Delayed{kj::mv(promise)}));
  return id;
}

void LoopThread::cancel(uint64_t delayed) { _delayed.erase(delayed); }

// Not instrumented, because the library checks that a callback lies on the real stack.
__attribute__((no_sanitize("address"))) void LoopThread::run() {
  currentLoop = this;
  const QuietLibrary quiet(_log);
  kj::EventLoop loop(*_port);
  const kj::WaitScope scope(loop);
  while (!isDone()) {
    runJobs();
    loop.run();
    if (_isStopping.load() && !_isWindingDown) windDown();
    if (hasJobs()) {
      _port->poll();
    } else if (!isDone()) {
      _port->wait();
    }
  }
  _delayed.clear();
  loop.run();
}

void LoopThread::windDown() {
  _isWindingDown = true;
  const auto patience = [this] {
    MutexLock lock(_mutex);
    return _patience;
  }();
  after(patience, [this] {
    for (const auto residents = _residents; const auto& resident : residents) resident->endNow();
  });
  for (const auto residents = _residents; const auto& resident : residents) resident->windDown();
}

void LoopThread::runJobs() {
  {
    MutexLock lock(_mutex);
    _running.swap(_jobs);
  }
  for (auto& job : _running) {
    job();
    job = nullptr;
  }
  _running.clear();
}

bool LoopThread::hasJobs() {
  MutexLock lock(_mutex);
  return !_jobs.empty();
}

bool LoopThread::isDone() {
  if (!_isStopping.load() || !_residents.empty()) return false;
  MutexLock lock(_mutex);
  if (!_jobs.empty()) return false;
  _phase = Phase::Ended;
  return true;
}

}  // namespace telvane::ipc
