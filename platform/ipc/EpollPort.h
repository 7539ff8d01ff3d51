#pragma once

#include <kj/async.h>
#include <kj/timer.h>

#include "platform/ipc/Connection.h"

namespace telvane::ipc {

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wnon-virtual-dtor"  // the base of the library has none; nobody deletes through it
// Where the loop of the local connections waits: descriptors, timers, and a wake-up from other threads.
//
// The library's own port claims a signal and ignores SIGPIPE for the whole process, which is not ours to do in a host;
// this one touches nothing but its descriptors. Confined to the loop's thread, but for wake().
class EpollPort final : public kj::EventPort {
 public:
  class Watch;

  // Throws kj::Exception when the process has no descriptor left.
  EpollPort();
  ~EpollPort();

  kj::Timer& timer() noexcept { return _timer; }

  // Waits for the next event, without limit when no timer runs. Returns whether wake() was called since the last call.
  bool wait() override;
  bool poll() override;
  // Ends the wait of the loop's thread, now or the next. Safe from any thread.
  void wake() const override;

 private:
  bool waitFor(int milliseconds);

  Descriptor _epoll;
  Descriptor _event;
  kj::TimerImpl _timer;
};
#pragma GCC diagnostic pop

// Watches one descriptor for as long as it exists. Readiness is told once per change, so a caller first tries, and
// waits only when the system call would have blocked. Must go before the descriptor is closed.
class EpollPort::Watch {
 public:
  Watch(EpollPort& port, int fd);
  ~Watch();
  Watch(const Watch&) = delete;
  Watch& operator=(const Watch&) = delete;

  // At most one promise of each kind at a time; a newer one replaces it.
  kj::Promise<void> whenReadable();
  kj::Promise<void> whenWritable();

 private:
  friend class EpollPort;
  void fire(uint32_t events);

  EpollPort& _port;
  const int _fd;
  kj::Maybe<kj::Own<kj::PromiseFulfiller<void>>> _readable;
  kj::Maybe<kj::Own<kj::PromiseFulfiller<void>>> _writable;
};

}  // namespace telvane::ipc
