#pragma once

#include <ucontext.h>

#include <array>
#include <cstddef>
#include <functional>

namespace telvane::testing {

// A stack of its own on the thread that made it: the body runs while somebody is in enter(), and stands still after
// leave() until the next enter(). The sanitizers are told of every switch.
//
// The thread enters fibers from its own stack only; a fiber does not enter another. The stack ends in a guard page, so
// that running over it is a crash and not a riddle. The body must not throw.
class Fiber {
 public:
  explicit Fiber(std::function<void(Fiber&)> body);
  // REQUIRES: isFinished(), or never entered.
  ~Fiber();
  Fiber(const Fiber&) = delete;
  Fiber& operator=(const Fiber&) = delete;

  // Runs the body until it calls leave() or returns. REQUIRES: called from the thread's own stack; !isFinished().
  void enter();
  // Goes back to where enter() was called. REQUIRES: called from the body.
  void leave();
  bool isFinished() const noexcept { return _isFinished; }

 private:
  // What the C++ runtime keeps per thread about exceptions being handled; each stack has its own.
  using ExceptionState = std::array<std::byte, 16>;
  enum class Farewell { ComesBack, ForEver };

  static void start(unsigned high, unsigned low);
  void runBody();
  void switchToThread(Farewell farewell);
  void swapExceptionState();

  std::function<void(Fiber&)> _body;
  bool _isFinished = false;
  void* _mapping = nullptr;
  std::byte* _stack = nullptr;
  ucontext_t _ownContext{};
  ucontext_t _threadContext{};
  ExceptionState _exceptions{};
  // For the sanitizers: where the thread's stack lies, what they keep for either side while it stands still.
  const void* _threadStack = nullptr;
  size_t _threadStackSize = 0;
  void* _threadShadow = nullptr;
  void* _ownShadow = nullptr;
};

}  // namespace telvane::testing
