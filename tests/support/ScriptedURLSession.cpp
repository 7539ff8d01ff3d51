#include "tests/support/ScriptedURLSession.h"

#include <algorithm>
#include <utility>

#include "tests/support/BodyBytes.h"
#include "tests/support/ScriptedURLSessionTask.h"

namespace telvane::testing {

ScriptedURLSession::ScriptedURLSession(ScriptedURLSessionEnvironment environment, URLSessionConfiguration configuration,
                                       std::shared_ptr<URLSessionDelegate> delegate,
                                       std::shared_ptr<SerialQueue> delegateQueue)
    : _environment(std::move(environment)),
      _configuration(std::move(configuration)),
      _delegateQueue(std::move(delegateQueue)),
      _delegate(std::move(delegate)) {}

Result<std::shared_ptr<URLSessionTask>> ScriptedURLSession::newDataTask(URLRequest request) {
  const bool isUpload = request.bodyFile != nullptr;
  if (isUpload) request.body = bodyBytes(request);
  request.bodyFile = nullptr;
  return newTask(std::move(request), isUpload);
}

Result<std::shared_ptr<URLSessionTask>> ScriptedURLSession::newUploadTask(URLRequest request, const std::string& path) {
  Result<Data> content = _environment.files.read(path, UINT64_MAX);
  if (!content) return content.error();
  request.body = *std::move(content);
  return newTask(std::move(request), true);
}

Result<std::shared_ptr<URLSessionTask>> ScriptedURLSession::newTask(URLRequest request, bool isUpload) {
  if (_state != State::Active) return networkError(URLErrorCode::SessionInvalidated);
  const bool isHTTP = request.url.rfind("https://", 0) == 0 || request.url.rfind("http://", 0) == 0;
  if (!isHTTP || request.url.find_first_of(" \r\n") != std::string::npos) return networkError(URLErrorCode::BadURL);
  return std::shared_ptr<URLSessionTask>(
      std::make_shared<ScriptedURLSessionTask>(shared_from_this(), std::move(request), isUpload));
}

void ScriptedURLSession::finishTasksAndInvalidate() {
  if (_state != State::Active) return;
  _state = State::Finishing;
  invalidateIfFinished();
}

void ScriptedURLSession::cancelUnlessFinishing() {
  if (_state != State::Active) return;
  _state = State::Finishing;
  const auto running = _running;
  for (const auto& task : running) task->cancel();
  invalidateIfFinished();
}

void ScriptedURLSession::vanish() {
  _state = State::Invalid;
  const auto running = std::exchange(_running, {});
  for (const auto& task : running) task->vanish();
  const auto delegate = std::exchange(_delegate, nullptr);
}

void ScriptedURLSession::started(std::shared_ptr<ScriptedURLSessionTask> task) { _running.push_back(std::move(task)); }

void ScriptedURLSession::completed(const std::shared_ptr<ScriptedURLSessionTask>& task) {
  std::erase(_running, task);
  invalidateIfFinished();
}

void ScriptedURLSession::tellDelegate(UniqueFunction<void(URLSessionDelegate& delegate)> call) {
  _delegateQueue->async([self = shared_from_this(), call = std::move(call)]() mutable {
    if (self->_delegate != nullptr) call(*self->_delegate);
  });
}

void ScriptedURLSession::invalidateIfFinished() {
  if (_state != State::Finishing || !_running.empty()) return;
  _state = State::Invalid;
  _delegateQueue->async([self = shared_from_this()] {
    const auto delegate = std::exchange(self->_delegate, nullptr);
    if (delegate != nullptr) delegate->didBecomeInvalidWithError(*self, std::nullopt);
  });
}

}  // namespace telvane::testing
