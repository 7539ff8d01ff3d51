#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/FlowGate.h"
#include "platform/URLSession.h"
#include "tests/support/ScriptedNetwork.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// What the sessions of one process have in common.
struct ScriptedURLSessionEnvironment {
  ScriptedNetwork& network;
  SimulatedScheduler& scheduler;
  std::string processName;
  SimulatedScheduler::ProcessID process;
  const FileSystem& files;
  FlowGate* gate;
};

// The session behind what the provider gives out: kept by that handle and by its running tasks, until its delegate has
// heard the last of it.
class ScriptedURLSession final : public URLSession, public std::enable_shared_from_this<ScriptedURLSession> {
 public:
  ScriptedURLSession(ScriptedURLSessionEnvironment environment, URLSessionConfiguration configuration,
                     std::shared_ptr<URLSessionDelegate> delegate, std::shared_ptr<SerialQueue> delegateQueue);

  const std::string& sessionDescription() const override { return _description; }
  void setSessionDescription(std::string description) override { _description = std::move(description); }
  Result<std::shared_ptr<URLSessionTask>> newDataTask(URLRequest request) override;
  Result<std::shared_ptr<URLSessionTask>> newUploadTask(URLRequest request, const std::string& path) override;
  void finishTasksAndInvalidate() override;

  // The handle is gone: cancels what runs, unless it was told to finish.
  void cancelUnlessFinishing();
  // The process is gone: nothing is told to anybody.
  void vanish();

  // For its tasks.
  void started(std::shared_ptr<ScriptedURLSessionTask> task);
  void completed(const std::shared_ptr<ScriptedURLSessionTask>& task);
  // Runs the call with the delegate on the delegate queue.
  void tellDelegate(UniqueFunction<void(URLSessionDelegate& delegate)> call);
  const std::vector<std::shared_ptr<ScriptedURLSessionTask>>& runningTasks() const noexcept { return _running; }
  const ScriptedURLSessionEnvironment& environment() const noexcept { return _environment; }
  const URLSessionConfiguration& configuration() const noexcept { return _configuration; }
  bool isActive() const noexcept { return _state == State::Active; }

 private:
  enum class State { Active, Finishing, Invalid };
  Result<std::shared_ptr<URLSessionTask>> newTask(URLRequest request, bool isUpload);
  void invalidateIfFinished();

  const ScriptedURLSessionEnvironment _environment;
  const URLSessionConfiguration _configuration;
  const std::shared_ptr<SerialQueue> _delegateQueue;
  std::shared_ptr<URLSessionDelegate> _delegate;
  std::string _description;
  State _state = State::Active;
  std::vector<std::shared_ptr<ScriptedURLSessionTask>> _running;
};

}  // namespace telvane::testing
