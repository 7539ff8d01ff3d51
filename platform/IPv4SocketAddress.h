#pragma once

#include <array>
#include <compare>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace telvane {

// An IPv4 address with a UDP port, as the socket interface takes it. A value.
struct IPv4SocketAddress {
  std::array<uint8_t, 4> address{};  // in the order in which they are written
  uint16_t port = 0;

  friend auto operator<=>(const IPv4SocketAddress&, const IPv4SocketAddress&) = default;
};

// Reads the first 16 characters of the text as a dotted IPv4 address: four decimal numbers from 0 to 255, nothing
// around them. Names are not looked up. Nothing when it is no such address.
std::optional<IPv4SocketAddress> ipv4SocketAddress(std::string_view dottedAddress, uint16_t port);
// "192.0.2.1:9000".
std::string description(const IPv4SocketAddress& address);

}  // namespace telvane
