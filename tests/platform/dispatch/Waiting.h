#pragma once

#include <chrono>
#include <memory>
#include <thread>

#include "platform/Dispatch.h"

namespace telvane::testing {

// No test waits longer than this for something that has to happen.
constexpr std::chrono::seconds kDeadline{30};

// Returns whether the condition came true before the deadline.
template <class Condition>
bool eventually(Condition condition) {
  const auto deadline = std::chrono::steady_clock::now() + kDeadline;
  while (!condition()) {
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

// Returns whether all that was given to the queue before has run before the deadline.
inline bool drain(Dispatch& dispatch, SerialQueue& queue) {
  const std::shared_ptr<Semaphore> drained = dispatch.newSemaphore(0);
  queue.async([drained] { drained->signal(); });
  return drained->waitFor(kDeadline);
}

}  // namespace telvane::testing
