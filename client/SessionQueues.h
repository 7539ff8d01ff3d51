#pragma once

#include <memory>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"

namespace telvane {

// Tells whether a caller is inside a step of some session that waited: a message-sent delegate is called there, and
// what a replaced module holds goes there. Who waits there for a step of another session waits for ever when that one
// does the same for a step of the first, so nobody may.
//
// Owned by the context of all sessions; holds none of the queues. Safe from any thread.
class SessionQueues {
 public:
  // Adds the serial queue that a session's reporting queue stands on. It is forgotten when it is gone.
  void add(const std::shared_ptr<SerialQueue>& queue) EXCLUDES(_mutex);
  // Whether the caller works for one of the queues.
  bool isInside() const EXCLUDES(_mutex);

 private:
  mutable Mutex _mutex;
  std::vector<std::weak_ptr<SerialQueue>> _queues GUARDED_BY(_mutex);
};

}  // namespace telvane
