#pragma once

#include <chrono>
#include <condition_variable>

#include "platform/Mutex.h"

namespace telvane {

// A condition variable for an annotated Mutex. Waits may end without reason: callers check in a loop.
class Condition {
 public:
  void wait(Mutex& mutex) REQUIRES(mutex);
  // Returns false when the deadline has passed.
  bool waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline) REQUIRES(mutex);
  void notifyOne() noexcept { _condition.notify_one(); }
  void notifyAll() noexcept { _condition.notify_all(); }

 private:
  std::condition_variable _condition;
};

}  // namespace telvane
