#include "platform/FlowGate.h"

#include <algorithm>

namespace telvane {

void FlowGate::add(uint64_t bytes) {
  MutexLock lock(_mutex);
  _bytes += bytes;
}

void FlowGate::subtract(uint64_t bytes) {
  std::vector<Job> opened;
  {
    MutexLock lock(_mutex);
    _bytes -= std::min(bytes, _bytes);
    if (_bytes <= _limit) opened.swap(_waiting);
  }
  for (Job& job : opened) job();
}

bool FlowGate::isOpen() const {
  MutexLock lock(_mutex);
  return _bytes <= _limit;
}

uint64_t FlowGate::bytes() const {
  MutexLock lock(_mutex);
  return _bytes;
}

void FlowGate::whenOpen(Job job) {
  {
    MutexLock lock(_mutex);
    if (_bytes > _limit) {
      _waiting.push_back(std::move(job));
      return;
    }
  }
  job();
}

}  // namespace telvane
