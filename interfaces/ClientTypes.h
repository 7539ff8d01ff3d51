#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string_view>

// The one table of client types: everything that names a client type reads it here.
namespace telvane {

struct ClientType {
  int32_t number;
  // The storebag that governs it; types that share a name share one bag.
  std::string_view storebagName;
  // The short sender name in events and headers.
  std::string_view senderName;
};

inline constexpr int32_t kFirstClientType = 5;
inline constexpr int32_t kLastClientType = 30;
// The name shared by types 7, 11, 13 and 20; the only bag with a built-in default.
inline constexpr std::string_view kConferencingStorebagName = "conferencing";

// Returns the row of a client type, or null when there is no such type (below 5, above 30).
const ClientType* clientType(int32_t number) noexcept;
// Whether the system's wireless-diagnostics service takes events of the type: 7, 11 and 13.
bool hasWirelessDiagnostics(int64_t number) noexcept;
// All rows in ascending order of number.
const std::array<ClientType, kLastClientType - kFirstClientType + 1>& allClientTypes() noexcept;

}  // namespace telvane
