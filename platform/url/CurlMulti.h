#pragma once

#include <curl/curl.h>

#include <memory>
#include <unordered_set>
#include <vector>

#include "platform/url/CurlLoop.h"

namespace telvane {

// The kept connections of one session, with its TLS sessions and the transfers that run over them. Owned by its session
// and confined to the loop's thread, from the first transfer on.
class CurlMulti {
 public:
  static constexpr long kConnectionsPerHost = 6;

  // member: whose sockets and timer these are, and who is told by the loop.
  CurlMulti(CurlLoop& loop, CurlLoop::Member& member);
  // Ends all transfers and closes all connections.
  ~CurlMulti();
  CurlMulti(const CurlMulti&) = delete;
  CurlMulti& operator=(const CurlMulti&) = delete;

  // Gives an easy handle without options that shares this session's connections. It goes back with `remove`.
  CURL* newHandle();
  // Starts the transfer that the handle describes.
  void add(CURL* handle);
  // Ends the handle's transfer, wherever it stands, and takes the handle back. A connection whose transfer was complete
  // is kept.
  void remove(CURL* handle);

  void socketReady(int socket, int events);
  void timerFired();

  struct Done {
    CURL* handle = nullptr;
    CURLcode result = CURLE_OK;
  };
  // Takes the next transfer that has ended; its handle is null when there is none.
  Done nextDone();

 private:
  static constexpr size_t kSpareHandles = 4;

  static int socketChanged(CURL* handle, curl_socket_t socket, int what, void* self, void* socketData);
  static int timerChanged(CURLM* multi, long milliseconds, void* self);

  CurlLoop& _loop;
  CurlLoop::Member& _member;
  CURLM* const _multi;
  CURLSH* const _share;
  std::unordered_set<CURL*> _running;
  std::vector<CURL*> _spare;
};

}  // namespace telvane
