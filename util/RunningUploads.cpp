#include "util/RunningUploads.h"

#include <utility>

namespace telvane {

RunningUploads::Place::Place(Place&& other) noexcept
    : _uploads(std::exchange(other._uploads, nullptr)),
      _kind(other._kind),
      _semaphore(std::move(other._semaphore)),
      _bytes(other._bytes) {}

RunningUploads::Place::~Place() {
  if (_uploads != nullptr) _uploads->end(_kind, _semaphore, _bytes);
}

bool RunningUploads::Place::isCancelled() const { return _uploads->isCancelled(); }

uint64_t RunningUploads::mostBytesAtOnce(Kind kind) noexcept {
  return kind == Kind::File ? kMostBytesAtOnce : kMostLogDataBytesAtOnce;
}

std::optional<RunningUploads::Place> RunningUploads::begin(Kind kind, std::shared_ptr<Semaphore> semaphore,
                                                           uint64_t bytes) {
  MutexLock lock(_mutex);
  uint64_t& running = _bytes.at(static_cast<size_t>(kind));
  if (_isCancelled || _waiting.size() >= kMostAtOnce || bytes > mostBytesAtOnce(kind) - running) return std::nullopt;
  _waiting.insert(semaphore);
  running += bytes;
  return Place(*this, kind, std::move(semaphore), bytes);
}

void RunningUploads::cancelAll() {
  MutexLock lock(_mutex);
  if (std::exchange(_isCancelled, true)) return;
  for (const std::shared_ptr<Semaphore>& semaphore : _waiting) semaphore->signal();
}

void RunningUploads::end(Kind kind, const std::shared_ptr<Semaphore>& semaphore, uint64_t bytes) {
  MutexLock lock(_mutex);
  _waiting.erase(semaphore);
  _bytes.at(static_cast<size_t>(kind)) -= bytes;
}

bool RunningUploads::isCancelled() const {
  MutexLock lock(_mutex);
  return _isCancelled;
}

}  // namespace telvane
