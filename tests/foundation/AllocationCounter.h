#pragma once

#include <cstddef>
#include <cstdint>

namespace telvane::testing {

// The number of allocations that this thread has made so far. The test program replaces operator new to count them.
size_t allocationCount() noexcept;

// The number of allocations, of all threads, that have not been freed yet.
int64_t livingAllocationCount() noexcept;

// Counts the allocations of this thread while the callable runs.
template <class F>
size_t allocationsDuring(F&& callable) {
  const size_t before = allocationCount();
  callable();
  return allocationCount() - before;
}

}  // namespace telvane::testing
