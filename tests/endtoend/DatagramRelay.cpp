#include "tests/endtoend/DatagramRelay.h"

#include <stdexcept>

namespace telvane::testing {
namespace {

std::unique_ptr<DatagramServer> startServer(DatagramServer::Handler handler) {
  auto server = DatagramServer::start({{127, 0, 0, 1}, 0}, std::move(handler));
  if (server.has_error()) throw std::runtime_error(server.error().description());
  return std::move(*server);
}

}  // namespace

DatagramRelay::DatagramRelay(const IPv4SocketAddress& server) : _server(server) {
  auto serverSide = startServer([this](const DatagramServer&, std::span<const uint8_t> bytes,
                                       const IPv4SocketAddress&) { takeFromServer(bytes); });
  auto clientSide = startServer([this](const DatagramServer&, std::span<const uint8_t> bytes,
                                       const IPv4SocketAddress& client) { takeFromClient(bytes, client); });
  _port = clientSide->address().port;
  MutexLock lock(_mutex);
  _serverSide = std::move(serverSide);
  _clientSide = std::move(clientSide);
}

// Their threads are waited for without the lock, which they may want.
DatagramRelay::~DatagramRelay() {
  std::unique_ptr<DatagramServer> clientSide;
  std::unique_ptr<DatagramServer> serverSide;
  MutexLock lock(_mutex);
  clientSide = std::move(_clientSide);
  serverSide = std::move(_serverSide);
}

DatagramRelay::Counts DatagramRelay::counts() const {
  MutexLock lock(_mutex);
  return _counts;
}

void DatagramRelay::takeFromClient(std::span<const uint8_t> bytes, const IPv4SocketAddress& client) {
  MutexLock lock(_mutex);
  _client = client;
  if (_serverSide != nullptr && _serverSide->send(_server, bytes)) ++_counts.toServer;
}

void DatagramRelay::takeFromServer(std::span<const uint8_t> bytes) {
  MutexLock lock(_mutex);
  if (_clientSide != nullptr && _clientSide->send(_client, bytes)) ++_counts.toClient;
}

}  // namespace telvane::testing
