#include "client/SessionQueues.h"

#include <algorithm>

namespace telvane {

void SessionQueues::add(const std::shared_ptr<SerialQueue>& queue) {
  MutexLock lock(_mutex);
  std::erase_if(_queues, [](const std::weak_ptr<SerialQueue>& other) { return other.expired(); });
  _queues.push_back(queue);
}

bool SessionQueues::isInside() const {
  // Looked at outside of the lock: a queue may be held by nobody else any more and end here.
  std::vector<std::weak_ptr<SerialQueue>> queues;
  {
    MutexLock lock(_mutex);
    queues = _queues;
  }
  return std::any_of(queues.begin(), queues.end(), [](const std::weak_ptr<SerialQueue>& other) {
    const std::shared_ptr<SerialQueue> queue = other.lock();
    return queue != nullptr && queue->isCurrent();
  });
}

}  // namespace telvane
