#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/DatagramSocket.h"
#include "tests/support/SimulatedScheduler.h"
#include "tests/support/SimulatedSerialQueue.h"

namespace telvane::testing {

class SimulatedDatagramSockets;

// The UDP network of a SimulatedWorld: sockets of its processes, and servers that a test puts at an address. A datagram
// arrives at once and in order unless the test loses or delays it; one to an address where nobody is vanishes, unless
// that address refuses.
//
//   auto& dashboard = world.datagrams().serve("192.0.2.1", 9000);
//   dashboard.onArrival([&](const auto& arrival) { dashboard.answer(arrival.from, acknowledgement(arrival.bytes)); });
class SimulatedDatagramNetwork {
 public:
  using Bytes = std::vector<uint8_t>;
  using Duration = SimulatedScheduler::Duration;

  struct Arrival {
    SimulatedScheduler::Time at;
    IPv4SocketAddress from;
    Bytes bytes;
  };

  // A server at an address. Owned by the network.
  class Server {
   public:
    using Handler = std::function<void(const Arrival& arrival)>;

    Server(SimulatedDatagramNetwork& network, const IPv4SocketAddress& address)
        : _network(network), _address(address) {}
    const IPv4SocketAddress& address() const noexcept { return _address; }
    // What has arrived so far; what was lost has not.
    const std::vector<Arrival>& arrivals() const noexcept { return _arrivals; }
    void clear() { _arrivals.clear(); }
    // Called for each arrival between two steps of the simulation: must not wait.
    void onArrival(Handler handler) { _handler = std::move(handler); }
    void loseNext(size_t count) { _losses = count; }
    // Sends a datagram from here after the delay.
    void answer(const IPv4SocketAddress& to, Bytes bytes, Duration after = {});

   private:
    friend class SimulatedDatagramNetwork;
    void arrive(Arrival arrival);

    SimulatedDatagramNetwork& _network;
    const IPv4SocketAddress _address;
    std::vector<Arrival> _arrivals;
    Handler _handler;
    size_t _losses = 0;
  };

  // What goes wrong with the sockets made from now on, and with the next calls of all. Codes are errno values.
  struct Faults {
    std::optional<int> newSocket;
    std::optional<int> bind;
    std::optional<int> connect;
    bool hasNoReadSources = false;
    // What the next sends do, one entry each: a negative errno value, or how many bytes go out at most (the datagram
    // then arrives nowhere).
    std::deque<int> sends;
  };

  // REQUIRES: the scheduler outlives this object.
  explicit SimulatedDatagramNetwork(SimulatedScheduler& scheduler) : _scheduler(scheduler) {}
  SimulatedDatagramNetwork(const SimulatedDatagramNetwork&) = delete;
  SimulatedDatagramNetwork& operator=(const SimulatedDatagramNetwork&) = delete;

  // Puts a server there, or returns the one that is there.
  Server& serve(std::string_view dottedAddress, uint16_t port);
  // Whoever sends there is told by his next call that nobody listens.
  void refuse(std::string_view dottedAddress, uint16_t port);
  // Sends a datagram from any address, as somebody without part in it may.
  void send(const IPv4SocketAddress& from, const IPv4SocketAddress& to, const Bytes& bytes);
  Faults& faults() noexcept { return _faults; }
  // Sockets that processes have open now, and those made so far.
  size_t openSockets() const;
  size_t socketsMade() const noexcept { return _socketsMade; }
  // Datagrams that sockets have sent so far, the lost ones too.
  size_t datagramsSent() const noexcept { return _datagramsSent; }

 private:
  friend class SimulatedDatagramSockets;
  class Endpoint;
  class Socket;
  class Source;

  static IPv4SocketAddress addressOf(std::string_view dottedAddress, uint16_t port);
  // Returns how many bytes went out, or the fault.
  Result<size_t> transmit(Endpoint& from, const uint8_t* bytes, size_t length);

  SimulatedScheduler& _scheduler;
  Faults _faults;
  std::map<IPv4SocketAddress, std::unique_ptr<Server>> _servers;
  std::vector<IPv4SocketAddress> _refusing;
  std::map<IPv4SocketAddress, std::weak_ptr<Endpoint>> _endpoints;
  size_t _socketsMade = 0;
  size_t _datagramsSent = 0;
};

}  // namespace telvane::testing
