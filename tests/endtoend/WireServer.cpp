#include "tests/endtoend/WireServer.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <openssl/ssl.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <stdexcept>

namespace telvane::testing {
namespace {

constexpr std::string_view kLineEnd = "\r\n";
constexpr std::string_view kHeadEnd = "\r\n\r\n";
constexpr size_t kMostBytes = 64u << 20;

// On this thread alone: what the test starts is to meet the signal as it would elsewhere.
void ignoreBrokenPipes() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

sockaddr* asAddress(sockaddr_in& address) { return reinterpret_cast<sockaddr*>(&address); }

}  // namespace

std::vector<std::string> WireRequest::lines() const {
  std::vector<std::string> result;
  std::string_view rest = head;
  while (!rest.empty() && rest != kLineEnd) {
    const size_t end = rest.find(kLineEnd);
    result.emplace_back(rest.substr(0, end));
    rest.remove_prefix(std::min(rest.size(), end + kLineEnd.size()));
  }
  return result;
}

std::optional<std::string> WireRequest::header(std::string_view name) const {
  std::optional<std::string> value;
  const std::string start = std::string(name) + ": ";
  for (const std::string& line : lines()) {
    if (!line.starts_with(start)) continue;
    if (value.has_value()) return std::nullopt;
    value = line.substr(start.size());
  }
  return value;
}

std::string WireRequest::target() const {
  const size_t start = head.find(' ') + 1;
  return head.substr(start, head.find(' ', start) - start);
}

struct WireServer::TLS {
  explicit TLS(const Certificate& certificate) : context(SSL_CTX_new(TLS_server_method())) {
    const bool isReady =
        context != nullptr && SSL_CTX_use_certificate_chain_file(context, certificate.certificateFile.c_str()) == 1 &&
        SSL_CTX_use_PrivateKey_file(context, certificate.privateKeyFile.c_str(), SSL_FILETYPE_PEM) == 1;
    if (!isReady) throw std::runtime_error("no certificate for a wire server");
  }
  ~TLS() { SSL_CTX_free(context); }
  TLS(const TLS&) = delete;
  TLS& operator=(const TLS&) = delete;

  SSL_CTX* const context;
};

// One accepted connection, with or without TLS; closed with the object.
class WireServer::Line {
 public:
  Line(int socket, SSL_CTX* context) : _socket(socket) {
    if (context == nullptr) return;
    _ssl = SSL_new(context);
    SSL_set_fd(_ssl, socket);
    _isReady = SSL_accept(_ssl) == 1;
  }
  ~Line() {
    if (_ssl != nullptr) SSL_free(_ssl);
    close(_socket);
  }
  Line(const Line&) = delete;
  Line& operator=(const Line&) = delete;

  bool isReady() const { return _isReady; }
  // Appends what comes next; false at the end.
  bool hear(std::string& buffer) {
    std::array<char, 16384> bytes;
    const ssize_t count = _ssl != nullptr ? SSL_read(_ssl, bytes.data(), static_cast<int>(bytes.size()))
                                          : recv(_socket, bytes.data(), bytes.size(), 0);
    if (count <= 0) return false;
    buffer.append(bytes.data(), static_cast<size_t>(count));
    return true;
  }
  void say(std::string_view text) {
    while (!text.empty()) {
      const ssize_t count = _ssl != nullptr ? SSL_write(_ssl, text.data(), static_cast<int>(text.size()))
                                            : send(_socket, text.data(), text.size(), MSG_NOSIGNAL);
      if (count <= 0) return;
      text.remove_prefix(static_cast<size_t>(count));
    }
  }
  // The peer is told that the connection broke, not that it ended.
  void breakOnClose() const {
    const linger none{.l_onoff = 1, .l_linger = 0};
    setsockopt(_socket, SOL_SOCKET, SO_LINGER, &none, sizeof none);
  }

 private:
  const int _socket;
  SSL* _ssl = nullptr;
  bool _isReady = true;
};

WireServer::WireServer(const std::optional<Certificate>& certificate, Respond respond, uint16_t port)
    : _respond(std::move(respond)) {
  if (certificate.has_value()) _tls = std::make_shared<TLS>(*certificate);
  _socket = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  // The connections of the server that was there before linger on its port.
  const int isReused = 1;
  setsockopt(_socket, SOL_SOCKET, SO_REUSEADDR, &isReused, sizeof isReused);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  const bool isOpen = bind(_socket, asAddress(address), size) == 0 && listen(_socket, 64) == 0 &&
                      getsockname(_socket, asAddress(address), &size) == 0;
  if (!isOpen) {
    close(_socket);
    throw std::runtime_error("no port for a wire server");
  }
  _port = ntohs(address.sin_port);
  _acceptor = std::thread([this] { acceptConnections(); });
}

WireServer::~WireServer() {
  shutdown(_socket, SHUT_RDWR);
  _acceptor.join();
  close(_socket);
  {
    const std::lock_guard lock(_mutex);
    for (const int open : _openSockets) shutdown(open, SHUT_RDWR);
  }
  for (std::thread& thread : _threads) thread.join();
}

WireServer::Answer WireServer::answer(int status, std::string_view body) {
  return {"HTTP/1.1 " + std::to_string(status) + " Said\r\nContent-Length: " + std::to_string(body.size()) +
          "\r\n\r\n" + std::string(body)};
}

std::string WireServer::url(std::string_view path) const {
  return (_tls != nullptr ? "https://" : "http://") + address() + std::string(path);
}

std::vector<WireRequest> WireServer::requests() const {
  const std::lock_guard lock(_mutex);
  return _requests;
}

std::vector<WireRequest> WireServer::posts() const {
  std::vector<WireRequest> result = requests();
  std::erase_if(result, [](const WireRequest& request) { return request.isGet(); });
  return result;
}

size_t WireServer::connections() const {
  const std::lock_guard lock(_mutex);
  return _connections;
}

std::vector<std::string> WireServer::strays() const {
  const std::lock_guard lock(_mutex);
  return _strays;
}

void WireServer::acceptConnections() {
  for (;;) {
    const int accepted = accept4(_socket, nullptr, nullptr, SOCK_CLOEXEC);
    if (accepted < 0) return;
    const std::lock_guard lock(_mutex);
    _openSockets.push_back(accepted);
    _threads.emplace_back([this, accepted, connection = _connections++] {
      ignoreBrokenPipes();
      // The handshake is made here, so that one client does not hold up another.
      Line line(accepted, _tls != nullptr ? _tls->context : nullptr);
      if (line.isReady()) serve(line, connection);
      const std::lock_guard closing(_mutex);
      std::erase(_openSockets, accepted);
    });
  }
}

void WireServer::serve(Line& line, size_t connection) {
  std::string buffer;
  while (const std::optional<WireRequest> request = read(line, connection, buffer)) {
    {
      const std::lock_guard lock(_mutex);
      _requests.push_back(*request);
    }
    const Answer answer = _respond(*request);
    line.say(answer.bytes);
    if (answer.then == Then::Keep) continue;
    if (answer.then == Then::Reset) line.breakOnClose();
    break;
  }
  if (buffer.empty()) return;
  const std::lock_guard lock(_mutex);
  _strays.push_back(buffer);
}

std::optional<WireRequest> WireServer::read(Line& line, size_t connection, std::string& buffer) {
  size_t headSize = 0;
  while ((headSize = buffer.find(kHeadEnd)) == std::string::npos) {
    if (buffer.size() > kMostBytes || !line.hear(buffer)) return std::nullopt;
  }
  headSize += kHeadEnd.size();
  WireRequest request{.connection = connection, .head = buffer.substr(0, headSize)};
  size_t bodySize = 0;
  if (const auto length = request.header("Content-Length")) {
    std::from_chars(length->data(), length->data() + length->size(), bodySize);
  }
  while (buffer.size() < headSize + bodySize) {
    if (buffer.size() > kMostBytes || !line.hear(buffer)) return std::nullopt;
  }
  request.body = buffer.substr(headSize, bodySize);
  buffer.erase(0, headSize + bodySize);
  return request;
}

}  // namespace telvane::testing
