#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <utility>

#include "platform/Dispatch.h"

namespace telvane::testing {

// Passes everything on to another dispatch, which outlives it. For tests that change one of its operations.
class PassingDispatch : public Dispatch {
 public:
  explicit PassingDispatch(Dispatch& other) : _other(other) {}

  std::shared_ptr<SerialQueue> newSerialQueue(std::string label, QualityOfService qos) override {
    return _other.newSerialQueue(std::move(label), qos);
  }
  std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label, QualityOfService qos) override {
    return _other.newConcurrentQueue(std::move(label), qos);
  }
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    return _other.newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
  }
  std::shared_ptr<Semaphore> newSemaphore(unsigned count) override { return _other.newSemaphore(count); }
  std::unique_ptr<Monitor> newMonitor() override { return _other.newMonitor(); }

 private:
  Dispatch& _other;
};

}  // namespace telvane::testing
