#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/Mutex.h"
#include "platform/URLSession.h"
#include "platform/url/CurlEnvironment.h"
#include "platform/url/CurlEvents.h"
#include "platform/url/CurlLoop.h"
#include "platform/url/CurlMulti.h"
#include "platform/url/CurlTransfer.h"
#include "platform/url/CurlURLSessionTask.h"

namespace telvane {

// The session behind what the provider gives out: it outlives that handle until its tasks have ended and its delegate
// has heard of it. Kept by the handle, its tasks, and, while it has work, the loop.
//
// A task goes from resume to the loop's thread, is tried there, waits between tries while there is no network (when the
// configuration says so), and completes there; its delegate hears of it on the delegate queue, at most one hand-over
// per turn of the loop. The time that a request allows counts from resume.
//
// Background, discretionary and power conditions are not known to this system: such a session runs its tasks at once.
class CurlURLSession final : public URLSession,
                             public CurlLoop::Member,
                             public std::enable_shared_from_this<CurlURLSession> {
 public:
  CurlURLSession(std::shared_ptr<const CurlEnvironment> environment, URLSessionConfiguration configuration,
                 std::shared_ptr<URLSessionDelegate> delegate, std::shared_ptr<SerialQueue> delegateQueue);

  // The description is to be set before the first task is made.
  const std::string& sessionDescription() const override { return _description; }
  void setSessionDescription(std::string description) override { _description = std::move(description); }
  Result<std::shared_ptr<URLSessionTask>> newDataTask(URLRequest request) override;
  Result<std::shared_ptr<URLSessionTask>> newUploadTask(URLRequest request, const std::string& path) override;
  void finishTasksAndInvalidate() override;

  // Ends all tasks with Cancelled and becomes invalid, unless it was told to finish its tasks before. Any thread.
  void cancelUnlessFinishing();
  // Starts a task. Any thread. In a session that is finishing, the task completes with SessionInvalidated; in one that
  // has become invalid nothing happens, because its delegate has heard the last of it.
  void resume(std::shared_ptr<CurlURLSessionTask> task);

  void socketReady(int socket, int events) override;
  void timerFired() override;
  void turnEnded() override;
  void loopEnded() override;

 private:
  enum class State { Active, Finishing, Invalid };
  using Time = CurlLoop::Time;
  struct Running {
    std::shared_ptr<CurlURLSessionTask> task;
    Time deadline;
    std::chrono::milliseconds retryDelay;
    std::unique_ptr<CurlTransfer> transfer;  // null while it waits for a network
    std::unique_ptr<Timer> retryTimer;
  };

  bool isActive() const EXCLUDES(_mutex);

  // On the loop's thread, down to flush.
  void enterLoop();
  void start(std::shared_ptr<CurlURLSessionTask> task, State stateAtResume, Time deadline);
  void tryNow(Running& running);
  void transferDone(const CurlMulti::Done& done);
  bool isWorthWaiting(const Error& error) const;
  void waitForNetwork(Running& running);
  void retry(CurlURLSessionTask* task);
  void complete(Running& running, std::optional<Error> error);
  void cancel(CurlURLSessionTask* task);
  void cancelAll();
  void endIfFinished() EXCLUDES(_mutex);
  void flush();

  // On the delegate queue.
  void deliver(std::vector<CurlEvents::Event>& events);
  void deliver(CurlURLSessionTask& task, CurlEvents::Head& head);
  void deliver(CurlURLSessionTask& task, CurlEvents::Body& body);
  void deliver(CurlURLSessionTask& task, CurlEvents::Completed& completed);

  // Constant after construction.
  const std::shared_ptr<const CurlEnvironment> _environment;
  const URLSessionConfiguration _configuration;
  const std::shared_ptr<SerialQueue> _delegateQueue;
  std::string _description;  // from the first task on

  // Confined to the delegate queue: null once it has heard that the session became invalid.
  std::shared_ptr<URLSessionDelegate> _delegate;

  // Confined to the loop's thread.
  std::unique_ptr<CurlMulti> _multi;  // while the session is in the loop
  std::unordered_map<CurlURLSessionTask*, Running> _running;
  CurlEvents _events;
  std::shared_ptr<SerialQueue> _retryQueue;
  bool _isCancelled = false;

  mutable Mutex _mutex;
  State _state GUARDED_BY(_mutex) = State::Active;
  size_t _resumedTasks GUARDED_BY(_mutex) = 0;  // that have not completed yet
};

}  // namespace telvane
