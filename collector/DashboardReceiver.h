#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <unordered_map>

#include "collector/DashboardEvent.h"
#include "collector/EventStore.h"
#include "platform/datagram/DatagramServer.h"

namespace telvane {

// A dashboard: takes events as datagrams, stores each as a line of the event store, shows it, and acknowledges it when
// its sender waits for that: by the first 62 bytes of the datagram itself, of which the last two are the event ID. An
// event that cannot be stored is not acknowledged, so that it comes again; one that came again is acknowledged and
// stored once. Owned by the collector; receives on a thread of its own until it is let go of.
//
// The line is {"dashboard": true, "peer": HOST:PORT, "reliable": …, "addressedByBag": …, "event": {…}}.
class DashboardReceiver {
 public:
  using Listener = std::function<void(const std::string& line)>;
  struct Options {
    IPv4SocketAddress address;  // port 0 picks one
    // How many of a hundred events are dropped as if they had got lost, each time they come, and as many
    // acknowledgements. The seed decides of each by its event ID and by how often it came: what gets lost depends
    // neither on the order nor on the speed in which they come. For showing and trying what reliable mode is for.
    unsigned lossPercent = 0;
    uint64_t lossSeed = 0;
    // Gets a line for people per event, on the receiver's thread; empty: nothing is shown.
    Listener show;
  };

  // events: outlives the receiver.
  static Result<std::unique_ptr<DashboardReceiver>> start(Options options, EventStore& events);

  const IPv4SocketAddress& address() const noexcept { return _server->address(); }
  // {"events", "repeated", "lost", "refused"}: stored; come again; dropped on purpose; no events, or not stored.
  Dictionary statistics() const;

 private:
  // How many events are remembered to know one that comes again.
  static constexpr size_t kRemembered = 4096;

  DashboardReceiver(Options options, EventStore& events);
  // An event that has come lately, whether it got lost or not.
  struct Known {
    uint16_t eventID = 0;
    uint32_t times = 0;
    bool isStored = false;
  };
  enum class Way { Here, Back };

  void take(const DatagramServer& server, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer);
  // Returns whether it is stored.
  bool store(const DashboardEvent& event, const IPv4SocketAddress& peer);
  void acknowledge(const DatagramServer& server, const Known& known, std::span<const uint8_t> datagram,
                   const IPv4SocketAddress& peer);
  bool getsLost(const Known& known, Way way);
  // Valid until the next call.
  Known& remember(std::string identity);

  // Constant after construction.
  const Options _options;
  EventStore& _events;

  // Confined to the server's thread.
  std::unordered_map<std::string, Known> _known;
  std::deque<std::string> _knownInOrder;

  // Synchronised by themselves.
  std::atomic<uint64_t> _stored{0};
  std::atomic<uint64_t> _repeated{0};
  std::atomic<uint64_t> _lost{0};
  std::atomic<uint64_t> _refused{0};

  std::unique_ptr<DatagramServer> _server;  // last, so that it ends first
};

}  // namespace telvane
