#include "client/SessionObservers.h"

namespace telvane {

void SessionObservers::setDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate) {
  MutexLock lock(_mutex);
  _delegate.swap(delegate);
  _hasDelegate.store(!_delegate.expired(), std::memory_order_release);
}

std::shared_ptr<TelvaneMessageSentDelegate> SessionObservers::delegate() const {
  if (!_hasDelegate.load(std::memory_order_acquire)) return nullptr;
  MutexLock lock(_mutex);
  return _delegate.lock();
}

void SessionObservers::setLoggingBlock(Telvane::LoggingBlock block) {
  auto shared = block ? std::make_shared<const Telvane::LoggingBlock>(std::move(block)) : nullptr;
  MutexLock lock(_mutex);
  // What was set before goes with the local pointer, after the lock: its end may run code of the host.
  _loggingBlock.swap(shared);
  _hasLoggingBlock.store(_loggingBlock != nullptr, std::memory_order_release);
}

Telvane::LoggingBlock SessionObservers::loggingBlock() const {
  if (!_hasLoggingBlock.load(std::memory_order_acquire)) return {};
  std::shared_ptr<const Telvane::LoggingBlock> block;
  {
    MutexLock lock(_mutex);
    block = _loggingBlock;
  }
  return block != nullptr ? *block : Telvane::LoggingBlock();
}

}  // namespace telvane
