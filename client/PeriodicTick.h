#pragma once

#include <chrono>
#include <memory>

#include "client/ClientContext.h"
#include "client/PendingWork.h"
#include "client/UpdateAndReportServices.h"
#include "platform/Mutex.h"

namespace telvane {

// One tick of a session's log timer: it has the blocks of the modules called side by side, at most four at a time, and
// gathers what they report until the tick is over.
//
// Made by PeriodicTasks for one tick and shared with the calls, which may last longer: one that ends after the tick is
// over changes nothing any more, and what it still takes is a slot of its own tick, which nobody wants. Its operations
// are called by one caller, one at a time, and wait; the blocks are called on the queue.
class PeriodicTick : public std::enable_shared_from_this<PeriodicTick> {
 public:
  using Module = std::shared_ptr<const UpdateAndReportServices>;
  static constexpr unsigned kSlots = 4;

  // waitLimit: how long each wait of this tick lasts at most. The context outlives the tick and its calls.
  PeriodicTick(ClientContext& context, std::shared_ptr<ConcurrentQueue> queue, std::chrono::nanoseconds waitLimit);

  // Has the module update its state, as soon as one of the slots is free. Returns false when none was in time.
  bool scheduleUpdate(const Module& module);
  // The same for its report. What a block throws is logged, and then what it has filled in counts for nothing.
  bool scheduleReport(const Module& module);
  // Waits until all calls have ended; false when they have not in time.
  bool waitForCalls();
  // Ends the gathering and returns what has come together, merged.
  Dictionary takePayload() EXCLUDES(_mutex);

 private:
  using Action = void (PeriodicTick::*)(const UpdateAndReportServices& module);
  class Call;

  bool schedule(const Module& module, Action action);
  void update(const UpdateAndReportServices& module);
  void report(const UpdateAndReportServices& module);
  void add(const Dictionary& metrics) EXCLUDES(_mutex);

  // Constant after construction.
  ClientContext& _context;
  const std::shared_ptr<ConcurrentQueue> _queue;
  const std::chrono::nanoseconds _waitLimit;

  // Synchronised by themselves.
  const std::shared_ptr<Semaphore> _slots;
  PendingWork _calls;

  Mutex _mutex;
  bool _isOver GUARDED_BY(_mutex) = false;
  Dictionary _payload GUARDED_BY(_mutex);
};

}  // namespace telvane
