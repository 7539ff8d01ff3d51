#include "client/ClientSession.h"

namespace telvane {

bool ClientSession::registerPeriodicTaskForModule(uint32_t module, bool needToUpdate, bool needToReport,
                                                  Telvane::PeriodicTaskBlock serviceBlock) {
  if (!serviceBlock) return false;
  _hasPeriodicTasks.store(true, std::memory_order_release);
  // Never at once: the block that is replaced goes in the step, and code of the host perhaps with it.
  _reportingQueue->async([self = shared_from_this(), module,
                          services = std::make_shared<const UpdateAndReportServices>(needToUpdate, needToReport,
                                                                                     std::move(serviceBlock))] {
    self->_periodicTasks.registerPeriodicTaskForModule(module, services);
  });
  return true;
}

bool ClientSession::unregisterPeriodTaskForModule(uint32_t module) {
  if (_context.maySessionsWaitForCaller()) {
    _reportingQueue->async([self = shared_from_this(), module] {
      const PeriodicTasks::Module removed = self->_periodicTasks.unregisterPeriodTaskForModule(module);
    });
    return true;
  }
  PeriodicTasks::Module removed;
  auto remove = [&] { removed = _periodicTasks.unregisterPeriodTaskForModule(module); };
  _reportingQueue->sync(_context.platform().dispatch, remove);
  return true;
}

void ClientSession::startLogTimerWithInterval(uint32_t interval, uint32_t reportingMultiplier, uint16_t category,
                                              uint16_t type) {
  _hasPeriodicTasks.store(true, std::memory_order_release);
  _reportingQueue->async([self = shared_from_this(), interval, reportingMultiplier, category, type] {
    PeriodicTasks& tasks = self->_periodicTasks;
    tasks.startLogTimerWithInterval(std::shared_ptr<PeriodicTasks>(self, &tasks), interval, reportingMultiplier,
                                    category, type);
  });
}

void ClientSession::stopLogTimer() {
  _reportingQueue->async([self = shared_from_this()] { self->_periodicTasks.stopLogTimer(); });
}

void ClientSession::endPeriodicTasks() {
  if (!_hasPeriodicTasks.load(std::memory_order_acquire)) return;
  _reportingQueue->async([self = shared_from_this()] { self->_periodicTasks.end(); });
}

}  // namespace telvane
