#pragma once

#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/ssl/context.hpp>
#include <functional>
#include <memory>

#include "platform/url/HTTPServer.h"

namespace telvane {

// One peer of an HTTPServer: reads a request, hands it to the handler, writes the answer, reads the next. Kept by the
// server until it has ended; runs in the executor of its socket, which must be a strand.
class HTTPServerConnection : public std::enable_shared_from_this<HTTPServerConnection> {
 public:
  // What connections need of their server. Shared with them, because a late answer may still hold one when the server
  // has gone.
  struct Server {
    HTTPServer::Options options;
    HTTPServer::Handler handler;
    HTTPServer::SinkMaker sinkMaker;  // may be empty
    std::shared_ptr<boost::asio::io_context> context;
    std::function<void(const std::shared_ptr<HTTPServerConnection>&)> connectionEnded;
  };

  // tls: null for plain http.
  static std::shared_ptr<HTTPServerConnection> make(std::shared_ptr<const Server> server,
                                                    boost::asio::ip::tcp::socket socket,
                                                    boost::asio::ssl::context* tls);
  virtual ~HTTPServerConnection() = default;
  // Begins to serve. Once.
  virtual void start() = 0;
  // Ends it where it stands. Safe from any thread.
  virtual void close() = 0;
};

}  // namespace telvane
