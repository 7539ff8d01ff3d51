#include "platform/url/HTTPServerConnection.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <boost/asio/dispatch.hpp>
#include <boost/asio/write.hpp>
#include <boost/beast/core.hpp>
#include <boost/beast/http.hpp>
#include <boost/beast/ssl.hpp>
#include <deque>
#include <string>
#include <utility>

namespace telvane {

namespace asio = boost::asio;
namespace beast = boost::beast;
namespace http = boost::beast::http;

namespace {

using ErrorCode = boost::system::error_code;
using TLSStream = beast::ssl_stream<beast::tcp_stream>;
using Parser = http::request_parser<http::vector_body<uint8_t>>;
using PieceParser = http::request_parser<http::buffer_body>;

constexpr size_t kPieceBytes = 64u << 10;

// What is to be written, kept until it has been.
struct Piece {
  std::string text;
  Data data;
  std::string end;
  bool isLast = false;
};

std::string onOneLine(std::string text) {
  std::replace_if(
      text.begin(), text.end(), [](char c) { return c == '\r' || c == '\n' || c == '\0'; }, ' ');
  return text;
}

bool hasNoBody(int status) { return status == 204 || status == 304 || status / 100 == 1; }

std::string headText(const HTTPServer::Response& response, std::optional<uint64_t> length, bool keepsAlive) {
  const auto reason = http::obsolete_reason(http::int_to_status(static_cast<unsigned>(response.status)));
  std::string head = fmt::format("HTTP/1.1 {} {}\r\n", response.status, std::string_view(reason.data(), reason.size()));
  for (const HTTPServer::Header& header : response.headers) {
    head += fmt::format("{}: {}\r\n", onOneLine(header.name), onOneLine(header.value));
  }
  if (!length) {
    head += "Transfer-Encoding: chunked\r\n";
  } else if (!hasNoBody(response.status)) {
    head += fmt::format("Content-Length: {}\r\n", *length);
  }
  if (!keepsAlive) head += "Connection: close\r\n";
  return head + "\r\n";
}

// The answer to a request that was refused unread; 0 when the peer is simply gone.
int statusFor(ErrorCode error) {
  if (error == http::error::body_limit) return 413;
  if (error == http::error::header_limit) return 431;
  if (error == http::error::end_of_stream || error == http::error::partial_message) return 0;
  return error.category() == http::make_error_code(http::error::bad_method).category() ? 400 : 0;
}

// What a handler is told of a request, but for its body.
template <class Message>
HTTPServer::Request headOf(const Message& message, const std::string& peerAddress) {
  HTTPServer::Request request;
  request.method = std::string(message.method_string());
  request.target = std::string(message.target());
  for (const auto& field : message) {
    request.headers.push_back({std::string(field.name_string()), std::string(field.value())});
  }
  request.peerAddress = peerAddress;
  return request;
}

template <class Stream>
class Connection final : public HTTPServerConnection {
 public:
  template <class... Arguments>
  explicit Connection(std::shared_ptr<const Server> server, Arguments&&... stream)
      : _server(std::move(server)), _stream(std::forward<Arguments>(stream)...) {
    ErrorCode ignored;
    const auto peer = socket().remote_endpoint(ignored);
    _peerAddress = fmt::format("{}:{}", peer.address().to_string(), peer.port());
  }

  void start() override;
  void close() override;
  // In the connection's executor; answer: which answer of the connection it belongs to.
  void write(uint64_t answer, Piece piece);
  void writeHead(uint64_t answer, HTTPServer::Response response, std::optional<uint64_t> length, bool isWhole);
  void writeBody(uint64_t answer, Data piece, bool isLast);
  void closeIfUnfinished(uint64_t answer);
  auto executor() { return _stream.get_executor(); }

 private:
  std::shared_ptr<Connection> self() { return std::static_pointer_cast<Connection>(this->shared_from_this()); }
  asio::ip::tcp::socket& socket() { return beast::get_lowest_layer(_stream).socket(); }
  void limit(std::chrono::milliseconds time) { beast::get_lowest_layer(_stream).expires_after(time); }
  void readHead();
  void headCame(ErrorCode error);
  void chooseSink();
  void continueThenReadBody();
  void readBody();
  void readPiece();
  void pieceCame(ErrorCode error);
  void requestCame(ErrorCode error);
  HTTPServer::Request takeRequest();
  void handle(HTTPServer::Request request);
  void refuse(ErrorCode error);
  void refuseWith(int status);
  void writeNext();
  void wasWritten(ErrorCode error);
  void answerEnded();
  void hangUp();
  void end();

  const std::shared_ptr<const Server> _server;
  Stream _stream;
  std::string _peerAddress;

  // Confined to the strand.
  beast::flat_buffer _buffer;
  std::optional<Parser> _parser;
  // While a sink takes the body, in place of the other.
  std::optional<PieceParser> _pieceParser;
  std::optional<HTTPServer::Request> _pieceRequest;
  std::vector<char> _piece;
  uint64_t _answer = 0;  // counts the requests that were read
  bool _isAnswering = false;
  bool _keepsAlive = true;
  bool _isHeadRequest = false;
  bool _isChunked = false;
  bool _isWriting = false;
  bool _hasEnded = false;
  std::deque<Piece> _pieces;
};

// Brings a responder's calls into the connection's strand.
template <class Stream>
class ConnectionResponder final : public HTTPServer::Responder {
 public:
  ConnectionResponder(const std::shared_ptr<Connection<Stream>>& connection, uint64_t answer)
      : _connection(connection), _answer(answer) {}
  ~ConnectionResponder() override {
    onConnection([answer = _answer](Connection<Stream>& connection) { connection.closeIfUnfinished(answer); });
  }
  ConnectionResponder(const ConnectionResponder&) = delete;
  ConnectionResponder& operator=(const ConnectionResponder&) = delete;

  void send(HTTPServer::Response response) override {
    onConnection([answer = _answer, response = std::move(response)](Connection<Stream>& connection) mutable {
      const uint64_t length = response.body.size();
      connection.writeHead(answer, std::move(response), length, true);
    });
  }
  void sendHead(HTTPServer::Response response, std::optional<uint64_t> length) override {
    onConnection([answer = _answer, response = std::move(response), length](Connection<Stream>& connection) mutable {
      connection.writeHead(answer, std::move(response), length, false);
    });
  }
  void sendPiece(Data piece) override {
    onConnection([answer = _answer, piece = std::move(piece)](Connection<Stream>& connection) mutable {
      connection.writeBody(answer, std::move(piece), false);
    });
  }
  void finish() override {
    onConnection([answer = _answer](Connection<Stream>& connection) { connection.writeBody(answer, Data(), true); });
  }
  void close() override {
    onConnection([](Connection<Stream>& connection) { connection.close(); });
  }

 private:
  // What waits in the strand does not keep the connection, so that nothing remains when the server has ended meanwhile.
  template <class Action>
  void onConnection(Action action) {
    const auto connection = _connection.lock();
    if (!connection) return;
    asio::dispatch(connection->executor(), [weak = _connection, action = std::move(action)]() mutable {
      if (const auto target = weak.lock()) action(*target);
    });
  }

  const std::weak_ptr<Connection<Stream>> _connection;
  const uint64_t _answer;
};

template <class Stream>
void Connection<Stream>::start() {
  asio::dispatch(executor(), [self = self()] {
    ErrorCode ignored;
    self->socket().set_option(asio::ip::tcp::no_delay(true), ignored);
    if constexpr (std::is_same_v<Stream, TLSStream>) {
      self->limit(self->_server->options.transferTimeout);
      self->_stream.async_handshake(asio::ssl::stream_base::server,
                                    [self](ErrorCode error) { error ? self->end() : self->readHead(); });
    } else {
      self->readHead();
    }
  });
}

template <class Stream>
void Connection<Stream>::close() {
  asio::dispatch(executor(), [self = self()] { self->end(); });
}

template <class Stream>
void Connection<Stream>::readHead() {
  const HTTPServer::Options& options = _server->options;
  _parser.emplace();
  _parser->header_limit(options.maximumHeadBytes);
  _parser->body_limit(boost::none);  // until it is known who takes the body
  if (_buffer.size() > 0) {
    limit(options.transferTimeout);
    return http::async_read_header(_stream, _buffer, *_parser,
                                   [self = self()](ErrorCode error, size_t) { self->headCame(error); });
  }
  // Until the first byte the peer is idle, from then on it is slow.
  limit(options.idleTimeout);
  constexpr size_t kFirstRead = 16u << 10;
  _stream.async_read_some(_buffer.prepare(kFirstRead), [self = self()](ErrorCode error, size_t size) {
    if (error) return self->hangUp();
    self->_buffer.commit(size);
    self->limit(self->_server->options.transferTimeout);
    http::async_read_header(self->_stream, self->_buffer, *self->_parser,
                            [self](ErrorCode readError, size_t) { self->headCame(readError); });
  });
}

template <class Stream>
void Connection<Stream>::headCame(ErrorCode error) {
  if (error) return refuse(error);
  const auto& head = _parser->get();
  _keepsAlive = head.keep_alive();
  _isHeadRequest = head.method() == http::verb::head;
  const bool isToContinue = beast::iequals(head[http::field::expect], "100-continue");
  const uint64_t length = _parser->content_length().value_or(0);
  chooseSink();
  const HTTPServer::Options& options = _server->options;
  const uint64_t maximum = _pieceRequest ? options.maximumPiecewiseBodyBytes : options.maximumBodyBytes;
  _pieceRequest ? _pieceParser->body_limit(maximum) : _parser->body_limit(maximum);
  // The parsers themselves compare a length only with the limit that they had when the head came.
  if (length > maximum) return refuse(http::error::body_limit);
  isToContinue ? continueThenReadBody() : readBody();
}

template <class Stream>
void Connection<Stream>::chooseSink() {
  if (!_server->sinkMaker || _parser->is_done()) return;
  HTTPServer::Request head = headOf(_parser->get(), _peerAddress);
  head.sink = _server->sinkMaker(head);
  if (head.sink == nullptr) return;
  _pieceRequest = std::move(head);
  _pieceParser.emplace(std::move(*_parser));
  _piece.resize(kPieceBytes);
}

template <class Stream>
void Connection<Stream>::continueThenReadBody() {
  static constexpr std::string_view kContinue = "HTTP/1.1 100 Continue\r\n\r\n";
  asio::async_write(_stream, asio::buffer(kContinue.data(), kContinue.size()),
                    [self = self()](ErrorCode error, size_t) { error ? self->end() : self->readBody(); });
}

template <class Stream>
void Connection<Stream>::readBody() {
  if (_pieceRequest) return readPiece();
  if (_parser->is_done()) return requestCame({});
  http::async_read(_stream, _buffer, *_parser, [self = self()](ErrorCode error, size_t) { self->requestCame(error); });
}

template <class Stream>
void Connection<Stream>::readPiece() {
  auto& body = _pieceParser->get().body();
  body.data = _piece.data();
  body.size = _piece.size();
  limit(_server->options.transferTimeout);
  http::async_read_some(_stream, _buffer, *_pieceParser,
                        [self = self()](ErrorCode error, size_t) { self->pieceCame(error); });
}

template <class Stream>
void Connection<Stream>::pieceCame(ErrorCode error) {
  if (_hasEnded) return;
  // need_buffer: the room for a piece was filled.
  if (error && error != http::error::need_buffer) return refuse(error);
  const size_t size = _piece.size() - _pieceParser->get().body().size;
  const int status = size > 0 ? _pieceRequest->sink->take({_piece.data(), size}) : 0;
  if (status != 0) return refuseWith(status);
  _pieceParser->is_done() ? requestCame({}) : readPiece();
}

template <class Stream>
void Connection<Stream>::requestCame(ErrorCode error) {
  if (error) return refuse(error);
  beast::get_lowest_layer(_stream).expires_never();
  _isAnswering = true;
  ++_answer;
  handle(takeRequest());
}

template <class Stream>
HTTPServer::Request Connection<Stream>::takeRequest() {
  if (_pieceRequest) {
    _pieceParser.reset();
    return *std::exchange(_pieceRequest, std::nullopt);
  }
  auto message = _parser->release();
  HTTPServer::Request request = headOf(message, _peerAddress);
  request.body = Data(std::move(message.body()));
  return request;
}

template <class Stream>
void Connection<Stream>::handle(HTTPServer::Request request) {
  auto responder = std::make_shared<ConnectionResponder<Stream>>(self(), _answer);
  try {
    _server->handler(std::move(request), responder);
  } catch (const std::exception&) {
    responder->send({.status = 500});
  }
}

template <class Stream>
void Connection<Stream>::refuse(ErrorCode error) {
  const int status = statusFor(error);
  status == 0 ? hangUp() : refuseWith(status);
}

template <class Stream>
void Connection<Stream>::refuseWith(int status) {
  _pieceRequest.reset();
  _keepsAlive = false;
  _isHeadRequest = false;
  _isAnswering = true;
  writeHead(++_answer, {.status = status}, 0, true);
}

template <class Stream>
void Connection<Stream>::writeHead(uint64_t answer, HTTPServer::Response response, std::optional<uint64_t> length,
                                   bool isWhole) {
  _isChunked = !length;
  Piece piece{.text = headText(response, length, _keepsAlive), .isLast = isWhole};
  if (!_isHeadRequest && !hasNoBody(response.status)) piece.data = std::move(response.body);
  write(answer, std::move(piece));
}

template <class Stream>
void Connection<Stream>::writeBody(uint64_t answer, Data data, bool isLast) {
  Piece piece{.data = std::move(data), .isLast = isLast};
  if (_isChunked && !piece.data.empty()) {
    piece.text = fmt::format("{:x}\r\n", piece.data.size());
    piece.end = "\r\n";
  }
  if (_isChunked && isLast) piece.end += "0\r\n\r\n";
  write(answer, std::move(piece));
}

template <class Stream>
void Connection<Stream>::write(uint64_t answer, Piece piece) {
  if (_hasEnded || !_isAnswering || answer != _answer) return;
  if (piece.isLast) _isAnswering = false;
  _pieces.push_back(std::move(piece));
  if (!_isWriting) writeNext();
}

template <class Stream>
void Connection<Stream>::writeNext() {
  _isWriting = true;
  limit(_server->options.transferTimeout);
  const Piece& piece = _pieces.front();
  const std::array<asio::const_buffer, 3> buffers{
      asio::buffer(piece.text), asio::buffer(piece.data.bytes(), piece.data.size()), asio::buffer(piece.end)};
  asio::async_write(_stream, buffers, [self = self()](ErrorCode error, size_t) { self->wasWritten(error); });
}

template <class Stream>
void Connection<Stream>::wasWritten(ErrorCode error) {
  _isWriting = false;
  if (error || _hasEnded) return end();
  const bool isLast = _pieces.front().isLast;
  _pieces.pop_front();
  if (isLast) return answerEnded();
  if (!_pieces.empty()) return writeNext();
  beast::get_lowest_layer(_stream).expires_never();
}

template <class Stream>
void Connection<Stream>::answerEnded() {
  _keepsAlive ? readHead() : hangUp();
}

template <class Stream>
void Connection<Stream>::closeIfUnfinished(uint64_t answer) {
  if (_isAnswering && answer == _answer) end();
}

template <class Stream>
void Connection<Stream>::hangUp() {
  if (_hasEnded) return;
  if constexpr (std::is_same_v<Stream, TLSStream>) {
    limit(std::chrono::seconds(1));
    _stream.async_shutdown([self = self()](ErrorCode) { self->end(); });
  } else {
    ErrorCode ignored;
    socket().shutdown(asio::ip::tcp::socket::shutdown_send, ignored);
    end();
  }
}

template <class Stream>
void Connection<Stream>::end() {
  if (std::exchange(_hasEnded, true)) return;
  _pieceRequest.reset();
  ErrorCode ignored;
  socket().close(ignored);
  beast::get_lowest_layer(_stream).close();
  if (!_isWriting) _pieces.clear();
  _server->connectionEnded(this->shared_from_this());
}

}  // namespace

std::shared_ptr<HTTPServerConnection> HTTPServerConnection::make(std::shared_ptr<const Server> server,
                                                                 asio::ip::tcp::socket socket,
                                                                 asio::ssl::context* tls) {
  if (tls == nullptr) return std::make_shared<Connection<beast::tcp_stream>>(std::move(server), std::move(socket));
  return std::make_shared<Connection<TLSStream>>(std::move(server), std::move(socket), *tls);
}

}  // namespace telvane
