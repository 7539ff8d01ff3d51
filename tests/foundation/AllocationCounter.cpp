#include "tests/foundation/AllocationCounter.h"

#include <atomic>
#include <cstdlib>
#include <new>

namespace {

thread_local size_t allocationsOfThisThread = 0;
std::atomic<int64_t> livingAllocations = 0;

void* allocate(size_t size) {
  void* memory = std::malloc(size == 0 ? 1 : size);
  if (memory == nullptr) throw std::bad_alloc();
  ++allocationsOfThisThread;
  livingAllocations.fetch_add(1, std::memory_order_relaxed);
  return memory;
}

void release(void* memory) noexcept {
  if (memory == nullptr) return;
  livingAllocations.fetch_sub(1, std::memory_order_relaxed);
  std::free(memory);
}

}  // namespace

namespace telvane::testing {

size_t allocationCount() noexcept { return allocationsOfThisThread; }

int64_t livingAllocationCount() noexcept { return livingAllocations.load(std::memory_order_relaxed); }

}  // namespace telvane::testing

void* operator new(size_t size) { return allocate(size); }

void operator delete(void* memory) noexcept { release(memory); }

void operator delete(void* memory, size_t) noexcept { release(memory); }
