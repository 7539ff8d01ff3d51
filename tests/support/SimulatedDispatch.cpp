#include "tests/support/SimulatedDispatch.h"

#include <utility>

#include "tests/support/SimulatedMonitor.h"
#include "tests/support/SimulatedSemaphore.h"
#include "tests/support/SimulatedTimer.h"

namespace telvane::testing {

namespace {

class SimulatedConcurrentQueue final : public ConcurrentQueue {
 public:
  SimulatedConcurrentQueue(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process, std::string name)
      : _scheduler(scheduler), _process(process), _name(std::move(name)) {}

  void async(Job job) override {
    _scheduler.schedule(_process, _name, std::move(job));
    _scheduler.callPoint();
  }

 private:
  SimulatedScheduler& _scheduler;
  const SimulatedScheduler::ProcessID _process;
  const std::string _name;
};

}  // namespace

SimulatedDispatch::SimulatedDispatch(SimulatedScheduler& scheduler, std::string processName)
    : _scheduler(scheduler), _processName(std::move(processName)), _process(scheduler.newProcess()) {}

std::shared_ptr<SerialQueue> SimulatedDispatch::newSerialQueue(std::string label, QualityOfService) {
  return newSimulatedQueue(std::move(label));
}

std::shared_ptr<ConcurrentQueue> SimulatedDispatch::newConcurrentQueue(std::string label, QualityOfService) {
  return std::make_shared<SimulatedConcurrentQueue>(_scheduler, _process, nameInReports(label));
}

std::unique_ptr<Timer> SimulatedDispatch::newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                                   std::chrono::nanoseconds leeway, Job onFire, Job onCancel) {
  auto simulated = std::dynamic_pointer_cast<SimulatedSerialQueue>(std::move(queue));
  if (simulated == nullptr) throw SimulationFailure("a simulated timer is given a queue that is not simulated");
  return std::make_unique<SimulatedTimer>(_scheduler, _process, std::move(simulated),
                                          delay + _scheduler.chooseLeeway(leeway), std::move(onFire),
                                          std::move(onCancel));
}

std::shared_ptr<Semaphore> SimulatedDispatch::newSemaphore(unsigned count) {
  return std::make_shared<SimulatedSemaphore>(_scheduler, _process, count,
                                              "semaphore " + nameInReports(std::to_string(++_semaphores)));
}

std::unique_ptr<Monitor> SimulatedDispatch::newMonitor() {
  return std::make_unique<SimulatedMonitor>(_scheduler, "monitor " + nameInReports(std::to_string(++_monitors)));
}

std::shared_ptr<SimulatedSerialQueue> SimulatedDispatch::newSimulatedQueue(std::string label) {
  std::string name = nameInReports(label);
  auto queue = std::make_shared<SimulatedSerialQueue>(_scheduler, _process, std::move(label), std::move(name));
  std::erase_if(_queues, [](const auto& known) { return known.expired(); });
  _queues.push_back(queue);
  return queue;
}

void SimulatedDispatch::spawn(std::string label, Job job) {
  _scheduler.schedule(_process, nameInReports(label), std::move(job));
}

void SimulatedDispatch::end() {
  _scheduler.end(_process);
  const auto queues = std::exchange(_queues, {});
  for (const auto& known : queues) {
    if (const auto queue = known.lock()) queue->clear();
  }
}

}  // namespace telvane::testing
