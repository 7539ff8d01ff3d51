#include "platform/dispatch/Thread.h"

#include <pthread.h>

#include <csignal>

namespace telvane {

namespace {

// A thread inherits the mask of the one that starts it.
class BlockedSignals {
 public:
  BlockedSignals() {
    sigset_t all;
    sigfillset(&all);
    // A fault of the thread itself must still reach the host's crash handler.
    for (int fault : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGTRAP, SIGSYS}) sigdelset(&all, fault);
    pthread_sigmask(SIG_SETMASK, &all, &_previous);
  }
  ~BlockedSignals() { pthread_sigmask(SIG_SETMASK, &_previous, nullptr); }
  BlockedSignals(const BlockedSignals&) = delete;
  BlockedSignals& operator=(const BlockedSignals&) = delete;

 private:
  sigset_t _previous;
};

}  // namespace

Thread::Thread(std::string name, Job body) {
  constexpr size_t kLongestName = 15;
  if (name.size() > kLongestName) name.resize(kLongestName);
  const BlockedSignals blocked;
  _thread = std::thread([name = std::move(name), body = std::move(body)]() mutable noexcept {
    pthread_setname_np(pthread_self(), name.c_str());
    body();
  });
}

Thread::~Thread() { join(); }

void Thread::join() {
  if (_thread.joinable()) _thread.join();
}

}  // namespace telvane
