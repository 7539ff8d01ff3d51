#include "platform/ipc/EpollPort.h"

#include <kj/debug.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <climits>

namespace telvane::ipc {

namespace {

int checked(int result, const char* what) {
  if (result < 0) KJ_FAIL_SYSCALL(what, errno);
  return result;
}

}  // namespace

EpollPort::EpollPort()
    : _epoll(checked(epoll_create1(EPOLL_CLOEXEC), "epoll_create1")),
      _event(checked(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")),
      _timer(kj::systemPreciseMonotonicClock().now()) {
  epoll_event interest{};
  interest.events = EPOLLIN;
  interest.data.ptr = nullptr;
  checked(epoll_ctl(_epoll.get(), EPOLL_CTL_ADD, _event.get(), &interest), "epoll_ctl");
}

EpollPort::~EpollPort() = default;

bool EpollPort::wait() {
  const auto now = kj::systemPreciseMonotonicClock().now();
  KJ_IF_MAYBE (timeout, _timer.timeoutToNextEvent(now, kj::MILLISECONDS, INT_MAX)) {
    return waitFor(static_cast<int>(*timeout));
  }
  return waitFor(-1);
}

bool EpollPort::poll() { return waitFor(0); }

void EpollPort::wake() const {
  const uint64_t one = 1;
  [[maybe_unused]] const auto written = ::write(_event.get(), &one, sizeof one);  // full means woken already
}

bool EpollPort::waitFor(int milliseconds) {
  constexpr int kMost = 32;
  epoll_event events[kMost];
  const int count = epoll_wait(_epoll.get(), events, kMost, milliseconds);
  bool woken = false;
  for (int i = 0; i < count; ++i) {
    if (events[i].data.ptr != nullptr) {
      static_cast<Watch*>(events[i].data.ptr)->fire(events[i].events);
      continue;
    }
    uint64_t sum = 0;
    woken = ::read(_event.get(), &sum, sizeof sum) == sizeof sum;
  }
  _timer.advanceTo(kj::systemPreciseMonotonicClock().now());
  return woken;
}

EpollPort::Watch::Watch(EpollPort& port, int fd) : _port(port), _fd(fd) {
  epoll_event interest{};
  interest.events = EPOLLIN | EPOLLOUT | EPOLLRDHUP | EPOLLET;
  interest.data.ptr = this;
  checked(epoll_ctl(_port._epoll.get(), EPOLL_CTL_ADD, fd, &interest), "epoll_ctl");
}

EpollPort::Watch::~Watch() { epoll_ctl(_port._epoll.get(), EPOLL_CTL_DEL, _fd, nullptr); }

kj::Promise<void> EpollPort::Watch::whenReadable() {
  auto pair = kj::newPromiseAndFulfiller<void>();
  _readable = kj::mv(pair.fulfiller);
  return kj::mv(pair.promise);
}

kj::Promise<void> EpollPort::Watch::whenWritable() {
  auto pair = kj::newPromiseAndFulfiller<void>();
  _writable = kj::mv(pair.fulfiller);
  return kj::mv(pair.promise);
}

void EpollPort::Watch::fire(uint32_t events) {
  if ((events & (EPOLLIN | EPOLLRDHUP | EPOLLHUP | EPOLLERR)) != 0) {
    KJ_IF_MAYBE (readable, _readable) {
      (*readable)->fulfill();
      _readable = nullptr;
    }
  }
  if ((events & (EPOLLOUT | EPOLLHUP | EPOLLERR)) != 0) {
    KJ_IF_MAYBE (writable, _writable) {
      (*writable)->fulfill();
      _writable = nullptr;
    }
  }
}

}  // namespace telvane::ipc
