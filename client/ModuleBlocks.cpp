#include "client/ModuleBlocks.h"

#include <algorithm>
#include <utility>

namespace telvane {

void ModuleBlocks::run(UniqueFunction<void()> call) {
  const std::shared_ptr<SerialQueue> mark = _dispatch.newSerialQueue("com.corvex.Telvane.PeriodicTask.block");
  {
    MutexLock lock(_mutex);
    _running.push_back(mark);
  }
  mark->sync(std::move(call));
  MutexLock lock(_mutex);
  std::erase(_running, mark);
}

bool ModuleBlocks::isInside() const {
  MutexLock lock(_mutex);
  return std::any_of(_running.begin(), _running.end(), [](const auto& mark) { return mark->isCurrent(); });
}

}  // namespace telvane
