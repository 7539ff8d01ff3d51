#pragma once

namespace telvane {

class SerialQueue;

// Which queues the calling thread works for: one, or several inside each other when a job uses sync.
class CurrentQueues {
 public:
  // Says that the thread works for the queue as long as this object lives. Lives on the stack.
  class Scope {
   public:
    explicit Scope(const SerialQueue* queue) noexcept : _queue(queue), _outer(innermost()) { innermost() = this; }
    ~Scope() { innermost() = _outer; }
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

   private:
    friend class CurrentQueues;
    const SerialQueue* const _queue;
    const Scope* const _outer;
  };

  static bool contains(const SerialQueue* queue) noexcept;

 private:
  static const Scope*& innermost() noexcept;
};

}  // namespace telvane
