#include "platform/IPv4SocketAddress.h"

#include <arpa/inet.h>
#include <fmt/format.h>

#include <cstring>

#include "platform/datagram/SystemAddress.h"

namespace telvane {
namespace {

constexpr size_t kLongestText = 16;

}  // namespace

std::optional<IPv4SocketAddress> ipv4SocketAddress(std::string_view dottedAddress, uint16_t port) {
  const std::string_view text = dottedAddress.substr(0, kLongestText);
  // What stands behind a null character would go unseen.
  if (text.find('\0') != std::string_view::npos) return std::nullopt;
  in_addr address{};
  if (inet_pton(AF_INET, std::string(text).c_str(), &address) != 1) return std::nullopt;
  IPv4SocketAddress result;
  static_assert(sizeof address.s_addr == sizeof result.address);
  std::memcpy(result.address.data(), &address.s_addr, result.address.size());
  result.port = port;
  return result;
}

std::string description(const IPv4SocketAddress& address) {
  const auto& [first, second, third, fourth] = address.address;
  return fmt::format("{}.{}.{}.{}:{}", first, second, third, fourth, address.port);
}

sockaddr_in systemAddress(const IPv4SocketAddress& address) noexcept {
  sockaddr_in result{};
  result.sin_family = AF_INET;
  result.sin_port = htons(address.port);
  std::memcpy(&result.sin_addr.s_addr, address.address.data(), address.address.size());
  return result;
}

IPv4SocketAddress fromSystemAddress(const sockaddr_in& address) noexcept {
  IPv4SocketAddress result;
  std::memcpy(result.address.data(), &address.sin_addr.s_addr, result.address.size());
  result.port = ntohs(address.sin_port);
  return result;
}

}  // namespace telvane
