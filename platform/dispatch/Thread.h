#pragma once

#include <string>
#include <thread>

#include "foundation/UniqueFunction.h"

namespace telvane {

// One thread of ours: named, with every signal blocked but those that tell of its own faults, so that a host's signal
// handlers never run in it and a write to a closed pipe is an error instead of SIGPIPE. Joined when it is let go of,
// which must not happen in the thread itself.
class Thread {
 public:
  Thread() noexcept = default;
  // Starts the thread; name: at most 15 bytes, the rest is cut. The body must not throw: that ends the process.
  // Throws std::system_error when the system has no thread left.
  Thread(std::string name, Job body);
  Thread(Thread&&) noexcept = default;
  // REQUIRES: this object has no thread.
  Thread& operator=(Thread&&) noexcept = default;
  ~Thread();

  bool isStarted() const noexcept { return _thread.joinable(); }
  // Waits until the body has returned. Does nothing when there is no thread.
  void join();

 private:
  std::thread _thread;
};

}  // namespace telvane
