#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <set>
#include <unordered_map>
#include <utility>
#include <vector>

#include "foundation/UniqueFunction.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Thread.h"

namespace telvane {

// The one thread on which all transfers of a process run: it waits for their sockets and timers and tells their owners.
// Owned by the session provider. The thread starts with the first job; with nothing under way it sleeps without a
// time-out. Everything but post and stop belongs to the loop's thread.
//
// One turn of the loop: ready sockets, jobs that came in, timers that are due, and then turnEnded of every member that
// had something to do, so that what happened in one turn leaves in one piece.
//
// In the child of a fork there is no thread; the child must leave the loop alone and not destroy it.
class CurlLoop {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // Somebody with sockets and a timer in the loop.
  class Member {
   public:
    virtual ~Member() = default;
    // events: a mask of curl's CURL_CSELECT bits. A call for a socket that is not ready after all does no harm.
    virtual void socketReady(int socket, int events) = 0;
    virtual void timerFired() = 0;
    virtual void turnEnded() = 0;
    // The last call, when the loop ends while the member is still in it.
    virtual void loopEnded() = 0;
  };

  // Throws std::system_error when the system has no descriptor left.
  CurlLoop();
  ~CurlLoop();
  CurlLoop(const CurlLoop&) = delete;
  CurlLoop& operator=(const CurlLoop&) = delete;

  // Runs the job on the loop's thread, in the order given. Safe from any thread. After stop the job is dropped.
  void post(Job job) EXCLUDES(_mutex);
  // Ends the thread: runs what was posted, tells the members, waits. Not from the loop's own thread.
  void stop() EXCLUDES(_mutex);

  // Keeps the member alive until it leaves.
  void join(std::shared_ptr<Member> member);
  // Takes the member's timer away and lets the member go at the end of the turn. It must have no sockets any more.
  void leave(Member& member);
  // events: CURL_POLL_IN, CURL_POLL_OUT or CURL_POLL_INOUT.
  void watch(int socket, int events, Member& member);
  void unwatch(int socket);
  void setTimer(Member& member, std::optional<std::chrono::milliseconds> delay);
  // Asks for a turnEnded in this turn.
  void noteChanged(Member& member);

 private:
  struct Entry {
    std::shared_ptr<Member> member;
    std::optional<Time> timer;
    bool changed = false;
    bool leaving = false;
  };

  void run();
  // Returns false when the loop is to end.
  bool runJobs() EXCLUDES(_mutex);
  void fireTimers();
  void endTurn();
  void endMembers();
  void waitForSockets() EXCLUDES(_mutex);
  int millisecondsToSleep() const;
  void socketIsReady(int socket, uint32_t events);
  void wake() const;

  // Constant after construction.
  const int _epoll;
  const int _wakeUpCall;

  // Confined to the loop's thread.
  std::unordered_map<Member*, Entry> _members;
  std::unordered_map<int, Member*> _watches;
  std::set<std::pair<Time, Member*>> _timers;
  std::vector<Member*> _changed;

  Mutex _mutex;
  std::vector<Job> _jobs GUARDED_BY(_mutex);
  // Whether the thread waits, or is about to, and so needs a wake-up to see a new job.
  bool _isSleeping GUARDED_BY(_mutex) = false;
  bool _isStopping GUARDED_BY(_mutex) = false;
  std::unique_ptr<Thread> _thread GUARDED_BY(_mutex);
};

}  // namespace telvane
