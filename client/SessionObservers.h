#pragma once

#include <atomic>
#include <memory>

#include "client/include/telvane/Telvane.h"
#include "platform/Mutex.h"

namespace telvane {

// Who wants to hear of a session's messages. Safe from any thread. It is asked for every message, so while nobody
// listens (the usual case) an answer costs one atomic read.
class SessionObservers {
 public:
  void setDelegate(std::weak_ptr<TelvaneMessageSentDelegate> delegate);
  // Returns null when there is none, or none any more.
  std::shared_ptr<TelvaneMessageSentDelegate> delegate() const;
  void setLoggingBlock(Telvane::LoggingBlock block);
  // Returns an empty one when there is none.
  Telvane::LoggingBlock loggingBlock() const;

 private:
  mutable Mutex _mutex;
  std::weak_ptr<TelvaneMessageSentDelegate> _delegate GUARDED_BY(_mutex);
  std::shared_ptr<const Telvane::LoggingBlock> _loggingBlock GUARDED_BY(_mutex);
  // Whether one was set; they only save the lock, under which the answer is read.
  std::atomic<bool> _hasDelegate = false;
  std::atomic<bool> _hasLoggingBlock = false;
};

}  // namespace telvane
