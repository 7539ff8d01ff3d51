#include "platform/datagram/ReadableLoop.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>
#include <utility>

namespace telvane {
namespace {

constexpr uint64_t kStopCall = 0;  // the number of no watch
constexpr int kEventsPerTurn = 64;

epoll_event readableOnce(uint64_t number) noexcept {
  epoll_event event{};
  event.events = EPOLLIN | EPOLLONESHOT;
  event.data.u64 = number;
  return event;
}

}  // namespace

// What the loop and the jobs of a source's queue share.
class ReadableLoop::Watch : public std::enable_shared_from_this<ReadableLoop::Watch> {
 public:
  Watch(std::shared_ptr<ReadableLoop> loop, int descriptor, std::shared_ptr<SerialQueue> queue,
        UniqueFunction<void()> onReadable, Job onCancel)
      : _loop(std::move(loop)),
        _descriptor(descriptor),
        _queue(std::move(queue)),
        _onReadable(std::move(onReadable)),
        _onCancel(std::move(onCancel)) {}

  int descriptor() const noexcept { return _descriptor; }
  // Before the loop looks at the descriptor.
  void setNumber(uint64_t number) noexcept { _number = number; }
  // On the loop's thread, not again before fire has run.
  void tell() {
    _queue->async([watch = shared_from_this()] { watch->fire(); });
  }
  void cancel() {
    if (_isCancelled.exchange(true)) return;
    _loop->remove(_number, _descriptor);
    _queue->async([watch = shared_from_this()] {
      watch->_queue->assertOnQueue();
      watch->_onReadable = nullptr;
      if (watch->_onCancel) std::exchange(watch->_onCancel, nullptr)();
    });
  }

 private:
  void fire() {
    _queue->assertOnQueue();
    if (_isCancelled) return;
    // Taken out while it runs, so that a handler that cancels does not destroy itself.
    UniqueFunction<void()> handler = std::move(_onReadable);
    handler();
    if (_isCancelled) return;
    _onReadable = std::move(handler);
    // The socket is open: it is closed by the cancel handler at the earliest, which comes behind this job.
    _loop->lookAgain(_number, _descriptor);
  }

  const std::shared_ptr<ReadableLoop> _loop;
  const int _descriptor;
  const std::shared_ptr<SerialQueue> _queue;
  uint64_t _number = 0;  // constant once it is looked at
  UniqueFunction<void()> _onReadable GUARDED_BY(*_queue);
  Job _onCancel GUARDED_BY(*_queue);
  std::atomic<bool> _isCancelled{false};
};

class ReadableLoop::Source final : public ReadSource {
 public:
  explicit Source(std::shared_ptr<Watch> watch) : _watch(std::move(watch)) {}
  ~Source() override { _watch->cancel(); }
  Source(const Source&) = delete;
  Source& operator=(const Source&) = delete;
  void cancel() override { _watch->cancel(); }

 private:
  const std::shared_ptr<Watch> _watch;
};

ReadableLoop::~ReadableLoop() { stop(); }

std::unique_ptr<ReadSource> ReadableLoop::newSource(int descriptor, std::shared_ptr<SerialQueue> queue,
                                                    UniqueFunction<void()> onReadable, Job onCancel) {
  auto watch = std::make_shared<Watch>(shared_from_this(), descriptor, std::move(queue), std::move(onReadable),
                                       std::move(onCancel));
  if (!add(watch)) return nullptr;
  return std::make_unique<Source>(std::move(watch));
}

bool ReadableLoop::add(const std::shared_ptr<Watch>& watch) {
  MutexLock lock(_mutex);
  if (_isStopped || !startThread()) return false;
  const uint64_t number = ++_lastNumber;
  watch->setNumber(number);
  _watches.emplace(number, watch);
  epoll_event event = readableOnce(number);
  if (epoll_ctl(_epoll.get(), EPOLL_CTL_ADD, watch->descriptor(), &event) == 0) return true;
  _watches.erase(number);
  return false;
}

bool ReadableLoop::startThread() {
  if (_thread.isStarted()) return true;
  FileDescriptor epoll(epoll_create1(EPOLL_CLOEXEC));
  FileDescriptor stopCall(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!epoll.isOpen() || !stopCall.isOpen()) return false;
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.u64 = kStopCall;
  if (epoll_ctl(epoll.get(), EPOLL_CTL_ADD, stopCall.get(), &event) != 0) return false;
  _epoll = std::move(epoll);
  _stopCall = std::move(stopCall);
  try {
    _thread = Thread("telvane-udp", [this] { run(); });
  } catch (const std::system_error&) {
    return false;
  }
  return true;
}

void ReadableLoop::remove(uint64_t number, int descriptor) {
  std::shared_ptr<Watch> removed;  // goes without the lock
  MutexLock lock(_mutex);
  const auto found = _watches.find(number);
  if (found == _watches.end()) return;
  removed = std::move(found->second);
  _watches.erase(found);
  epoll_event ignored{};
  epoll_ctl(_epoll.get(), EPOLL_CTL_DEL, descriptor, &ignored);
}

void ReadableLoop::lookAgain(uint64_t number, int descriptor) const {
  epoll_event event = readableOnce(number);
  epoll_ctl(_epoll.get(), EPOLL_CTL_MOD, descriptor, &event);
}

void ReadableLoop::stop() {
  std::unordered_map<uint64_t, std::shared_ptr<Watch>> forgotten;
  Thread thread;
  {
    MutexLock lock(_mutex);
    _isStopped = true;
    forgotten.swap(_watches);
    thread = std::move(_thread);
  }
  if (!thread.isStarted()) return;
  const uint64_t one = 1;
  [[maybe_unused]] const auto written = write(_stopCall.get(), &one, sizeof one);
  thread.join();
}

void ReadableLoop::run() {
  std::array<epoll_event, kEventsPerTurn> events{};
  while (true) {
    const int count = epoll_wait(_epoll.get(), events.data(), kEventsPerTurn, -1);
    if (count < 0 && errno != EINTR) return;
    for (int index = 0; index < count; ++index) {
      const uint64_t number = events[static_cast<size_t>(index)].data.u64;
      if (number == kStopCall) return;
      if (const std::shared_ptr<Watch> watch = watchNumbered(number)) watch->tell();
    }
  }
}

std::shared_ptr<ReadableLoop::Watch> ReadableLoop::watchNumbered(uint64_t number) {
  MutexLock lock(_mutex);
  const auto found = _watches.find(number);
  return found != _watches.end() ? found->second : nullptr;
}

}  // namespace telvane
