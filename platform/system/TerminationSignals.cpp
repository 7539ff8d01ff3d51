#include "platform/system/TerminationSignals.h"

#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <array>
#include <cerrno>

#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

sigset_t terminationSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}

// Waits for a signal; false when it is time to stop.
bool waitForSignal(int signals, int stop) {
  std::array<pollfd, 2> waited = {pollfd{signals, POLLIN, 0}, pollfd{stop, POLLIN, 0}};
  while (::poll(waited.data(), waited.size(), -1) < 0) {
    if (errno != EINTR) return false;
  }
  return waited[1].revents == 0;
}

void forwardSignals(int signals, int stop, SerialQueue& queue,
                    const std::shared_ptr<TerminationSignals::Handler>& handler) {
  for (int ordinal = 1; waitForSignal(signals, stop); ++ordinal) {
    signalfd_siginfo information{};
    if (::read(signals, &information, sizeof information) != sizeof information) return;
    queue.async([handler, ordinal] { (*handler)(ordinal); });
  }
}

}  // namespace

TerminationSignals::TerminationSignals() {
  const sigset_t signals = terminationSignals();
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

TerminationSignals::~TerminationSignals() {
  const uint64_t one = 1;
  if (_stop.isOpen()) static_cast<void>(::write(_stop.get(), &one, sizeof one));
  _thread.join();
}

Result<void> TerminationSignals::start(std::shared_ptr<SerialQueue> queue, Handler handler) {
  const sigset_t wanted = terminationSignals();
  FileDescriptor signals(::signalfd(-1, &wanted, SFD_CLOEXEC));
  if (!signals.isOpen()) return errnoError(errno, "Cannot wait for signals");
  FileDescriptor stop(::eventfd(0, EFD_CLOEXEC));
  if (!stop.isOpen()) return errnoError(errno, "Cannot wait for signals");
  _stop = std::move(stop);
  _thread = Thread("signals", [signals = std::move(signals), stopEvent = _stop.get(), queue = std::move(queue),
                               handler = std::make_shared<Handler>(std::move(handler))] {
    forwardSignals(signals.get(), stopEvent, *queue, handler);
  });
  return {};
}

}  // namespace telvane
