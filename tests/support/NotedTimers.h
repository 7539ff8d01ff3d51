#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/Dispatch.h"

namespace telvane::testing {

// Another dispatch, whose timers' leeways are noted: what a simulation does with a leeway is its own choice, and may be
// nothing. For one thread.
class NotedTimers final : public Dispatch {
 public:
  explicit NotedTimers(Dispatch& other) : _other(other) {}
  // Of each timer that was asked for, in that order.
  const std::vector<std::chrono::nanoseconds>& leeways() const noexcept { return _leeways; }

  std::shared_ptr<SerialQueue> newSerialQueue(std::string label, QualityOfService qos) override {
    return _other.newSerialQueue(std::move(label), qos);
  }
  std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label, QualityOfService qos) override {
    return _other.newConcurrentQueue(std::move(label), qos);
  }
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    _leeways.push_back(leeway);
    return _other.newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
  }
  std::shared_ptr<Semaphore> newSemaphore(unsigned count) override { return _other.newSemaphore(count); }
  std::unique_ptr<Monitor> newMonitor() override { return _other.newMonitor(); }

 private:
  Dispatch& _other;
  std::vector<std::chrono::nanoseconds> _leeways;
};

}  // namespace telvane::testing
