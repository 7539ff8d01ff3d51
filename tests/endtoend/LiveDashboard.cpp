#include "tests/endtoend/LiveDashboard.h"

#include <stdexcept>

namespace telvane::testing {

uint16_t LiveDashboard::Datagram::number(size_t offset) const {
  const auto byte = [this](size_t at) { return static_cast<unsigned char>(bytes.at(at)); };
  return static_cast<uint16_t>(byte(offset) << 8 | byte(offset + 1));
}

LiveDashboard::LiveDashboard(Handler handler) : _handler(std::move(handler)) {
  // Nobody knows the port before this constructor is through, so nothing comes before there is a server to answer.
  auto server =
      DatagramServer::start({{127, 0, 0, 1}, 0}, [this](const DatagramServer&, std::span<const uint8_t> bytes,
                                                        const IPv4SocketAddress& peer) { take(bytes, peer); });
  if (server.has_error()) throw std::runtime_error(server.error().description());
  _server = std::move(*server);
}

void LiveDashboard::acknowledge(const Datagram& datagram) const {
  const std::string head = datagram.bytes.substr(0, 62);
  _server->send(datagram.peer, {reinterpret_cast<const uint8_t*>(head.data()), head.size()});
}

std::vector<LiveDashboard::Datagram> LiveDashboard::datagrams() const {
  MutexLock lock(_mutex);
  return _datagrams;
}

std::vector<LiveDashboard::Datagram> LiveDashboard::datagrams(uint16_t category) const {
  std::vector<Datagram> found;
  for (Datagram& datagram : datagrams()) {
    if (datagram.category() == category) found.push_back(std::move(datagram));
  }
  return found;
}

std::vector<std::string> LiveDashboard::texts(uint16_t category) const {
  std::map<uint16_t, std::string> byEvent;
  for (const Datagram& datagram : datagrams(category)) byEvent[datagram.eventID()] = datagram.text();
  std::vector<std::string> texts;
  for (const auto& [eventID, text] : byEvent) texts.push_back(text);
  return texts;
}

void LiveDashboard::take(std::span<const uint8_t> bytes, const IPv4SocketAddress& peer) {
  Datagram datagram{.bytes = std::string(bytes.begin(), bytes.end()), .peer = peer};
  {
    MutexLock lock(_mutex);
    datagram.copy = ++_copies[datagram.bytes];
    _datagrams.push_back(datagram);
  }
  _handler(*this, datagram);
}

}  // namespace telvane::testing
