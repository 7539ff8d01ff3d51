#pragma once

#include <memory>

#include "platform/Mutex.h"
#include "platform/datagram/DatagramServer.h"

namespace telvane::testing {

// Stands between one client and a server of datagrams, hands on what either sends to the other, and counts it. Safe
// from any thread.
class DatagramRelay {
 public:
  struct Counts {
    int64_t toServer = 0;
    int64_t toClient = 0;
  };

  // Throws when there is no socket to be had.
  explicit DatagramRelay(const IPv4SocketAddress& server);
  ~DatagramRelay();

  // Where the client is to send to, on 127.0.0.1.
  uint16_t port() const noexcept { return _port; }
  Counts counts() const;

 private:
  void takeFromClient(std::span<const uint8_t> bytes, const IPv4SocketAddress& client);
  void takeFromServer(std::span<const uint8_t> bytes);

  // Constant after construction.
  const IPv4SocketAddress _server;
  uint16_t _port = 0;

  mutable Mutex _mutex;
  Counts _counts GUARDED_BY(_mutex);
  IPv4SocketAddress _client GUARDED_BY(_mutex);
  // One socket for each side; null before the start and at the end.
  std::unique_ptr<DatagramServer> _clientSide GUARDED_BY(_mutex);
  std::unique_ptr<DatagramServer> _serverSide GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
