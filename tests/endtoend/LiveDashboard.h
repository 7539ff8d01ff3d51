#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/Mutex.h"
#include "platform/datagram/DatagramServer.h"

namespace telvane::testing {

// A dashboard at a UDP port of this machine, which notes what comes and acknowledges as the test says. Safe from any
// thread.
class LiveDashboard {
 public:
  using Clock = std::chrono::steady_clock;
  struct Datagram {
    std::string bytes;
    IPv4SocketAddress peer;
    int copy = 1;  // 1 for the first of its bytes, 2 for the next, …
    Clock::time_point at;

    uint16_t number(size_t offset) const;
    uint16_t category() const { return number(16); }
    uint16_t type() const { return number(18); }
    uint16_t eventID() const { return number(60); }
    std::string text() const { return bytes.substr(64); }
  };
  // Called for each datagram on the dashboard's thread.
  using Handler = std::function<void(LiveDashboard& dashboard, const Datagram& datagram)>;

  explicit LiveDashboard(Handler handler);
  // Acknowledges each datagram at once.
  LiveDashboard() : LiveDashboard([](LiveDashboard& self, const Datagram& datagram) { self.acknowledge(datagram); }) {}

  uint16_t port() const noexcept { return _server->address().port; }
  void acknowledge(const Datagram& datagram) const;
  // What it acknowledges by.
  static std::string acknowledgementOf(const Datagram& datagram) { return datagram.bytes.substr(0, 62); }
  // All that has come, in that order.
  std::vector<Datagram> datagrams() const;
  std::vector<Datagram> datagrams(uint16_t category) const;
  // The texts of the events of that category, each once, in the order of their event IDs.
  std::vector<std::string> texts(uint16_t category) const;

 private:
  void take(std::span<const uint8_t> bytes, const IPv4SocketAddress& peer);

  const Handler _handler;
  mutable Mutex _mutex;
  std::vector<Datagram> _datagrams GUARDED_BY(_mutex);
  std::map<std::string, int> _copies GUARDED_BY(_mutex);
  std::unique_ptr<DatagramServer> _server;  // last, so that it ends first
};

// Whether a UDP socket of this machine sends to that port of 127.0.0.1 and to nobody else.
bool isUDPSocketConnectedTo(uint16_t port);

}  // namespace telvane::testing
