#pragma once

#include "platform/Mutex.h"
#include "platform/Transactions.h"

namespace telvane::testing {

// Counts transactions. Safe from any thread.
class CountingTransactions final : public Transactions {
 public:
  void begin() override {
    MutexLock lock(_mutex);
    ++_begun;
    ++_open;
  }
  void end() override {
    MutexLock lock(_mutex);
    if (_open > 0) {
      --_open;
    } else {
      ++_surplusEnds;
    }
  }

  int open() const {
    MutexLock lock(_mutex);
    return _open;
  }
  int begun() const {
    MutexLock lock(_mutex);
    return _begun;
  }
  // Ends that had no begin.
  int surplusEnds() const {
    MutexLock lock(_mutex);
    return _surplusEnds;
  }

 private:
  mutable Mutex _mutex;
  int _open GUARDED_BY(_mutex) = 0;
  int _begun GUARDED_BY(_mutex) = 0;
  int _surplusEnds GUARDED_BY(_mutex) = 0;
};

}  // namespace telvane::testing
