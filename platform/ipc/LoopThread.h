#pragma once

#include <atomic>
#include <chrono>
#include <memory>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "foundation/ThreadAnnotations.h"
#include "foundation/UniqueFunction.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Thread.h"

namespace telvane::ipc {

class EpollPort;

// Something that lives on the loop and has still something to deliver: the loop's thread does not end before it.
class LoopResident {
 public:
  virtual ~LoopResident() = default;
  // Finishes what is under way and then leaves the loop. Called on the loop when the service goes.
  virtual void windDown() = 0;
  // Ends what is left at once and leaves the loop. Called on the loop when the service has waited long enough.
  virtual void endNow() = 0;
};

// The one thread on which a service's sockets are read and written, started by the first job. It encodes, decodes and
// hands over, and never blocks.
//
// Owned by the service; connections share it. All signals are blocked in it. In a forked child it must neither be used
// nor destroyed: the child leaks it and makes another.
class LoopThread {
 public:
  explicit LoopThread(Log& log);
  // REQUIRES: stopped, or never started.
  ~LoopThread();
  LoopThread(const LoopThread&) = delete;
  LoopThread& operator=(const LoopThread&) = delete;

  // Runs the job on the loop, in the order of the calls. Returns false, and lets go of the job, when the loop has ended
  // or its thread could not be made. A job must not throw. Safe from any thread.
  bool post(Job job);
  bool isCurrent() const noexcept;
  // Winds all residents down, waits until none is left, at most this long, ends those that are, and joins the thread.
  // Not on the loop. Jobs posted later are refused; a second call does nothing.
  void stop(std::chrono::milliseconds patience);

  // On the loop only:
  EpollPort& port() noexcept { return *_port; }
  // Runs the job once the delay has passed, unless it is cancelled before; the result is never 0.
  uint64_t after(std::chrono::milliseconds delay, Job job);
  // Does nothing for 0 and for a job that has run.
  void cancel(uint64_t delayed);
  void add(std::shared_ptr<LoopResident> resident) { _residents.insert(std::move(resident)); }
  // The last reference is let go after the event that runs now.
  void remove(const std::shared_ptr<LoopResident>& resident);

 private:
  enum class Phase { New, Running, Stopping, Ended };

  bool start() REQUIRES(_mutex);
  void run();
  void runJobs();
  bool hasJobs();
  bool isDone();
  void windDown();

  Log& _log;
  Thread _thread;
  std::atomic<bool> _isStopping{false};

  Mutex _mutex;
  Phase _phase GUARDED_BY(_mutex) = Phase::New;
  std::vector<Job> _jobs GUARDED_BY(_mutex);
  std::chrono::milliseconds _patience GUARDED_BY(_mutex){};

  // Confined to the loop, but for the wake-up of the port, which is made before the thread.
  std::shared_ptr<EpollPort> _port;
  std::vector<Job> _running;
  std::unordered_set<std::shared_ptr<LoopResident>> _residents;
  struct Delayed;
  std::unordered_map<uint64_t, std::unique_ptr<Delayed>> _delayed;
  uint64_t _lastDelayed = 0;
  bool _isWindingDown = false;
};

}  // namespace telvane::ipc
