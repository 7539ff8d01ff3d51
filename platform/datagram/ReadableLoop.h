#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <unordered_map>

#include "platform/DatagramSocket.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Thread.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// The one thread that waits for all sockets with a read source and hands their events to their queues. Owned by who
// makes the sockets, and by each source, so that a source may be cancelled at any time. Safe from any thread.
//
// The thread starts with the first source and sleeps without a time-out while nothing can be read. A socket that was
// told of is not looked at again before its handler has run; then it is told of at once while it is still readable.
class ReadableLoop : public std::enable_shared_from_this<ReadableLoop> {
 public:
  ReadableLoop() = default;
  ~ReadableLoop();
  ReadableLoop(const ReadableLoop&) = delete;
  ReadableLoop& operator=(const ReadableLoop&) = delete;

  // Null when the system has no thread or descriptor left, or after stop.
  // REQUIRES: the descriptor is open until the cancel handler runs.
  std::unique_ptr<ReadSource> newSource(int descriptor, std::shared_ptr<SerialQueue> queue,
                                        UniqueFunction<void()> onReadable, Job onCancel) EXCLUDES(_mutex);
  // Ends the thread and waits for it; sources are told of nothing any more, but their cancel handlers run as ever.
  // Not from the loop's own thread.
  void stop() EXCLUDES(_mutex);

 private:
  class Watch;
  class Source;

  bool startThread() REQUIRES(_mutex);
  // Gives the watch its number and has its descriptor looked at; false when that cannot be.
  bool add(const std::shared_ptr<Watch>& watch) EXCLUDES(_mutex);
  void remove(uint64_t number, int descriptor) EXCLUDES(_mutex);
  void lookAgain(uint64_t number, int descriptor) const;
  void run();
  std::shared_ptr<Watch> watchNumbered(uint64_t number) EXCLUDES(_mutex);

  Mutex _mutex;
  std::unordered_map<uint64_t, std::shared_ptr<Watch>> _watches GUARDED_BY(_mutex);
  uint64_t _lastNumber GUARDED_BY(_mutex) = 0;
  bool _isStopped GUARDED_BY(_mutex) = false;
  Thread _thread GUARDED_BY(_mutex);
  // Written before the thread starts and never again.
  FileDescriptor _epoll;
  FileDescriptor _stopCall;
};

}  // namespace telvane
