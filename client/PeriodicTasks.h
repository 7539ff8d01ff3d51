#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

#include "client/ClientContext.h"
#include "client/PeriodicTick.h"
#include "client/ReportingQueue.h"
#include "client/UpdateAndReportServices.h"
#include "platform/dispatch/RepeatingTimer.h"

namespace telvane {

// Collects the metrics of a session's modules: on most ticks of its log timer it has them update their state, and on
// every N-th it asks them for a report, merges the answers and sends them as one real-time event.
//
// Owned by its session. Everything here is called in steps of the session's reporting queue; a tick is such a step,
// too, and makes that queue wait for the modules' blocks, which run on the periodic queue. So no tick runs beside
// another one or beside a call to the daemon.
class PeriodicTasks {
 public:
  using Module = PeriodicTick::Module;
  using ModuleNumber = uint32_t;
  // Sends one message dictionary through the session, with its filters.
  using Sender = std::function<void(const Dictionary& message)>;
  static constexpr std::chrono::milliseconds kLeeway{100};

  // The queues of the session that these tasks need.
  struct Queues {
    std::shared_ptr<ReportingQueue> reporting;
    std::shared_ptr<SerialQueue> timer;  // the one that the reporting queue stands on
    std::shared_ptr<ConcurrentQueue> periodic;
  };

  // sender: called in a step of the reporting queue, while the session lives. The context outlives the tasks.
  PeriodicTasks(ClientContext& context, Queues queues, Sender sender);

  // Keeps the module under its number, instead of an earlier one.
  void registerPeriodicTaskForModule(ModuleNumber number, Module module);
  // Forgets the module and returns it; null when there is none. What it returns is to be let go outside of the step,
  // since code of the host may go with it.
  [[nodiscard]] Module unregisterPeriodTaskForModule(ModuleNumber number);

  // Starts the timer, which fires at once and then every interval, in seconds; does nothing when there is one. Every
  // reportingMultiplier-th tick is a report, which is sent with that category and type; with 0 none is.
  // self: these tasks, held with their session while a tick runs and not otherwise.
  void startLogTimerWithInterval(std::weak_ptr<PeriodicTasks> self, uint32_t interval, uint32_t reportingMultiplier,
                                 uint16_t category, uint16_t type);
  void stopLogTimer();
  // Stops the timer and forgets the modules, without a word: whom they were for is gone.
  void end();

  // One tick. It counts, and when the count is intervalMultiplier it is a report. updateTimeout: see waitLimit.
  void myPeriodicTask(uint16_t category, uint16_t type, int32_t intervalMultiplier, uint64_t updateTimeout);
  // How long each wait of a tick lasts at most. The timeout is meant in seconds: 95 % of it, so that a tick is over
  // before the next one is due. The timer gives its interval in nanoseconds all the same, whereby its ticks wait
  // practically without an end; that is how clients know it, so it stays. The product wraps at 64 bits.
  static std::chrono::nanoseconds waitLimit(uint64_t updateTimeout);

 private:
  // What the timer was started with.
  struct LogTimer;

  Log& log() const noexcept { return _context.log(); }
  void timerFired(const std::shared_ptr<LogTimer>& timer);
  // Says so, and counts the timer as stopped, so that the client may start one again.
  void timerLost(const std::shared_ptr<LogTimer>& timer);
  void forgetTimer();
  void update(PeriodicTick& tick);
  bool scheduleUpdates(PeriodicTick& tick);
  void collectReports(PeriodicTick& tick);
  bool scheduleReports(PeriodicTick& tick);
  void send(Dictionary payload, uint16_t category, uint16_t type);

  // Constant after construction.
  ClientContext& _context;
  const Queues _queues;
  const Sender _sender;

  // Confined to the steps of the reporting queue.
  std::map<ModuleNumber, Module> _periodicServiceDict;
  std::unique_ptr<RepeatingTimer> _timer;
  std::shared_ptr<LogTimer> _logTimer;
  uint32_t _counter = 0;
};

}  // namespace telvane
