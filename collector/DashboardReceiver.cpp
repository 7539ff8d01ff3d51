#include "collector/DashboardReceiver.h"

namespace telvane {
namespace {

constexpr size_t kAcknowledgementLength = 62;
constexpr size_t kHeaderLength = 64;
constexpr uint64_t kHundred = 100;

// Who sent which event of which session when.
std::string identityOf(std::span<const uint8_t> datagram, const IPv4SocketAddress& peer) {
  std::string identity = description(peer) + " ";
  const auto header = datagram.first(kHeaderLength);
  identity.append(header.begin(), header.end());
  return identity;
}

// The finalizer of splitmix64 (Steele, Lea and Flood, "Fast splittable pseudorandom number generators", 2014).
uint64_t mixed(uint64_t value) {
  value += 0x9E3779B97F4A7C15;
  value = (value ^ (value >> 30)) * 0xBF58476D1CE4E5B9;
  value = (value ^ (value >> 27)) * 0x94D049BB133111EB;
  return value ^ (value >> 31);
}

}  // namespace

Result<std::unique_ptr<DashboardReceiver>> DashboardReceiver::start(Options options, EventStore& events) {
  const IPv4SocketAddress address = options.address;
  std::unique_ptr<DashboardReceiver> receiver(new DashboardReceiver(std::move(options), events));
  auto server = DatagramServer::start(
      address,
      [receiver = receiver.get()](const DatagramServer& receiving, std::span<const uint8_t> datagram,
                                  const IPv4SocketAddress& peer) { receiver->take(receiving, datagram, peer); });
  if (server.has_error()) return server.error();
  receiver->_server = std::move(*server);
  return receiver;
}

DashboardReceiver::DashboardReceiver(Options options, EventStore& events)
    : _options(std::move(options)), _events(events) {}

Dictionary DashboardReceiver::statistics() const {
  Dictionary counts;
  counts.set("events", Value(_stored.load()));
  counts.set("repeated", Value(_repeated.load()));
  counts.set("lost", Value(_lost.load()));
  counts.set("refused", Value(_refused.load()));
  return counts;
}

void DashboardReceiver::take(const DatagramServer& server, std::span<const uint8_t> datagram,
                             const IPv4SocketAddress& peer) {
  const Result<DashboardEvent> event = DashboardEvent::decode(datagram);
  if (event.has_error()) {
    ++_refused;
    return;
  }
  Known& known = remember(identityOf(datagram, peer));
  known.eventID = event->eventID;
  ++known.times;
  if (getsLost(known, Way::Here)) return;
  if (known.isStored) {
    ++_repeated;
  } else {
    known.isStored = store(*event, peer);
  }
  if (known.isStored && event->isReliable) acknowledge(server, known, datagram, peer);
}

bool DashboardReceiver::store(const DashboardEvent& event, const IPv4SocketAddress& peer) {
  Dictionary line;
  line.set("dashboard", Value(true));
  line.set("peer", Value(description(peer)));
  line.set("reliable", Value(event.isReliable));
  line.set("addressedByBag", Value(event.isAddressedByBag));
  line.set("event", event.dictionary());
  if (_events.add(line).has_error()) {
    ++_refused;
    return false;
  }
  ++_stored;
  if (_options.show) _options.show(event.line());
  return true;
}

void DashboardReceiver::acknowledge(const DatagramServer& server, const Known& known, std::span<const uint8_t> datagram,
                                    const IPv4SocketAddress& peer) {
  // One that finds no room is as good as lost: the event comes again.
  if (!getsLost(known, Way::Back)) server.send(peer, datagram.first(kAcknowledgementLength));
}

bool DashboardReceiver::getsLost(const Known& known, Way way) {
  if (_options.lossPercent == 0) return false;
  const uint64_t one = uint64_t{known.eventID} << 33 | uint64_t{known.times} << 1 | (way == Way::Back ? 1 : 0);
  if (mixed(mixed(_options.lossSeed) ^ one) % kHundred >= _options.lossPercent) return false;
  ++_lost;
  return true;
}

DashboardReceiver::Known& DashboardReceiver::remember(std::string identity) {
  const auto [known, isNew] = _known.try_emplace(std::move(identity));
  if (!isNew) return known->second;
  _knownInOrder.push_back(known->first);
  if (_knownInOrder.size() > kRemembered) {
    _known.erase(_knownInOrder.front());
    _knownInOrder.pop_front();
  }
  return known->second;
}

}  // namespace telvane
