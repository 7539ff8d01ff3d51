#include "platform/url/HTTPServer.h"

#include <fmt/format.h>
#include <strings.h>

#include <algorithm>
#include <atomic>
#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/ssl/context.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/asio/strand.hpp>
#include <unordered_set>

#include "platform/Mutex.h"
#include "platform/dispatch/Thread.h"
#include "platform/url/HTTPServerConnection.h"

namespace telvane {

namespace asio = boost::asio;
using asio::ip::tcp;
using ErrorCode = boost::system::error_code;

class HTTPServer::Core : public std::enable_shared_from_this<HTTPServer::Core> {
 public:
  Core(Options options, Handler handler, SinkMaker sinkMaker)
      : _options(std::move(options)),
        _handler(std::move(handler)),
        _sinkMaker(std::move(sinkMaker)),
        _context(std::make_shared<asio::io_context>(static_cast<int>(std::max(1u, _options.threads)))),
        _acceptor(asio::make_strand(*_context)),
        _pause(_acceptor.get_executor()) {}

  // Throws boost::system::system_error.
  void open();
  void run();
  void stop() EXCLUDES(_mutex);

  const std::string& address() const noexcept { return _address; }
  uint16_t port() const noexcept { return _port; }
  uint64_t acceptedConnections() const noexcept { return _accepted.load(std::memory_order_relaxed); }

 private:
  void useCertificate();
  void acceptNext();
  void accepted(ErrorCode error, tcp::socket socket);
  void serve(tcp::socket socket) EXCLUDES(_mutex);
  void connectionEnded(const std::shared_ptr<HTTPServerConnection>& connection) EXCLUDES(_mutex);

  // Constant after open.
  const Options _options;
  const Handler _handler;
  const SinkMaker _sinkMaker;
  std::string _address;
  uint16_t _port = 0;
  std::optional<asio::ssl::context> _tls;
  std::shared_ptr<const HTTPServerConnection::Server> _server;

  const std::shared_ptr<asio::io_context> _context;
  tcp::acceptor _acceptor;
  asio::steady_timer _pause;
  std::atomic<uint64_t> _accepted = 0;
  std::vector<std::unique_ptr<Thread>> _threads;

  Mutex _mutex;
  std::unordered_set<std::shared_ptr<HTTPServerConnection>> _connections GUARDED_BY(_mutex);
  bool _isStopping GUARDED_BY(_mutex) = false;
};

void HTTPServer::Core::open() {
  const tcp::endpoint endpoint(asio::ip::make_address(_options.host), _options.port);
  if (!_options.certificateFile.empty() || !_options.privateKeyFile.empty()) useCertificate();
  _acceptor.open(endpoint.protocol());
  _acceptor.set_option(tcp::acceptor::reuse_address(true));
  _acceptor.bind(endpoint);
  _acceptor.listen();
  _port = _acceptor.local_endpoint().port();
  const char* format = endpoint.address().is_v6() ? "[{}]:{}" : "{}:{}";
  _address = fmt::format(fmt::runtime(format), _options.host, _port);
  _server = std::make_shared<const HTTPServerConnection::Server>(HTTPServerConnection::Server{
      _options, _handler, _sinkMaker, _context, [core = weak_from_this()](const auto& connection) {
        if (const auto strong = core.lock()) strong->connectionEnded(connection);
      }});
}

void HTTPServer::Core::useCertificate() {
  _tls.emplace(asio::ssl::context::tls_server);
  _tls->set_options(asio::ssl::context::default_workarounds | asio::ssl::context::no_tlsv1 |
                    asio::ssl::context::no_tlsv1_1);
  _tls->use_certificate_chain_file(_options.certificateFile);
  _tls->use_private_key_file(_options.privateKeyFile, asio::ssl::context::pem);
}

void HTTPServer::Core::run() {
  acceptNext();
  for (unsigned i = 0; i < std::max(1u, _options.threads); ++i) {
    _threads.push_back(std::make_unique<Thread>("telvane-http", [this] { _context->run(); }));
  }
}

void HTTPServer::Core::stop() {
  std::vector<std::shared_ptr<HTTPServerConnection>> connections;
  {
    const MutexLock lock(_mutex);
    _isStopping = true;
    connections.assign(_connections.begin(), _connections.end());
  }
  for (const auto& connection : connections) connection->close();
  // Last, because the threads end when nothing is under way any more.
  asio::post(_acceptor.get_executor(), [this] {
    ErrorCode ignored;
    _acceptor.close(ignored);
    _pause.cancel();
  });
  _threads.clear();
}

void HTTPServer::Core::acceptNext() {
  _acceptor.async_accept(asio::make_strand(*_context),
                         [this](ErrorCode error, tcp::socket socket) { accepted(error, std::move(socket)); });
}

void HTTPServer::Core::accepted(ErrorCode error, tcp::socket socket) {
  if (!_acceptor.is_open()) return;
  if (!error) {
    _accepted.fetch_add(1, std::memory_order_relaxed);
    serve(std::move(socket));
    return acceptNext();
  }
  // Without a free descriptor the same connection would fail again and again at full speed.
  _pause.expires_after(std::chrono::milliseconds(50));
  _pause.async_wait([this](ErrorCode) {
    if (_acceptor.is_open()) acceptNext();
  });
}

void HTTPServer::Core::serve(tcp::socket socket) {
  std::shared_ptr<HTTPServerConnection> connection;
  {
    const MutexLock lock(_mutex);
    if (_isStopping || _connections.size() >= _options.maximumConnections) return;
    connection = HTTPServerConnection::make(_server, std::move(socket), _tls ? &*_tls : nullptr);
    _connections.insert(connection);
  }
  connection->start();
}

void HTTPServer::Core::connectionEnded(const std::shared_ptr<HTTPServerConnection>& connection) {
  const MutexLock lock(_mutex);
  _connections.erase(connection);
}

Result<std::unique_ptr<HTTPServer>> HTTPServer::start(Options options, Handler handler, SinkMaker sinkMaker) {
  try {
    auto core = std::make_shared<Core>(std::move(options), std::move(handler), std::move(sinkMaker));
    core->open();
    core->run();
    return std::unique_ptr<HTTPServer>(new HTTPServer(std::move(core)));
  } catch (const std::exception& exception) {
    const auto* failure = dynamic_cast<const boost::system::system_error*>(&exception);
    return Error::withDescription(kPlatformErrorDomain, failure ? failure->code().value() : EINVAL,
                                  fmt::format("The server cannot be started: {}", exception.what()));
  }
}

HTTPServer::HTTPServer(std::shared_ptr<Core> core) : _core(std::move(core)) {}

HTTPServer::~HTTPServer() { _core->stop(); }

const std::string& HTTPServer::address() const noexcept { return _core->address(); }

uint16_t HTTPServer::port() const noexcept { return _core->port(); }

uint64_t HTTPServer::acceptedConnections() const noexcept { return _core->acceptedConnections(); }

const std::string* HTTPServer::Request::header(std::string_view name) const noexcept {
  const auto found = std::find_if(headers.begin(), headers.end(), [name](const Header& header) {
    return header.name.size() == name.size() && strncasecmp(header.name.data(), name.data(), name.size()) == 0;
  });
  return found == headers.end() ? nullptr : &found->value;
}

}  // namespace telvane
