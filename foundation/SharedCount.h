#pragma once

#include <atomic>
#include <cstdint>

namespace telvane {

// The count of owners of shared storage. It starts with one owner; whoever takes the last owner away frees the storage.
// Safe from any thread.
class SharedCount {
 public:
  explicit SharedCount(uint32_t owners = 1) noexcept : _owners(owners) {}

  // Relaxed: a new owner is only ever made from an existing one, which keeps the storage alive meanwhile.
  void retain() noexcept { _owners.fetch_add(1, std::memory_order_relaxed); }

  // Takes owners away; returns whether none is left. The acquiring read of a sole owner pairs with the release of the
  // others that went before, so that the freeing thread sees what they did. No one can join a sole owner meanwhile.
  [[nodiscard]] bool release(uint32_t owners = 1) noexcept {
    if (_owners.load(std::memory_order_acquire) == owners) return true;
    return _owners.fetch_sub(owners, std::memory_order_acq_rel) == owners;
  }

  // Whether the asking owner is the only one and may change the storage in place.
  bool isUnique() const noexcept { return _owners.load(std::memory_order_acquire) == 1; }

 private:
  std::atomic<uint32_t> _owners;
};

}  // namespace telvane
