#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <unordered_set>

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
    // How many of a hundred datagrams are dropped as if they had got lost, and as many acknowledgements, by chance from
    // the seed. For showing and trying what reliable mode is for.
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
  void take(const DatagramServer& server, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer);
  void acknowledge(const DatagramServer& server, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer);
  bool getsLost();
  // Whether these bytes of the peer have been stored lately.
  bool isKnown(const std::string& identity) const { return _known.count(identity) != 0; }
  void remember(std::string identity);

  // Constant after construction.
  const Options _options;
  EventStore& _events;

  // Confined to the server's thread.
  std::mt19937_64 _chance;
  std::unordered_set<std::string> _known;
  std::deque<std::string> _knownInOrder;

  // Synchronised by themselves.
  std::atomic<uint64_t> _stored{0};
  std::atomic<uint64_t> _repeated{0};
  std::atomic<uint64_t> _lost{0};
  std::atomic<uint64_t> _refused{0};

  std::unique_ptr<DatagramServer> _server;  // last, so that it ends first
};

}  // namespace telvane
