#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "platform/URLSession.h"

namespace telvane {

// A small HTTP/1.1 server, over TLS or plain, with kept connections. Owned by who started it; runs on threads of its
// own until it is let go of, which closes all connections. Everything that a peer sends is bounded in size and time.
class HTTPServer {
 public:
  using Header = URLRequest::Header;

  struct Options {
    std::string host = "127.0.0.1";  // an address, not a name
    uint16_t port = 0;               // 0 picks a free one
    // PEM files of the certificate with its chain and of its key; both empty: plain http.
    std::string certificateFile;
    std::string privateKeyFile;
    // Answered with 413 and 431 when exceeded; the connection ends. The first holds for bodies that are gathered.
    uint64_t maximumBodyBytes = 64ull << 20;
    // The same for a body that a sink takes in pieces.
    uint64_t maximumPiecewiseBodyBytes = 16ull << 30;
    uint32_t maximumHeadBytes = 64u << 10;
    // More are closed at once.
    size_t maximumConnections = 1024;
    // For a whole request from its first byte, for each piece of a body that goes to a sink, for the TLS handshake, and
    // for a peer to take a piece of the response.
    std::chrono::milliseconds transferTimeout = std::chrono::seconds(60);
    // Between requests.
    std::chrono::milliseconds idleTimeout = std::chrono::seconds(120);
    unsigned threads = 1;
  };

  // Takes the body of one request in pieces, so that it need not fit into memory. Kept by the request's connection,
  // then by the request; let go of earlier when the connection ends before the body.
  class BodySink {
   public:
    virtual ~BodySink() = default;
    // Returns 0 to go on, or the HTTP status that refuses the request and ends its connection.
    virtual int take(std::string_view piece) = 0;
  };

  struct Request {
    std::string method;
    std::string target;           // as sent, not decoded
    std::vector<Header> headers;  // names as sent and in that order, those of one name side by side
    Data body;                    // as sent, not decompressed; empty when a sink has taken it
    std::string peerAddress;      // HOST:PORT
    std::shared_ptr<BodySink> sink;

    // The value of the first header of that name, compared without regard to case; null when there is none.
    const std::string* header(std::string_view name) const noexcept;
  };

  struct Response {
    int status = 200;
    // Content-Length, Transfer-Encoding and Connection are added; line breaks in names and values become blanks.
    std::vector<Header> headers;
    Data body;
  };

  // Takes the answer to one request, now or later, from any thread. Letting go of it without an answer ends the
  // connection; so does an answer that is not finished. Calls after the end of the answer do nothing.
  class Responder {
   public:
    virtual ~Responder() = default;
    virtual void send(Response response) = 0;
    // Sends the head alone; the body comes in pieces. length: what the head says, whatever comes then; absent: chunks.
    virtual void sendHead(Response response, std::optional<uint64_t> length) = 0;
    virtual void sendPiece(Data piece) = 0;
    virtual void finish() = 0;
    // Closes the connection where it stands.
    virtual void close() = 0;
  };

  // Called on one of the server's threads for each request; while it runs, that thread serves nobody else.
  using Handler = std::function<void(Request request, std::shared_ptr<Responder> responder)>;

  // Called on one of the server's threads with a request whose body was not read yet. Returns what takes the body, or
  // null to have it gathered.
  using SinkMaker = std::function<std::shared_ptr<BodySink>(const Request& head)>;

  // Opens the socket and starts to serve. Fails when the address or the certificate cannot be used. sinkMaker: may be
  // empty; all bodies are gathered then.
  static Result<std::unique_ptr<HTTPServer>> start(Options options, Handler handler, SinkMaker sinkMaker = nullptr);
  // Closes everything and waits for the threads. Not from a handler.
  ~HTTPServer();
  HTTPServer(const HTTPServer&) = delete;
  HTTPServer& operator=(const HTTPServer&) = delete;

  // HOST:PORT, with the port that was picked.
  const std::string& address() const noexcept;
  uint16_t port() const noexcept;
  // How many connections were accepted so far. Safe from any thread.
  uint64_t acceptedConnections() const noexcept;

 private:
  class Core;
  explicit HTTPServer(std::shared_ptr<Core> core);

  const std::shared_ptr<Core> _core;
};

}  // namespace telvane
