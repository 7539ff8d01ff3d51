#pragma once

#include "foundation/Key.h"

// The keys of the agent's storebag records and of what the daemon tells of itself.
namespace telvane {

inline constexpr Key kRecordStorebagData{"StorebagData"};
inline constexpr Key kRecordStorebagVersion{"StorebagVersion"};
inline constexpr Key kRecordFetchTime{"StorebagFetchTime"};
inline constexpr Key kRecordFetchState{"StorebagFetchState"};
inline constexpr Key kRecordMaxAge{"StorebagMaxAge"};

inline constexpr Key kStatusVersion{"version"};
inline constexpr Key kStatusProcessID{"pid"};
inline constexpr Key kStatusUptimeSeconds{"uptimeSeconds"};
// Live sessions, the asking one included, and how many of them each client type has.
inline constexpr Key kStatusSessions{"sessions"};
inline constexpr Key kStatusClientTypes{"clientTypes"};
inline constexpr Key kStatusHierarchies{"hierarchies"};
// How many hierarchies have shared data.
inline constexpr Key kStatusSharedData{"sharedData"};
inline constexpr Key kStatusTransactions{"transactions"};
inline constexpr Key kStatusConnectivityHelpers{"connectivityHelpers"};
// Storebag name -> {state, version, ageSeconds, maxAgeSeconds}.
inline constexpr Key kStatusStorebags{"storebags"};
inline constexpr Key kStatusStorebagState{"state"};
inline constexpr Key kStatusStorebagVersion{"version"};
inline constexpr Key kStatusStorebagAgeSeconds{"ageSeconds"};
inline constexpr Key kStatusStorebagMaxAgeSeconds{"maxAgeSeconds"};
inline constexpr Key kStatusMemoryBytes{"memoryBytes"};

}  // namespace telvane
