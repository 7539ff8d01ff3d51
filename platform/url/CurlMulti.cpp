#include "platform/url/CurlMulti.h"

#include <chrono>
#include <new>

namespace telvane {

CurlMulti::CurlMulti(CurlLoop& loop, CurlLoop::Member& member)
    : _loop(loop), _member(member), _multi(curl_multi_init()), _share(curl_share_init()) {
  if (_multi == nullptr || _share == nullptr) throw std::bad_alloc();
  curl_multi_setopt(_multi, CURLMOPT_SOCKETFUNCTION, &CurlMulti::socketChanged);
  curl_multi_setopt(_multi, CURLMOPT_SOCKETDATA, this);
  curl_multi_setopt(_multi, CURLMOPT_TIMERFUNCTION, &CurlMulti::timerChanged);
  curl_multi_setopt(_multi, CURLMOPT_TIMERDATA, this);
  curl_multi_setopt(_multi, CURLMOPT_MAX_HOST_CONNECTIONS, kConnectionsPerHost);
  curl_multi_setopt(_multi, CURLMOPT_MAXCONNECTS, kConnectionsPerHost);
  curl_share_setopt(_share, CURLSHOPT_SHARE, CURL_LOCK_DATA_SSL_SESSION);
}

CurlMulti::~CurlMulti() {
  while (!_running.empty()) remove(*_running.begin());
  for (CURL* handle : _spare) curl_easy_cleanup(handle);
  curl_multi_cleanup(_multi);
  curl_share_cleanup(_share);
}

CURL* CurlMulti::newHandle() {
  CURL* handle = nullptr;
  if (_spare.empty()) {
    handle = curl_easy_init();
    if (handle == nullptr) throw std::bad_alloc();
  } else {
    handle = _spare.back();
    _spare.pop_back();
  }
  curl_easy_setopt(handle, CURLOPT_SHARE, _share);
  return handle;
}

void CurlMulti::add(CURL* handle) {
  _running.insert(handle);
  curl_multi_add_handle(_multi, handle);
}

void CurlMulti::remove(CURL* handle) {
  if (_running.erase(handle) > 0) curl_multi_remove_handle(_multi, handle);
  if (_spare.size() >= kSpareHandles) return curl_easy_cleanup(handle);
  curl_easy_reset(handle);
  _spare.push_back(handle);
}

void CurlMulti::socketReady(int socket, int events) {
  int running = 0;
  curl_multi_socket_action(_multi, socket, events, &running);
}

void CurlMulti::timerFired() {
  int running = 0;
  curl_multi_socket_action(_multi, CURL_SOCKET_TIMEOUT, 0, &running);
}

CurlMulti::Done CurlMulti::nextDone() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(_multi, &left)) {
    if (message->msg == CURLMSG_DONE) return {message->easy_handle, message->data.result};
  }
  return {};
}

int CurlMulti::socketChanged(CURL*, curl_socket_t socket, int what, void* self, void*) {
  auto& multi = *static_cast<CurlMulti*>(self);
  if (what == CURL_POLL_REMOVE) {
    multi._loop.unwatch(socket);
  } else {
    multi._loop.watch(socket, what, multi._member);
  }
  return 0;
}

int CurlMulti::timerChanged(CURLM*, long milliseconds, void* self) {
  auto& multi = *static_cast<CurlMulti*>(self);
  multi._loop.setTimer(multi._member,
                       milliseconds < 0 ? std::nullopt : std::optional(std::chrono::milliseconds(milliseconds)));
  return 0;
}

}  // namespace telvane
