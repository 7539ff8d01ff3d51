#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <utility>

#include "platform/Dispatch.h"

namespace telvane {

// One answer that a thread waits for and a completion gives from another. A completion that is let go without being
// called wakes the waiter too, so it never waits for an answer that can no longer come.
template <class T>
class Answer {
  struct State {
    explicit State(std::shared_ptr<Semaphore> made) : semaphore(std::move(made)) {}
    const std::shared_ptr<Semaphore> semaphore;
    std::optional<T> value;  // written before the signal, read after it
  };

 public:
  explicit Answer(Dispatch& dispatch) : _state(std::make_shared<State>(dispatch.newSemaphore(0))) {}

  // What a completion holds and calls, at most once.
  class Giver {
   public:
    explicit Giver(std::shared_ptr<State> state) : _state(std::move(state)) {}
    Giver(Giver&&) noexcept = default;
    Giver& operator=(Giver&&) = delete;
    ~Giver() {
      if (_state != nullptr) _state->semaphore->signal();
    }
    void give(T value) { _state->value = std::move(value); }

   private:
    std::shared_ptr<State> _state;
  };

  // Called once.
  Giver giver() { return Giver(_state); }

  // Returns the answer; nothing when it can no longer come, or did not in this time.
  std::optional<T> waitFor(std::chrono::nanoseconds time) {
    if (!_state->semaphore->waitFor(time)) return std::nullopt;
    return std::move(_state->value);
  }

 private:
  const std::shared_ptr<State> _state;
};

}  // namespace telvane
