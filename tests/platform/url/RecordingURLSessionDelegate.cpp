#include "tests/platform/url/RecordingURLSessionDelegate.h"

#include <gtest/gtest.h>

#include <chrono>

namespace telvane::testing {

std::string TaskOutcome::body() const {
  std::string all;
  for (const std::string& piece : pieces) all += piece;
  return all;
}

URLErrorCode TaskOutcome::errorCode() const {
  return error->domain() == String(kPlatformErrorDomain) ? static_cast<URLErrorCode>(error->code())
                                                         : URLErrorCode::Unknown;
}

bool RecordingURLSessionDelegate::waitUntil(const std::function<bool()>& isSo) {
  std::unique_lock lock(_mutex);
  return _changed.wait_for(lock, std::chrono::seconds(30), isSo);
}

TaskOutcome RecordingURLSessionDelegate::waitFor(const std::shared_ptr<URLSessionTask>& task) {
  EXPECT_TRUE(waitUntil([&] { return _outcomes[task.get()].completions > 0; })) << "the task did not complete";
  return outcome(task.get());
}

bool RecordingURLSessionDelegate::waitForBytes(const std::shared_ptr<URLSessionTask>& task, size_t count) {
  return waitUntil([&] { return _outcomes[task.get()].body().size() >= count; });
}

bool RecordingURLSessionDelegate::waitUntilInvalid() {
  return waitUntil([&] { return _isInvalid; });
}

TaskOutcome RecordingURLSessionDelegate::outcome(const URLSessionTask* task) const {
  const std::lock_guard lock(_mutex);
  const auto found = _outcomes.find(task);
  return found == _outcomes.end() ? TaskOutcome() : found->second;
}

bool RecordingURLSessionDelegate::isInvalid() const {
  const std::lock_guard lock(_mutex);
  return _isInvalid;
}

std::vector<std::string> RecordingURLSessionDelegate::calls() const {
  const std::lock_guard lock(_mutex);
  return _calls;
}

void RecordingURLSessionDelegate::refuseResponses() {
  const std::lock_guard lock(_mutex);
  _refusesResponses = true;
}

void RecordingURLSessionDelegate::record(const char* call, URLSessionTask* task,
                                         const std::function<void(TaskOutcome&)>& change) {
  EXPECT_TRUE(_queue->isCurrent()) << call << " came outside the delegate queue";
  const std::lock_guard lock(_mutex);
  EXPECT_FALSE(_isInvalid) << call << " came after the session had become invalid";
  _calls.push_back(task != nullptr ? std::string(call) + " " + task->taskDescription() : call);
  if (task != nullptr) {
    TaskOutcome& outcome = _outcomes[task];
    EXPECT_EQ(outcome.completions, 0) << call << " came after the task's completion";
    change(outcome);
  } else {
    _isInvalid = true;
  }
  _changed.notify_all();
}

void RecordingURLSessionDelegate::didBecomeInvalidWithError(URLSession&, const std::optional<Error>& error) {
  EXPECT_FALSE(error.has_value());
  record("invalid", nullptr, {});
}

void RecordingURLSessionDelegate::didSendBodyData(URLSession&, URLSessionTask& task, int64_t totalBytesSent,
                                                  int64_t totalBytesExpectedToSend) {
  record("sent", &task, [=](TaskOutcome& outcome) {
    EXPECT_GT(totalBytesSent, outcome.sent);
    outcome.sent = totalBytesSent;
    outcome.expectedToSend = totalBytesExpectedToSend;
  });
}

void RecordingURLSessionDelegate::didCompleteWithError(URLSession&, URLSessionTask& task,
                                                       const std::optional<Error>& error) {
  record("completed", &task, [&](TaskOutcome& outcome) {
    ++outcome.completions;
    outcome.error = error;
    outcome.response = task.response();
  });
}

URLSessionDelegate::ResponseDisposition RecordingURLSessionDelegate::didReceiveResponse(URLSession&,
                                                                                        URLSessionTask& task) {
  record("response", &task, [&](TaskOutcome& outcome) {
    EXPECT_FALSE(outcome.response.has_value()) << "a second response";
    outcome.response = task.response();
  });
  const std::lock_guard lock(_mutex);
  return _refusesResponses ? ResponseDisposition::Cancel : ResponseDisposition::Allow;
}

void RecordingURLSessionDelegate::didBecomeDownloadTask(URLSession&, URLSessionTask&) {
  ADD_FAILURE() << "no task becomes a download";
}

void RecordingURLSessionDelegate::didReceiveData(URLSession&, URLSessionTask& task, const Data& data) {
  record("data", &task, [&](TaskOutcome& outcome) { outcome.pieces.emplace_back(data.view()); });
}

}  // namespace telvane::testing
