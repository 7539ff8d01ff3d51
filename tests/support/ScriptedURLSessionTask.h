#pragma once

#include <memory>
#include <optional>
#include <string>

#include "tests/support/ScriptedNetwork.h"
#include "tests/support/ScriptedURLSession.h"

namespace telvane::testing {

// A task on the scripted network: suspended, waiting for connectivity, waiting for the head, receiving, completed.
class ScriptedURLSessionTask final : public URLSessionTask,
                                     public std::enable_shared_from_this<ScriptedURLSessionTask> {
 public:
  ScriptedURLSessionTask(std::shared_ptr<ScriptedURLSession> session, URLRequest request, bool isUpload);

  void resume() override;
  void setTaskDescription(std::string description) override { _description = std::move(description); }
  const std::string& taskDescription() const override { return _description; }
  const std::optional<URLResponse>& response() const override { return _response; }

  void connectivityCame();
  void connectionBroke();
  void cancel();
  void vanish();

 private:
  enum class State { Suspended, WaitingForConnectivity, Running, Completed };

  void leave();
  void headCame();
  void deliverHead();
  void nextPiece();
  void complete(std::optional<Error> error);
  void restartIdleTimer();
  void after(std::chrono::nanoseconds delay, void (ScriptedURLSessionTask::*step)());
  void stopTimers();
  SimulatedScheduler::ProcessID process() const noexcept { return _session->environment().process; }
  SimulatedScheduler& scheduler() const noexcept { return _session->environment().scheduler; }

  const std::shared_ptr<ScriptedURLSession> _session;
  const bool _isUpload;
  URLRequest _request;
  std::string _description;
  State _state = State::Suspended;
  RecordedRequest* _record = nullptr;
  NetworkAnswer _answer;
  size_t _nextPiece = 0;
  std::optional<URLResponse> _response;
  SimulatedScheduler::TimerID _timeout = 0;
  SimulatedScheduler::TimerID _idleTimer = 0;
  SimulatedScheduler::TimerID _stepTimer = 0;
};

}  // namespace telvane::testing
