#pragma once

#include <cstdint>
#include <vector>

#include "foundation/UniqueFunction.h"
#include "platform/Mutex.h"

namespace telvane {

// Bounds the bytes of requests that wait for the network: URLs, headers, bodies. The URL session adds and subtracts;
// the local listener stops taking calls while the gate is closed and goes on when it opens, so a slow collector slows
// clients and nothing is lost. Safe from any thread.
class FlowGate {
 public:
  static constexpr uint64_t kDefaultLimit = 32ull << 20;
  explicit FlowGate(uint64_t limit = kDefaultLimit) : _limit(limit) {}

  void add(uint64_t bytes);
  // Runs what waits when the sum falls to the limit or below, on the caller's thread.
  void subtract(uint64_t bytes);
  bool isOpen() const;
  uint64_t bytes() const;
  // Runs the job at once when the gate is open, else when it opens. Jobs must be short (they schedule work).
  void whenOpen(Job job);

 private:
  const uint64_t _limit;
  mutable Mutex _mutex;
  uint64_t _bytes GUARDED_BY(_mutex) = 0;
  std::vector<Job> _waiting GUARDED_BY(_mutex);
};

}  // namespace telvane
