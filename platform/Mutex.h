#pragma once

#include <mutex>

#include "foundation/ThreadAnnotations.h"

namespace telvane {

// A lock for short, leaf-level sections: nothing is called out, nothing waits while it is held. std::mutex with the
// attributes that the build checks.
class CAPABILITY("mutex") Mutex {
 public:
  void lock() ACQUIRE() { _mutex.lock(); }
  void unlock() RELEASE() { _mutex.unlock(); }
  // For Condition, which waits on it.
  std::mutex& native() noexcept { return _mutex; }

 private:
  std::mutex _mutex;
};

class SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~MutexLock() RELEASE() { _mutex.unlock(); }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

 private:
  Mutex& _mutex;
};

}  // namespace telvane
