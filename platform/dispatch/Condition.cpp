#include "platform/dispatch/Condition.h"

#include <mutex>

namespace telvane {

void Condition::wait(Mutex& mutex) {
  std::unique_lock lock(mutex.native(), std::adopt_lock);
  _condition.wait(lock);
  lock.release();
}

bool Condition::waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline) {
  std::unique_lock lock(mutex.native(), std::adopt_lock);
  const std::cv_status status = _condition.wait_until(lock, deadline);
  lock.release();
  return status == std::cv_status::no_timeout;
}

}  // namespace telvane
