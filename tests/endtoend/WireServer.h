#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "tests/support/TestCertificates.h"

namespace telvane::testing {

// One request exactly as it came over the line.
struct WireRequest {
  size_t connection = 0;  // counted from 0 in the order in which connections were accepted
  std::string head;       // the request line and the header lines, with the empty line that ends them
  std::string body;       // as many bytes as "Content-Length" says

  // The head's lines without their ends, the request line first.
  std::vector<std::string> lines() const;
  // The value of the header of exactly that name; nothing when there is none or more than one.
  std::optional<std::string> header(std::string_view name) const;
  bool isGet() const { return head.starts_with("GET "); }
  // What stands between the method and the protocol.
  std::string target() const;
};

// A server that knows nothing of HTTP but where a request ends: it keeps every byte that a client sends, and says what
// it is told to say. Over TLS, or plain. Runs on threads of its own until it is let go of. Safe from any thread.
class WireServer {
 public:
  enum class Then { Keep, Close, Reset };
  struct Answer {
    std::string bytes;
    Then then = Then::Keep;
  };
  // Called on the connection's thread; may block as long as the server is to be slow.
  using Respond = std::function<Answer(const WireRequest&)>;
  using Certificate = TestCertificates::Server;

  // certificate: nothing for a plain one. port: 0 for any that is free; another one to come back where a server was.
  WireServer(const std::optional<Certificate>& certificate, Respond respond, uint16_t port = 0);
  // Ends all connections and waits for their threads.
  ~WireServer();
  WireServer(const WireServer&) = delete;
  WireServer& operator=(const WireServer&) = delete;

  // An answer with that status and body over a connection that is kept.
  static Answer answer(int status, std::string_view body = "{}");

  uint16_t port() const noexcept { return _port; }
  std::string address() const { return "127.0.0.1:" + std::to_string(_port); }
  std::string url(std::string_view path) const;
  std::vector<WireRequest> requests() const;
  // The requests that are no GET.
  std::vector<WireRequest> posts() const;
  // How many connections were accepted, whatever came over them.
  size_t connections() const;
  // What came and was no complete request, one text per connection that had such bytes.
  std::vector<std::string> strays() const;

 private:
  class Line;
  struct TLS;
  void acceptConnections();
  void serve(Line& line, size_t connection);
  // Reads one request; nothing when the client has ended, or said too little.
  std::optional<WireRequest> read(Line& line, size_t connection, std::string& buffer);

  const Respond _respond;
  std::shared_ptr<TLS> _tls;
  int _socket = -1;
  uint16_t _port = 0;
  mutable std::mutex _mutex;
  std::vector<WireRequest> _requests;
  std::vector<std::string> _strays;
  std::vector<int> _openSockets;
  size_t _connections = 0;
  std::vector<std::thread> _threads;
  std::thread _acceptor;
};

}  // namespace telvane::testing
