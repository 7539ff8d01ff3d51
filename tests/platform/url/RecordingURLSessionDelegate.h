#pragma once

#include <condition_variable>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/URLSession.h"

namespace telvane::testing {

// What became of one task.
struct TaskOutcome {
  std::optional<URLResponse> response;
  std::vector<std::string> pieces;
  int64_t sent = 0;
  int64_t expectedToSend = 0;
  int completions = 0;
  std::optional<Error> error;

  std::string body() const;
  // The error's code; Unknown for an error of another domain. REQUIRES: there is an error.
  URLErrorCode errorCode() const;
};

// Records what a session tells, and lets a test wait for it. Checks with each call that it comes on the delegate queue.
class RecordingURLSessionDelegate final : public URLSessionDelegate {
 public:
  explicit RecordingURLSessionDelegate(std::shared_ptr<SerialQueue> queue) : _queue(std::move(queue)) {}

  // Waits until the task has completed; a test failure and an empty outcome when that takes too long.
  TaskOutcome waitFor(const std::shared_ptr<URLSessionTask>& task);
  // Waits until that many bytes of the task's body have come.
  bool waitForBytes(const std::shared_ptr<URLSessionTask>& task, size_t count);
  bool waitUntilInvalid();
  TaskOutcome outcome(const URLSessionTask* task) const;
  bool isInvalid() const;
  // The names of all calls, each with the task's description.
  std::vector<std::string> calls() const;
  // Refuses every response from now on.
  void refuseResponses();

  void didBecomeInvalidWithError(URLSession& session, const std::optional<Error>& error) override;
  void didSendBodyData(URLSession& session, URLSessionTask& task, int64_t totalBytesSent,
                       int64_t totalBytesExpectedToSend) override;
  void didCompleteWithError(URLSession& session, URLSessionTask& task, const std::optional<Error>& error) override;
  ResponseDisposition didReceiveResponse(URLSession& session, URLSessionTask& task) override;
  void didBecomeDownloadTask(URLSession& session, URLSessionTask& task) override;
  void didReceiveData(URLSession& session, URLSessionTask& task, const Data& data) override;

 private:
  bool waitUntil(const std::function<bool()>& isSo);
  void record(const char* call, URLSessionTask* task, const std::function<void(TaskOutcome&)>& change);

  const std::shared_ptr<SerialQueue> _queue;
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  std::map<const URLSessionTask*, TaskOutcome> _outcomes;
  std::vector<std::string> _calls;
  bool _isInvalid = false;
  bool _refusesResponses = false;
};

}  // namespace telvane::testing
