#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"

namespace telvane {

// The uploads of one process, files and log data. Each of them holds a thread until its server has answered, and what
// it posts: of a file a compressed copy on the disk, of log data all of it in memory. So there is a bound on each of
// these; and when the process is to end, nobody waits for a server any more.
// Owned by the process's context. Safe from any thread.
class RunningUploads {
 public:
  enum class Kind { File, LogData };

  // Of both kinds together.
  static constexpr size_t kMostAtOnce = 16;
  // Of the files as they are, in all.
  static constexpr uint64_t kMostBytesAtOnce = 8ull << 30;
  // Of log data, in all. As much as a client of our make has waiting for the daemon, so that each fits when it is
  // alone; and less than what makes the daemon stop reading, so that no server that hangs does that to other clients.
  static constexpr uint64_t kMostLogDataBytesAtOnce = 24ull << 20;

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
    Place(RunningUploads& uploads, Kind kind, std::shared_ptr<Semaphore> semaphore, uint64_t bytes)
        : _uploads(&uploads), _kind(kind), _semaphore(std::move(semaphore)), _bytes(bytes) {}

    RunningUploads* _uploads;  // null in one that was moved from
    Kind _kind;
    std::shared_ptr<Semaphore> _semaphore;
    uint64_t _bytes;
  };

  RunningUploads() = default;
  RunningUploads(const RunningUploads&) = delete;
  RunningUploads& operator=(const RunningUploads&) = delete;

  // Takes a place for an upload of that many bytes, whose uploader waits on the semaphore. Nothing when there is none,
  // or the process is to end. The place must not outlive this object.
  std::optional<Place> begin(Kind kind, std::shared_ptr<Semaphore> semaphore, uint64_t bytes) EXCLUDES(_mutex);
  // Wakes those that wait for an answer, and takes no more.
  void cancelAll() EXCLUDES(_mutex);

 private:
  static constexpr size_t kKinds = 2;
  static uint64_t mostBytesAtOnce(Kind kind) noexcept;
  void end(Kind kind, const std::shared_ptr<Semaphore>& semaphore, uint64_t bytes) EXCLUDES(_mutex);
  bool isCancelled() const EXCLUDES(_mutex);

  mutable Mutex _mutex;
  bool _isCancelled GUARDED_BY(_mutex) = false;
  std::set<std::shared_ptr<Semaphore>> _waiting GUARDED_BY(_mutex);
  std::array<uint64_t, kKinds> _bytes GUARDED_BY(_mutex){};
};

}  // namespace telvane
