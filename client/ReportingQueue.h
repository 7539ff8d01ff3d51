#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/Log.h"
#include "platform/Mutex.h"

namespace telvane {

// The order in which one session talks to the daemon: steps run one at a time, in the order in which they were given,
// on a serial queue; steps that wait are run by one job of that queue, not by one each. A short step that finds nothing
// before it runs at once on its caller's thread, because a hop between threads costs more than handing one event to the
// local connection.
//
// Shared by its session; the job that runs waiting steps keeps it alive. Safe from any thread.
//
// Waiting messages, and calls that carry the host's data, are bounded by bytes: what is behind a step that does not end
// must not eat the host process. Beyond the bound the newest is dropped, with one error line per burst. A message
// counts until the steps that it is run with are done. Steps without such data are not counted.
class ReportingQueue : public std::enable_shared_from_this<ReportingQueue> {
 public:
  // A quarter of what a session's events may take while they wait for the daemon; the rest is the connection's.
  static constexpr uint64_t kMaximumWaitingBytes = 8u << 20;

  ReportingQueue(std::shared_ptr<SerialQueue> queue, Log& log) : _queue(std::move(queue)), _log(log) {}

  // Runs the step before it returns, if nothing runs or waits; else returns false and has not touched it.
  // REQUIRES: the step neither waits nor calls out of the library.
  template <class Step>
  bool tryPerform(Step& step) {
    if (!begin()) return false;
    const End end{*this};
    step();
    return true;
  }
  // Runs the step at once if nothing runs or waits, else behind it. REQUIRES: as for tryPerform.
  template <class Step>
  void perform(Step step) {
    if (!tryPerform(step)) async(std::move(step));
  }
  // Runs the step before it returns, behind everything given before, and waits for that if it must.
  // REQUIRES: as for tryPerform; the caller is not in a step that waited, neither here nor where such a wait leads back
  // to here.
  template <class Step>
  void sync(Dispatch& dispatch, Step& step) {
    if (tryPerform(step)) return;
    const std::shared_ptr<Semaphore> isDone = dispatch.newSemaphore(0);
    async([&step, isDone] {
      step();
      isDone->signal();
    });
    isDone->wait();
  }
  // Runs the step on the serial queue, behind everything given before.
  void async(Job step);
  // The same for a step that holds a message of about this many bytes. Drops it beyond the bound.
  void asyncMessage(Job step, uint64_t bytes) { asyncBounded(std::move(step), bytes, &Dropped::messages); }
  // The same for a step that only tells of a message that goes nowhere: when dropped, it does not count as an event.
  void asyncNotice(Job step, uint64_t bytes) { asyncBounded(std::move(step), bytes, &Dropped::notices); }
  // The same as perform for a step that holds about this many bytes of the host's, but no message. Drops it when it
  // would have to wait beyond the bound. REQUIRES: as for tryPerform.
  template <class Step>
  void performCall(Step step, uint64_t bytes) {
    if (!tryPerform(step)) asyncBounded(std::move(step), bytes, &Dropped::calls);
  }

 private:
  struct End {
    ReportingQueue& queue;
    ~End() { queue.end(); }
  };
  // How much was dropped since that was last logged.
  struct Dropped {
    uint64_t messages = 0;
    uint64_t notices = 0;
    uint64_t calls = 0;
  };
  void asyncBounded(Job step, uint64_t bytes, uint64_t Dropped::*kind) EXCLUDES(_mutex);
  bool begin() EXCLUDES(_mutex);
  void end() EXCLUDES(_mutex);
  // Makes the caller the one who sees to the steps; false when somebody is already.
  bool claimRun() REQUIRES(_mutex);
  void scheduleRun();
  // Runs what waits until nothing does, with a break now and then.
  void run();
  std::vector<Job> takeWaiting();
  void logDropped(const Dropped& dropped);

  // Constant after construction.
  const std::shared_ptr<SerialQueue> _queue;
  Log& _log;

  Mutex _mutex;
  // Whether a step runs on some thread, or the job that runs what waits has been given to the queue.
  bool _isBusy GUARDED_BY(_mutex) = false;
  std::vector<Job> _waiting GUARDED_BY(_mutex);
  uint64_t _bytes GUARDED_BY(_mutex) = 0;         // of the messages that wait and of those being run
  uint64_t _runningBytes GUARDED_BY(_mutex) = 0;  // of those being run
  Dropped _dropped GUARDED_BY(_mutex);
};

}  // namespace telvane
