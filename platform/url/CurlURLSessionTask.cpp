#include "platform/url/CurlURLSessionTask.h"

#include <utility>

#include "platform/url/CurlURLSession.h"

namespace telvane {
namespace {

uint64_t bytesOf(const URLRequest& request) {
  uint64_t bytes = request.url.size();
  for (const URLRequest::Header& header : request.headers) bytes += header.name.size() + header.value.size();
  return bytes;
}

}  // namespace

CurlURLSessionTask::CurlURLSessionTask(std::shared_ptr<CurlURLSession> session, URLRequest request)
    : _session(std::move(session)), _heldBytes(bytesOf(request) + request.body.size()), _request(std::move(request)) {}

void CurlURLSessionTask::resume() {
  // Relaxed: only one caller goes on, and what it goes on with is handed over under the session's lock.
  if (!_isResumed.exchange(true, std::memory_order_relaxed)) _session->resume(shared_from_this());
}

void CurlURLSessionTask::releaseRequest() { _request = URLRequest(); }

}  // namespace telvane
