#include "util/RunningUploads.h"

#include <utility>

namespace telvane {

RunningUploads::Place::Place(Place&& other) noexcept
    : _uploads(std::exchange(other._uploads, nullptr)), _semaphore(std::move(other._semaphore)), _bytes(other._bytes) {}

RunningUploads::Place::~Place() {
  if (_uploads != nullptr) _uploads->end(_semaphore, _bytes);
}

bool RunningUploads::Place::isCancelled() const { return _uploads->isCancelled(); }

std::optional<RunningUploads::Place> RunningUploads::begin(std::shared_ptr<Semaphore> semaphore, uint64_t bytes) {
  MutexLock lock(_mutex);
  if (_isCancelled || _waiting.size() >= kMostAtOnce || bytes > kMostBytesAtOnce - _bytes) return std::nullopt;
  _waiting.insert(semaphore);
  _bytes += bytes;
  return Place(*this, std::move(semaphore), bytes);
}

void RunningUploads::cancelAll() {
  MutexLock lock(_mutex);
  if (std::exchange(_isCancelled, true)) return;
  for (const std::shared_ptr<Semaphore>& semaphore : _waiting) semaphore->signal();
}

void RunningUploads::end(const std::shared_ptr<Semaphore>& semaphore, uint64_t bytes) {
  MutexLock lock(_mutex);
  _waiting.erase(semaphore);
  _bytes -= bytes;
}

bool RunningUploads::isCancelled() const {
  MutexLock lock(_mutex);
  return _isCancelled;
}

}  // namespace telvane
