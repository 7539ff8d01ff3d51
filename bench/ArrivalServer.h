#pragma once

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/url/HTTPServer.h"

namespace telvane::bench {

// A collector that says when each request arrived: the moment at which it has read the last byte, before it does
// anything with it. Its own answer, then, is no part of what is measured: it would be added to both sides of a
// comparison and bring their ratio nearer to one, the more so the slower it is.
class ArrivalServer {
 public:
  struct Arrival {
    double seconds = 0;  // on the monotonic clock
    HTTPServer::Request request;
  };

  // Serves over TLS with these PEM files. Throws std::runtime_error when it cannot.
  ArrivalServer(const std::string& certificateFile, const std::string& privateKeyFile);

  std::string url() const { return "https://" + _server->address() + "/events"; }
  uint64_t acceptedConnections() const noexcept { return _server->acceptedConnections(); }
  // The next request that has not been taken yet, waited for. Throws std::runtime_error when none comes.
  Arrival next();

 private:
  void take(HTTPServer::Request request, const std::shared_ptr<HTTPServer::Responder>& responder);

  std::mutex _mutex;
  std::condition_variable _hasArrived;
  std::deque<Arrival> _arrivals;        // guarded by _mutex
  std::unique_ptr<HTTPServer> _server;  // last: its threads use what stands above
};

}  // namespace telvane::bench
