#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/PassingDispatch.h"

namespace telvane::testing {

// Another dispatch, whose timers' leeways are noted: what a simulation does with a leeway is its own choice, and may be
// nothing. For one thread.
class NotedTimers final : public PassingDispatch {
 public:
  using PassingDispatch::PassingDispatch;
  // Of each timer that was asked for, in that order.
  const std::vector<std::chrono::nanoseconds>& leeways() const noexcept { return _leeways; }

  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    _leeways.push_back(leeway);
    return PassingDispatch::newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
  }

 private:
  std::vector<std::chrono::nanoseconds> _leeways;
};

}  // namespace telvane::testing
