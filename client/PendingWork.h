#pragma once

#include <chrono>
#include <memory>
#include <utility>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"

namespace telvane {

// Counts what is under way, so that the end of the process can wait for it. Outlives its holds. Safe from any thread.
class PendingWork {
 public:
  // One piece of work; over when the hold is gone.
  class Hold {
   public:
    explicit Hold(PendingWork& work) : _work(&work) { work.begin(); }
    Hold(Hold&& other) noexcept : _work(std::exchange(other._work, nullptr)) {}
    Hold& operator=(Hold&&) = delete;
    ~Hold() {
      if (_work != nullptr) _work->end();
    }

   private:
    PendingWork* _work;
  };

  // Returns true once nothing is under way, false when the time has passed before.
  bool waitUntilNone(Dispatch& dispatch, std::chrono::nanoseconds timeout);

 private:
  void begin();
  void end();

  Mutex _mutex;
  uint64_t _count GUARDED_BY(_mutex) = 0;
  std::vector<std::shared_ptr<Semaphore>> _waiters GUARDED_BY(_mutex);
};

}  // namespace telvane
