#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <utility>
#include <vector>

namespace telvane::testing {

// What other threads hand to a test, which waits for it with a deadline. Safe from any thread.
template <class T>
class Gathered {
 public:
  static constexpr std::chrono::seconds kDeadline{30};

  void add(T item) {
    const std::lock_guard lock(_mutex);
    _items.push_back(std::move(item));
    _changed.notify_all();
  }

  // Returns whether there were that many before the deadline.
  bool waitFor(size_t count) {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, kDeadline, [&] { return _items.size() >= count; });
  }

  // Waits for that many and returns what there is.
  std::vector<T> take(size_t count) {
    waitFor(count);
    return items();
  }

  std::vector<T> items() const {
    const std::lock_guard lock(_mutex);
    return _items;
  }

  size_t size() const {
    const std::lock_guard lock(_mutex);
    return _items.size();
  }

 private:
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<T> _items;
};

}  // namespace telvane::testing
