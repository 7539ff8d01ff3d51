#pragma once

#include <cstdint>
#include <memory>

namespace telvane {

// A bounded number of something that a process may have at once. Safe from any thread; its places may outlive it.
class Places {
 public:
  // Stands for one place until the last copy goes.
  using Place = std::shared_ptr<const void>;

  explicit Places(uint32_t most) : _most(most) {}
  // Null when all are taken.
  Place take();

 private:
  struct Taken;
  const uint32_t _most;
  const std::shared_ptr<Taken> _taken = newTaken();
  static std::shared_ptr<Taken> newTaken();
};

}  // namespace telvane
