#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"

namespace telvane {

// The uploads of one process. Each of them holds a thread until its server has answered, and a compressed copy of its
// file on the disk, so there is a bound on both; and when the process is to end, nobody waits for a server any more.
// Owned by the process's context. Safe from any thread.
class RunningUploads {
 public:
  static constexpr size_t kMostAtOnce = 16;
  // Of the files as they are, in all.
  static constexpr uint64_t kMostBytesAtOnce = 8ull << 30;

  // One upload, from its beginning until this object goes.
  class Place {
   public:
    Place(Place&& other) noexcept;
    Place& operator=(Place&&) = delete;
    ~Place();
    // Signalled once when the process is to end. The server's answer signals it too.
    Semaphore& semaphore() const noexcept { return *_semaphore; }
    // Whether the process is to end.
    bool isCancelled() const;

   private:
    friend class RunningUploads;
    Place(RunningUploads& uploads, std::shared_ptr<Semaphore> semaphore, uint64_t bytes)
        : _uploads(&uploads), _semaphore(std::move(semaphore)), _bytes(bytes) {}

    RunningUploads* _uploads;  // null in one that was moved from
    std::shared_ptr<Semaphore> _semaphore;
    uint64_t _bytes;
  };

  RunningUploads() = default;
  RunningUploads(const RunningUploads&) = delete;
  RunningUploads& operator=(const RunningUploads&) = delete;

  // Takes a place for a file of that many bytes, whose uploader waits on the semaphore. Nothing when there is none, or
  // the process is to end. The place must not outlive this object.
  std::optional<Place> begin(std::shared_ptr<Semaphore> semaphore, uint64_t bytes) EXCLUDES(_mutex);
  // Wakes those that wait for an answer, and takes no more.
  void cancelAll() EXCLUDES(_mutex);

 private:
  void end(const std::shared_ptr<Semaphore>& semaphore, uint64_t bytes) EXCLUDES(_mutex);
  bool isCancelled() const EXCLUDES(_mutex);

  mutable Mutex _mutex;
  bool _isCancelled GUARDED_BY(_mutex) = false;
  std::set<std::shared_ptr<Semaphore>> _waiting GUARDED_BY(_mutex);
  uint64_t _bytes GUARDED_BY(_mutex) = 0;
};

}  // namespace telvane
