#include "client/PeriodicTick.h"

#include <utility>

#include "client/MetricsMerging.h"

namespace telvane {
namespace {

constexpr const char* kOperation = "_myPeriodicTask";

}  // namespace

// One call that has been given to the queue. It gives its slot back, and leaves the calls that the tick waits for, when
// it goes, whether it was run or not.
class PeriodicTick::Call {
 public:
  Call(std::shared_ptr<PeriodicTick> tick, Module module, Action action)
      : _tick(std::move(tick)), _hold(_tick->_calls), _module(std::move(module)), _action(action) {}
  Call(Call&& other) noexcept = default;
  Call& operator=(Call&&) = delete;
  ~Call() {
    if (_tick != nullptr) _tick->_slots->signal();
  }

  void run() {
    _tick->_context.moduleBlocks().run([this] {
      ((*_tick).*_action)(*_module);
      // It may be the last to hold the block, and what goes with that is code of the host, too.
      _module.reset();
    });
  }

 private:
  std::shared_ptr<PeriodicTick> _tick;  // holds what the others give back to
  PendingWork::Hold _hold;
  Module _module;
  Action _action;
};

PeriodicTick::PeriodicTick(ClientContext& context, std::shared_ptr<ConcurrentQueue> queue,
                           std::chrono::nanoseconds waitLimit)
    : _context(context),
      _queue(std::move(queue)),
      _waitLimit(waitLimit),
      _slots(context.platform().dispatch.newSemaphore(kSlots)) {}

bool PeriodicTick::scheduleUpdate(const Module& module) { return schedule(module, &PeriodicTick::update); }

bool PeriodicTick::scheduleReport(const Module& module) { return schedule(module, &PeriodicTick::report); }

bool PeriodicTick::schedule(const Module& module, Action action) {
  if (!_slots->waitFor(_waitLimit)) return false;
  _queue->async([call = Call(shared_from_this(), module, action)]() mutable { call.run(); });
  return true;
}

void PeriodicTick::update(const UpdateAndReportServices& module) {
  const std::shared_ptr<const UpdateAndReportServices::Block> block = module.block();
  _context.callOut(kOperation, [&] { (*block)(nullptr); });
}

void PeriodicTick::report(const UpdateAndReportServices& module) {
  const std::shared_ptr<const UpdateAndReportServices::Block> block = module.block();
  Dictionary metrics;
  bool isFilled = false;
  _context.callOut(kOperation, [&] {
    (*block)(&metrics);
    isFilled = true;
  });
  if (isFilled) add(metrics);
}

void PeriodicTick::add(const Dictionary& metrics) {
  MutexLock lock(_mutex);
  if (!_isOver) mergeMetrics(_payload, metrics);
}

bool PeriodicTick::waitForCalls() { return _calls.waitUntilNone(_context.platform().dispatch, _waitLimit); }

Dictionary PeriodicTick::takePayload() {
  MutexLock lock(_mutex);
  _isOver = true;
  return std::exchange(_payload, Dictionary());
}

}  // namespace telvane
