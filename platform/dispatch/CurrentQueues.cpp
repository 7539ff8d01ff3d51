#include "platform/dispatch/CurrentQueues.h"

namespace telvane {

bool CurrentQueues::contains(const SerialQueue* queue) noexcept {
  for (const Scope* scope = innermost(); scope != nullptr; scope = scope->_outer) {
    if (scope->_queue == queue) return true;
  }
  return false;
}

const CurrentQueues::Scope*& CurrentQueues::innermost() noexcept {
  thread_local const Scope* innermost = nullptr;
  return innermost;
}

}  // namespace telvane
