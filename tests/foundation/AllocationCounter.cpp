#include "tests/foundation/AllocationCounter.h"

#include <cstdlib>
#include <new>

namespace {

thread_local size_t allocationsOfThisThread = 0;

}  // namespace

namespace telvane::testing {

size_t allocationCount() noexcept { return allocationsOfThisThread; }

}  // namespace telvane::testing

void* operator new(size_t size) {
  ++allocationsOfThisThread;
  void* memory = std::malloc(size == 0 ? 1 : size);
  if (memory == nullptr) throw std::bad_alloc();
  return memory;
}

void operator delete(void* memory) noexcept { std::free(memory); }

void operator delete(void* memory, size_t) noexcept { std::free(memory); }
