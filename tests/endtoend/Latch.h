#pragma once

#include <condition_variable>
#include <mutex>

namespace telvane::testing {

// A gate that a server waits at; opened once. Safe from any thread.
class Latch {
 public:
  void open() {
    const std::lock_guard lock(_mutex);
    _isOpen = true;
    _opened.notify_all();
  }
  void wait() {
    std::unique_lock lock(_mutex);
    _opened.wait(lock, [this] { return _isOpen; });
  }

 private:
  std::mutex _mutex;
  std::condition_variable _opened;
  bool _isOpen = false;
};

}  // namespace telvane::testing
