#include "daemon/TelvanedProgram.h"

#include <cstdlib>
#include <iostream>

#include "daemon/TelvanedService.h"
#include "platform/system/Allocator.h"
#include "platform/system/ServiceManager.h"
#include "platform/system/SystemPlatform.h"

namespace telvane {
namespace {

constexpr auto kLongestShutdown = std::chrono::seconds(25);

// What ends the daemon: a signal, idleness, or the time that a shutdown may take at most. Everything runs on queues;
// the thread that made it waits.
class DaemonEnd {
 public:
  DaemonEnd(Dispatch& dispatch, TelvanedService& service, ProcessTransactions& transactions)
      : _service(service),
        _transactions(transactions),
        _signalQueue(dispatch.newSerialQueue("com.corvex.telvaned.signals")),
        _shutdownQueue(dispatch.newSerialQueue("com.corvex.telvaned.shutdown")),
        _ended(dispatch.newSemaphore(0)) {}

  Result<void> start(TerminationSignals& signals) {
    return signals.start(_signalQueue, [this](int ordinal) { terminationAsked(ordinal); });
  }
  void endWhenIdleFor(std::chrono::seconds time) {
    _transactions.whenIdleFor(time, _signalQueue, [ended = _ended] { ended->signal(); });
  }
  void wait() { _ended->wait(); }

 private:
  void terminationAsked(int ordinal) {
    if (_transactions.count() == 0) {
      _ended->signal();
      return;
    }
    // A second signal changes nothing: what is held back already is on its way, and its time is bounded.
    if (ordinal > 1) return;
    _signalQueue->asyncAfter(kLongestShutdown, [ended = _ended] { ended->signal(); });
    // On a queue of its own, since the agent's lock may be held for a download that does not end.
    _shutdownQueue->async([this] {
      _service.shutDown();
      _transactions.whenNoneHeld(_signalQueue, [ended = _ended] { ended->signal(); });
    });
  }

  TelvanedService& _service;
  ProcessTransactions& _transactions;
  const std::shared_ptr<SerialQueue> _signalQueue;
  const std::shared_ptr<SerialQueue> _shutdownQueue;
  const std::shared_ptr<Semaphore> _ended;
};

void exitIfFailed(const Result<void>& step) {
  if (!step.has_error()) return;
  std::cerr << "telvaned: " << step.error().description() << std::endl;
  std::_Exit(EXIT_FAILURE);
}

}  // namespace

void runTelvaned(const TelvanedOptions& options, TerminationSignals& signals) {
  // Never destroyed: the process ends while threads may still wait for something in them.
  Log& log = *newLog(options.logTarget, options.logLevel, "telvaned").release();
  // Static so that it counts as in use at the end, when only its parts are referred to.
  static SystemPlatform& system = *std::make_unique<SystemPlatform>(log).release();
  const bool isActivated = servicemanager::wasActivated();
  Platform platform = system.platform();
  auto& service = *std::make_unique<TelvanedService>(platform).release();
  auto& end = *std::make_unique<DaemonEnd>(platform.dispatch, service, system.transactions()).release();
  exitIfFailed(service.start());
  exitIfFailed(end.start(signals));
  if (isActivated && options.idleExit.count() > 0) end.endWhenIdleFor(options.idleExit);
  servicemanager::notifyReady();
  end.wait();
  servicemanager::notifyStopping();
  log.flush();
  std::_Exit(hasLeakedMemory() ? EXIT_FAILURE : EXIT_SUCCESS);
}

}  // namespace telvane
