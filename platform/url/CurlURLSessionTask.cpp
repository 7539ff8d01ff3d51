#include "platform/url/CurlURLSessionTask.h"

#include <utility>

#include "platform/url/CurlURLSession.h"

namespace telvane {

CurlURLSessionTask::CurlURLSessionTask(std::shared_ptr<CurlURLSession> session, URLRequest request,
                                       std::unique_ptr<UploadFile> file)
    : _session(std::move(session)),
      _heldBytes(file ? 0 : request.body.size()),
      _request(std::move(request)),
      _file(std::move(file)) {}

void CurlURLSessionTask::resume() {
  // Relaxed: only one caller goes on, and what it goes on with is handed over under the session's lock.
  if (!_isResumed.exchange(true, std::memory_order_relaxed)) _session->resume(shared_from_this());
}

void CurlURLSessionTask::releaseBody() {
  _request.body = Data();
  _file = nullptr;
}

}  // namespace telvane
