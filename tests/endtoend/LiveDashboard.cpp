#include "tests/endtoend/LiveDashboard.h"

#include <fmt/format.h>

#include <array>
#include <cstring>
#include <fstream>
#include <sstream>
#include <stdexcept>

namespace telvane::testing {

uint16_t LiveDashboard::Datagram::number(size_t offset) const {
  const auto byte = [this](size_t index) { return static_cast<unsigned char>(bytes.at(index)); };
  return static_cast<uint16_t>(byte(offset) << 8 | byte(offset + 1));
}

LiveDashboard::LiveDashboard(Handler handler) : _handler(std::move(handler)) {
  MutexLock lock(_mutex);  // what comes waits in take() until there is a server to answer
  auto server =
      DatagramServer::start({{127, 0, 0, 1}, 0}, [this](const DatagramServer&, std::span<const uint8_t> bytes,
                                                        const IPv4SocketAddress& peer) { take(bytes, peer); });
  if (server.has_error()) throw std::runtime_error(server.error().description());
  _server = std::move(*server);
}

void LiveDashboard::acknowledge(const Datagram& datagram) const {
  const std::string head = acknowledgementOf(datagram);
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
  Datagram datagram{.bytes = std::string(bytes.begin(), bytes.end()), .peer = peer, .at = Clock::now()};
  {
    MutexLock lock(_mutex);
    datagram.copy = ++_copies[datagram.bytes];
    _datagrams.push_back(datagram);
  }
  _handler(*this, datagram);
}

bool isUDPSocketConnectedTo(uint16_t port) {
  // The system writes the four bytes as one number of its own byte order.
  constexpr std::array<uint8_t, 4> kAddress = {127, 0, 0, 1};
  uint32_t address = 0;
  std::memcpy(&address, kAddress.data(), sizeof address);
  const std::string wanted = fmt::format("{:08X}:{:04X}", address, port);
  std::ifstream sockets("/proc/net/udp");
  if (!sockets.is_open()) throw std::runtime_error("the system does not list its UDP sockets");
  for (std::string line; std::getline(sockets, line);) {
    std::istringstream columns(line);
    std::string number;
    std::string local;
    std::string remote;
    columns >> number >> local >> remote;
    if (remote == wanted) return true;
  }
  return false;
}

}  // namespace telvane::testing
