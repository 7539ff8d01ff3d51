#include "platform/url/CurlEvents.h"

namespace telvane {

template <class T>
T* CurlEvents::lastOf(CurlURLSessionTask& task) {
  if (_events.empty() || _events.back().task.get() != &task) return nullptr;
  return std::get_if<T>(&_events.back().what);
}

void CurlEvents::didReceiveHead(CurlURLSessionTask& task, URLResponse response) {
  _events.push_back({task.shared_from_this(), Head{std::move(response)}});
}

void CurlEvents::didReceiveBytes(CurlURLSessionTask& task, std::string_view bytes) {
  if (Body* last = lastOf<Body>(task)) {
    last->bytes += bytes;
  } else {
    _events.push_back({task.shared_from_this(), Body{std::string(bytes)}});
  }
}

void CurlEvents::didSendBytes(CurlURLSessionTask& task, int64_t total) {
  if (Sent* last = lastOf<Sent>(task)) {
    last->total = total;
  } else {
    _events.push_back({task.shared_from_this(), Sent{total, static_cast<int64_t>(task.bodySize())}});
  }
}

void CurlEvents::didComplete(CurlURLSessionTask& task, std::optional<Error> error) {
  _events.push_back({task.shared_from_this(), Completed{std::move(error)}});
}

void CurlEvents::didBecomeInvalid() { _events.push_back({nullptr, BecameInvalid{}}); }

}  // namespace telvane
