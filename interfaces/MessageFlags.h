#pragma once

#include <cstdint>

// What a client asks for with the flag of a message.
namespace telvane {

inline constexpr uint32_t kOrdinaryFlag = 0;
// Sent at once, to the real-time URL.
inline constexpr uint32_t kRealtimeFlag = 1;
// Enables a backend that is sampled out.
inline constexpr uint32_t kPromotingFlag = 2;
inline constexpr uint32_t kRealtimeAndPromotingFlag = 3;
// On internal builds the event tells how much was sent since the last report.
inline constexpr uint32_t kPeriodicReportFlag = 4;

constexpr bool isRealtime(uint32_t flag) noexcept { return flag == kRealtimeFlag || flag == kRealtimeAndPromotingFlag; }
constexpr bool isPromoting(uint32_t flag) noexcept {
  return flag == kPromotingFlag || flag == kRealtimeAndPromotingFlag;
}

}  // namespace telvane
