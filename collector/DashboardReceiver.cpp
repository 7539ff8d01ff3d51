#include "collector/DashboardReceiver.h"

#include "collector/DashboardEvent.h"

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
    : _options(std::move(options)), _events(events), _chance(_options.lossSeed) {}

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
  if (getsLost()) return;
  const Result<DashboardEvent> event = DashboardEvent::decode(datagram);
  if (event.has_error()) {
    ++_refused;
    return;
  }
  std::string identity = identityOf(datagram, peer);
  if (isKnown(identity)) {
    ++_repeated;
    if (event->isReliable) acknowledge(server, datagram, peer);
    return;
  }
  Dictionary line;
  line.set("dashboard", Value(true));
  line.set("peer", Value(description(peer)));
  line.set("reliable", Value(event->isReliable));
  line.set("addressedByBag", Value(event->isAddressedByBag));
  line.set("event", event->dictionary());
  if (_events.add(line).has_error()) {
    ++_refused;
    return;
  }
  ++_stored;
  remember(std::move(identity));
  if (_options.show) _options.show(event->line());
  if (event->isReliable) acknowledge(server, datagram, peer);
}

void DashboardReceiver::acknowledge(const DatagramServer& server, std::span<const uint8_t> datagram,
                                    const IPv4SocketAddress& peer) {
  // One that finds no room is as good as lost: the event comes again.
  if (!getsLost()) server.send(peer, datagram.first(kAcknowledgementLength));
}

bool DashboardReceiver::getsLost() {
  if (_options.lossPercent == 0 || _chance() % kHundred >= _options.lossPercent) return false;
  ++_lost;
  return true;
}

void DashboardReceiver::remember(std::string identity) {
  _knownInOrder.push_back(identity);
  _known.insert(std::move(identity));
  if (_knownInOrder.size() <= kRemembered) return;
  _known.erase(_knownInOrder.front());
  _knownInOrder.pop_front();
}

}  // namespace telvane
