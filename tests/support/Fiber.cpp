#include "tests/support/Fiber.h"

#include <cxxabi.h>
#include <sys/mman.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>

#if defined(__SANITIZE_ADDRESS__)
#define TELVANE_ADDRESS_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define TELVANE_ADDRESS_SANITIZER 1
#endif
#endif
#if defined(__SANITIZE_THREAD__)
#define TELVANE_THREAD_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define TELVANE_THREAD_SANITIZER 1
#endif
#endif

#ifdef TELVANE_ADDRESS_SANITIZER
#include <sanitizer/asan_interface.h>
#include <sanitizer/common_interface_defs.h>
#endif
#ifdef TELVANE_THREAD_SANITIZER
#include <sanitizer/tsan_interface.h>
#endif

namespace telvane::testing {

namespace {

#if defined(TELVANE_ADDRESS_SANITIZER) || defined(TELVANE_THREAD_SANITIZER)
constexpr size_t kStackSize = 1u << 20;  // the sanitizers make frames several times as large
#else
constexpr size_t kStackSize = 256u << 10;
#endif
constexpr size_t kGuardSize = 4096;

// Begins a switch to the stack given. shadow receives what is kept for the stack being left; null when that stack will
// never be entered again.
void beginSwitch([[maybe_unused]] void** shadow, [[maybe_unused]] const void* stack, [[maybe_unused]] size_t size) {
#ifdef TELVANE_ADDRESS_SANITIZER
  __sanitizer_start_switch_fiber(shadow, stack, size);
#endif
}

// Ends a switch, on the stack entered: gives back what was kept for it, and tells which stack was left.
void endSwitch([[maybe_unused]] void* shadow, [[maybe_unused]] const void** stack, [[maybe_unused]] size_t* size) {
#ifdef TELVANE_ADDRESS_SANITIZER
  __sanitizer_finish_switch_fiber(shadow, stack, size);
#endif
}

[[noreturn]] void giveUp(const char* what) {
  std::fprintf(stderr, "Fiber: %s failed\n", what);
  std::abort();
}

}  // namespace

Fiber::Fiber(std::function<void(Fiber&)> body) : _body(std::move(body)) {
  _mapping = mmap(nullptr, kStackSize + kGuardSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE,
                  -1, 0);
  if (_mapping == MAP_FAILED) giveUp("mmap");
  if (mprotect(_mapping, kGuardSize, PROT_NONE) != 0) giveUp("mprotect");
  _stack = static_cast<std::byte*>(_mapping) + kGuardSize;
  if (getcontext(&_ownContext) != 0) giveUp("getcontext");
  _ownContext.uc_stack.ss_sp = _stack;
  _ownContext.uc_stack.ss_size = kStackSize;
  _ownContext.uc_link = nullptr;
  const auto address = reinterpret_cast<uintptr_t>(this);
  makecontext(&_ownContext, reinterpret_cast<void (*)()>(&Fiber::start), 2, static_cast<unsigned>(address >> 32),
              static_cast<unsigned>(address));
#ifdef TELVANE_THREAD_SANITIZER
  _ownShadow = __tsan_create_fiber(0);
#endif
}

Fiber::~Fiber() {
#ifdef TELVANE_THREAD_SANITIZER
  __tsan_destroy_fiber(_ownShadow);
#endif
#ifdef TELVANE_ADDRESS_SANITIZER
  ASAN_UNPOISON_MEMORY_REGION(_stack, kStackSize);  // the next mapping at this place is somebody else's
#endif
  munmap(_mapping, kStackSize + kGuardSize);
}

void Fiber::enter() {
  swapExceptionState();
#ifdef TELVANE_THREAD_SANITIZER
  _threadShadow = __tsan_get_current_fiber();
  __tsan_switch_to_fiber(_ownShadow, 0);
#endif
  beginSwitch(&_threadShadow, _stack, kStackSize);
  if (swapcontext(&_threadContext, &_ownContext) != 0) giveUp("swapcontext");
#ifdef TELVANE_ADDRESS_SANITIZER
  endSwitch(_threadShadow, nullptr, nullptr);
#endif
  swapExceptionState();
}

void Fiber::leave() {
  switchToThread(Farewell::ComesBack);
#ifdef TELVANE_ADDRESS_SANITIZER
  endSwitch(_ownShadow, &_threadStack, &_threadStackSize);
#endif
}

void Fiber::start(unsigned high, unsigned low) {
  const uintptr_t address = (static_cast<uintptr_t>(high) << 32) | low;
  reinterpret_cast<Fiber*>(address)->runBody();
}

void Fiber::runBody() {
  endSwitch(nullptr, &_threadStack, &_threadStackSize);
  _body(*this);
  _isFinished = true;
  switchToThread(Farewell::ForEver);
}

void Fiber::switchToThread([[maybe_unused]] Farewell farewell) {
#ifdef TELVANE_THREAD_SANITIZER
  __tsan_switch_to_fiber(_threadShadow, 0);
#else
  beginSwitch(farewell == Farewell::ForEver ? nullptr : &_ownShadow, _threadStack, _threadStackSize);
#endif
  if (swapcontext(&_ownContext, &_threadContext) != 0) giveUp("swapcontext");
}

void Fiber::swapExceptionState() {
  ExceptionState running;
  void* current = abi::__cxa_get_globals();
  std::memcpy(running.data(), current, running.size());
  std::memcpy(current, _exceptions.data(), _exceptions.size());
  _exceptions = running;
}

}  // namespace telvane::testing
