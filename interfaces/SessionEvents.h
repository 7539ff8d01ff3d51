#pragma once

#include <cstdint>
#include <string_view>

// The events that the daemon itself makes for each session, as collectors know them.
namespace telvane {

// Category and types of the events that say that a session has begun or ended.
inline constexpr uint16_t kSessionMethod = 0;
inline constexpr uint16_t kSessionStart = 0;
inline constexpr uint16_t kSessionStop = 1;

// Stands where the device, or the table of client types, has no answer.
inline constexpr std::string_view kUnknown = "Unknown";

}  // namespace telvane
