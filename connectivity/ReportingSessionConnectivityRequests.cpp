// The request side of ReportingSessionConnectivityHelper: GETs, POSTs, and what the URL session tells of them.
#include "connectivity/ReportingSessionConnectivityHelper.h"
#include "interfaces/TelvaneErrors.h"

namespace telvane {
namespace {

constexpr uint32_t kLongestPullDelaySeconds = 7200;

std::string describe(const std::optional<Error>& error) { return error.has_value() ? error->description() : "(null)"; }

std::string describe(const std::optional<URLResponse>& response) {
  return response.has_value() ? fmt::format("{}", response->statusCode) : "(null)";
}

void completeWithFailure(RequestCompletion& completion, std::string_view text, int64_t code) {
  if (completion) completion(Data(), nullptr, makeTelvaneError(text, code));
}

}  // namespace

bool ReportingSessionConnectivityHelper::admitGET(const std::string& url) {
  MutexLock lock(_shared.admissionLock);
  return _requestInProgress.emplace(url, true).second;
}

void ReportingSessionConnectivityHelper::finishGET(const std::string& url) {
  MutexLock lock(_shared.admissionLock);
  _requestInProgress[url] = false;
}

void ReportingSessionConnectivityHelper::getURLRequestWithCompletionHandler(URLRequest request, bool isUrgent,
                                                                            RequestCompletion completion) {
  if (_mode != GETRequestMode() && _mode != kBackgroundGETRequestMode) {
    log().error("getURLRequestWithCompletionHandler: wrong mode for GET operation detected {}", _mode);
    completeWithFailure(completion, "getURLRequestWithCompletionHandler: unrecognized mode", _mode);
    return;
  }
  const std::string url = request.url;
  if (!admitGET(url)) {
    log().message("getURLRequestWithCompletionHandler: ignored duplicate request for storebag '{}'", url);
    return;
  }
  Job pullJob = [self = shared_from_this(), request = std::move(request),
                 completion = std::move(completion)]() mutable {
    self->_stateQueue->assertOnQueue();
    self->pull(std::move(request), std::move(completion));
  };
  if (isUrgent) {
    log().message("getURLRequestWithCompletionHandler: storebag immediate pull for '{}' has been initiated", url);
    _stateQueue->async(std::move(pullJob));
    return;
  }
  const std::chrono::seconds delay(_context.platform().random.uniform(kLongestPullDelaySeconds));
  const auto now = _context.platform().clock.monotonicNow();
  log().message(
      "getURLRequestWithCompletionHandler: storebag delayed pull for '{}' delayed by {} seconds has been initiated. "
      "Time now {}, scheduled time to pull {}",
      url, delay.count(), now.time_since_epoch().count(), (now + delay).time_since_epoch().count());
  _stateQueue->asyncAfter(delay, std::move(pullJob));
}

void ReportingSessionConnectivityHelper::pull(URLRequest request, RequestCompletion completion) {
  const std::string url = request.url;
  if (!_isActive) {
    completeWithFailure(completion, "ConnectivityHelper is not ative", -1);
    finishGET(url);
    log().message(
        "getURLRequestWithCompletionHandler: new storebag pull for '{}' has been cancelled as NSURLSession is not "
        "active",
        url);
    return;
  }
  Result<std::shared_ptr<URLSessionTask>> task = _privateURLSession->newDataTask(std::move(request));
  if (task.has_error()) {
    log().error(
        "getURLRequestWithCompletionHandler: underlying NSURLSession has been invalidated with error {}. Ignoring GET "
        "request.",
        task.error());
    completeWithFailure(completion, "getURLRequestWithCompletionHandler: unable to create data task", -1);
    finishGET(url);
    log().message(
        "getURLRequestWithCompletionHandler: new storebag pull for '{}' has been cancelled as NSURLSession data task "
        "creation has failed",
        url);
    return;
  }
  auto wrapped = [self = weak_from_this(), url, completion = std::move(completion)](
                     const Data& data, const URLResponse* response, const std::optional<Error>& error) mutable {
    if (completion) completion(data, response, error);
    if (const auto helper = std::static_pointer_cast<ReportingSessionConnectivityHelper>(self.lock())) {
      helper->finishGET(url);
      helper->log().message(
          "getURLRequestWithCompletionHandler: new storebag pull for '{}' has been completed with error {}", url,
          describe(error));
    }
  };
  createHelperForTask(**task, std::move(wrapped));
  (*task)->resume();
}

void ReportingSessionConnectivityHelper::postURLRequestWithCompletionHandler(URLRequest request,
                                                                             RequestCompletion completion) {
  _stateQueue->async(
      [self = shared_from_this(), request = std::move(request), completion = std::move(completion)]() mutable {
        self->_stateQueue->assertOnQueue();
        self->postOnStateQueue(std::move(request), std::move(completion));
      });
}

void ReportingSessionConnectivityHelper::postOnStateQueue(URLRequest request, RequestCompletion completion) {
  if (!_isActive) return;
  std::optional<Result<std::shared_ptr<URLSessionTask>>> task;
  if (_mode == POSTRequestMode()) {
    task = _privateURLSession->newDataTask(std::move(request));
  } else if (_mode == kBackgroundPOSTRequestMode) {
    task = newBackgroundUpload(std::move(request));
  } else {
    log().error("postURLRequestWithCompletionHandler: wrong mode for POST operation detected {}", _mode);
  }
  if (!task.has_value()) return;
  if (task->has_error()) {
    log().error(
        "postURLRequestWithCompletionHandler: underlying NSURLSession has been invalidated with error {}. Ignoring "
        "POST request.",
        task->error());
    return;
  }
  createHelperForTask(**(*task), std::move(completion));
  (**task)->resume();
}

std::optional<Result<std::shared_ptr<URLSessionTask>>> ReportingSessionConnectivityHelper::newBackgroundUpload(
    URLRequest request) {
  // A body that is a file already needs no other one.
  if (request.bodyFile != nullptr) return _privateURLSession->newDataTask(std::move(request));
  const std::string container = composeUniqueContainerURL();
  if (!_context.platform().files.write(container, request.body).has_value()) return std::nullopt;
  request.body = Data();
  auto task = _privateURLSession->newUploadTask(std::move(request), _context.platform().files.resolve(container));
  deleteContainerAtURL(container);
  return task;
}

void ReportingSessionConnectivityHelper::createHelperForTask(URLSessionTask& task, RequestCompletion completion) {
  std::string description = fmt::format("Task_{:08x}", ++_shared.taskCounter);
  task.setTaskDescription(description);
  _tasks[description] = std::make_unique<ConnectivityHelperTask>(log(), description, std::move(completion));
  log().message("createHelperForTask: created helperTask for task <{}>", description);
}

URLSessionDelegate::ResponseDisposition ReportingSessionConnectivityHelper::didReceiveResponse(URLSession& session,
                                                                                               URLSessionTask& task) {
  log().message("didReceiveResponse: for <session>:<task> <{}>:<{}>", session.sessionDescription(),
                task.taskDescription());
  return ResponseDisposition::Allow;
}

// The next two move to the state queue by waiting for it: nobody waits for the delegate queue, and an idle state queue
// costs no hop this way.
void ReportingSessionConnectivityHelper::didReceiveData(URLSession& session, URLSessionTask& task, const Data& data) {
  _stateQueue->sync([this, &session, &task, &data] {
    _stateQueue->assertOnQueue();
    log().message("didReceiveData: received {} bytes for <session>:<task> <{}>:<{}>", data.size(),
                  session.sessionDescription(), task.taskDescription());
    const auto found = _tasks.find(task.taskDescription());
    if (found != _tasks.end()) found->second->appendReceivedData(data);
  });
}

void ReportingSessionConnectivityHelper::didCompleteWithError(URLSession& session, URLSessionTask& task,
                                                              const std::optional<Error>& error) {
  _stateQueue->sync([this, &session, &task, &error] {
    _stateQueue->assertOnQueue();
    if (log().isEnabled(LogLevel::Default)) {
      log().message("didCompleteWithError: for <session>:<task> <{}>:<{}> with response {}, error {}",
                    session.sessionDescription(), task.taskDescription(), describe(task.response()), describe(error));
    }
    completeTask(task.taskDescription(), task.response(), error);
  });
}

void ReportingSessionConnectivityHelper::completeTask(const std::string& description,
                                                      const std::optional<URLResponse>& response,
                                                      const std::optional<Error>& error) {
  const auto found = _tasks.find(description);
  if (found == _tasks.end()) return;
  const std::unique_ptr<ConnectivityHelperTask> task = std::move(found->second);
  _tasks.erase(found);
  RequestCompletion completion = std::move(task->completionHandler());
  if (completion) completion(task->takeReceivedData(), response.has_value() ? &*response : nullptr, error);
}

void ReportingSessionConnectivityHelper::didSendBodyData(URLSession& session, URLSessionTask& task,
                                                         int64_t totalBytesSent, int64_t totalBytesExpectedToSend) {
  log().message("didSendBodyData: for <session>:<task> <{}>:<{}>: Sent {} out of {}", session.sessionDescription(),
                task.taskDescription(), totalBytesSent, totalBytesExpectedToSend);
}

void ReportingSessionConnectivityHelper::didBecomeDownloadTask(URLSession& session, URLSessionTask&) {
  log().error("didBecomeDownloadTask: session <{}> has become downoad task. SHOULD NEVER HAPPEN!!!",
              session.sessionDescription());
}

void ReportingSessionConnectivityHelper::didBecomeInvalidWithError(URLSession& session,
                                                                   const std::optional<Error>& error) {
  _stateQueue->async([self = shared_from_this(), sessionDescription = session.sessionDescription(), error] {
    self->_stateQueue->assertOnQueue();
    self->log().message("didBecomeInvalidWithError: release {} XPC transactions for session {}",
                        self->_totalSessionsServedCount.load(), sessionDescription);
    self->releaseAllXPCTransactions();
    self->log().message("didBecomeInvalidWithError: session <{}> invalidated with error {}", sessionDescription,
                        describe(error));
    std::erase_if(self->_retiringURLSessions, [&sessionDescription](const auto& retiring) {
      return retiring->sessionDescription() == sessionDescription;
    });
  });
}

}  // namespace telvane
