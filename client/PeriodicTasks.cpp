#include "client/PeriodicTasks.h"

#include <atomic>
#include <utility>

#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"

namespace telvane {
namespace {

constexpr uint64_t kNanosecondsPerSecond = 1'000'000'000;

}  // namespace

struct PeriodicTasks::LogTimer {
  LogTimer(uint16_t category_, uint16_t type_, uint32_t reportingMultiplier, uint32_t interval)
      : category(category_),
        type(type_),
        intervalMultiplier(static_cast<int32_t>(reportingMultiplier)),
        updateTimeout(interval * kNanosecondsPerSecond) {}

  const uint16_t category;
  const uint16_t type;
  const int32_t intervalMultiplier;
  const uint64_t updateTimeout;
  // Whether a tick waits for its turn; another firing adds none then.
  std::atomic<bool> isTickWaiting = false;
};

PeriodicTasks::PeriodicTasks(ClientContext& context, Queues queues, Sender sender)
    : _context(context), _queues(std::move(queues)), _sender(std::move(sender)) {}

void PeriodicTasks::registerPeriodicTaskForModule(ModuleNumber number, Module module) {
  log().message("registerPeriodicTaskForModule: {},{} update,{} reporting", number, module->update() ? "" : " no",
                module->report() ? "" : " no");
  _periodicServiceDict.insert_or_assign(number, std::move(module));
}

PeriodicTasks::Module PeriodicTasks::unregisterPeriodTaskForModule(ModuleNumber number) {
  auto removed = _periodicServiceDict.extract(number);
  if (removed.empty()) {
    log().message("unregisterPeriodTaskForModule: {} doesn't exist", number);
    return nullptr;
  }
  log().message("unregisterPeriodTaskForModule: {} removed", number);
  return std::move(removed.mapped());
}

void PeriodicTasks::startLogTimerWithInterval(std::weak_ptr<PeriodicTasks> self, uint32_t interval,
                                              uint32_t reportingMultiplier, uint16_t category, uint16_t type) {
  if (_timer != nullptr) return;
  auto logTimer = std::make_shared<LogTimer>(category, type, reportingMultiplier, interval);
  auto fire = [self, reporting = _queues.reporting, logTimer] {
    if (logTimer->isTickWaiting.exchange(true)) return;
    reporting->async([self, logTimer] {
      logTimer->isTickWaiting = false;
      if (const std::shared_ptr<PeriodicTasks> tasks = self.lock()) tasks->timerFired(logTimer);
    });
  };
  // Behind the tick that waits, if one does.
  auto lost = [self = std::move(self), reporting = _queues.reporting, logTimer] {
    reporting->async([self, logTimer] {
      if (const std::shared_ptr<PeriodicTasks> tasks = self.lock()) tasks->timerLost(logTimer);
    });
  };
  const ClientPlatform& platform = _context.platform();
  _timer = RepeatingTimer::start(platform.dispatch, platform.clock, _queues.timer,
                                 {.interval = std::chrono::seconds(interval), .leeway = kLeeway},
                                 {.onFire = std::move(fire), .onLost = std::move(lost)});
  if (_timer == nullptr) return;
  _logTimer = std::move(logTimer);
  _counter = 0;
  log().message("startLogTimerWithInterval: {}, {}", static_cast<int32_t>(interval),
                static_cast<int32_t>(reportingMultiplier));
}

void PeriodicTasks::stopLogTimer() {
  if (_timer == nullptr) {
    log().message("stopLogTimer: No timer is present.");
    return;
  }
  log().message("stopLogTimer.");
  forgetTimer();
}

void PeriodicTasks::end() {
  forgetTimer();
  // Taken out first: code of the host may go with them and come back here.
  const auto modules = std::exchange(_periodicServiceDict, {});
}

// A firing that waited behind the end of its timer is none any more.
void PeriodicTasks::timerFired(const std::shared_ptr<LogTimer>& timer) {
  if (timer != _logTimer) return;
  myPeriodicTask(timer->category, timer->type, timer->intervalMultiplier, timer->updateTimeout);
}

void PeriodicTasks::timerLost(const std::shared_ptr<LogTimer>& timer) {
  if (timer != _logTimer) return;
  log().error("_myPeriodicTask: No timer for the next tick. The log timer is stopped");
  forgetTimer();
}

void PeriodicTasks::forgetTimer() {
  _timer.reset();
  _logTimer.reset();
  _counter = 0;
}

std::chrono::nanoseconds PeriodicTasks::waitLimit(uint64_t updateTimeout) {
  constexpr double kPart = 0.95;
  const auto limit = static_cast<uint64_t>(kPart * static_cast<double>(updateTimeout * kNanosecondsPerSecond));
  constexpr auto kLongest = static_cast<uint64_t>(std::chrono::nanoseconds::max().count());
  return std::chrono::nanoseconds(limit < kLongest ? limit : kLongest);
}

void PeriodicTasks::myPeriodicTask(uint16_t category, uint16_t type, int32_t intervalMultiplier,
                                   uint64_t updateTimeout) {
  ++_counter;
  log().message("_myPeriodicTask: Started RT periodic task");
  const auto tick = std::make_shared<PeriodicTick>(_context, _queues.periodic, waitLimit(updateTimeout));
  if (_counter != static_cast<uint32_t>(intervalMultiplier)) return update(*tick);
  collectReports(*tick);
  send(tick->takePayload(), category, type);
  log().message("_myPeriodicTask: Finished RT metrics collection");
  _counter = 0;
}

void PeriodicTasks::update(PeriodicTick& tick) {
  if (!scheduleUpdates(tick)) {
    log().error("_myPeriodicTask: Timeout scheduling RT metrics update tasks");
  } else if (!tick.waitForCalls()) {
    log().error("_myPeriodicTask: Timeout during RT metrics update");
  }
  log().message("_myPeriodicTask: Finished RT updates for all registered modules.");
}

bool PeriodicTasks::scheduleUpdates(PeriodicTick& tick) {
  for (const auto& [number, module] : _periodicServiceDict) {
    if (module->update() && !tick.scheduleUpdate(module)) return false;
  }
  return true;
}

void PeriodicTasks::collectReports(PeriodicTick& tick) {
  if (!scheduleReports(tick)) {
    log().error("_myPeriodicTask: Timeout scheduling RT metrics report tasks");
  } else if (!tick.waitForCalls()) {
    log().error("_myPeriodicTask: Timeout during periodic tasks metrics collection. Not all stats will be reported");
  }
}

// In the order of the numbers, in which the dictionary keeps them.
bool PeriodicTasks::scheduleReports(PeriodicTick& tick) {
  for (const auto& [number, module] : _periodicServiceDict) {
    if (module->report() && !tick.scheduleReport(module)) return false;
  }
  return true;
}

void PeriodicTasks::send(Dictionary payload, uint16_t category, uint16_t type) {
  log().message("_myPeriodicTask: All RT metrics collected");
  if (payload.empty()) return;
  log().message("_myPeriodicTask: Sent realtime event after collection all RT metrics");
  Dictionary message;
  message.reserve(4);
  message.set(kTelvaneMessageParametersFlag, kRealtimeFlag);
  message.set(kTelvaneMessageParametersCategory, category);
  message.set(kTelvaneMessageParametersType, type);
  message.set(kTelvaneMessageParametersPayload, std::move(payload));
  _sender(message);
}

}  // namespace telvane
