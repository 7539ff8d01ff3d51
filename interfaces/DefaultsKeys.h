#pragma once

#include "foundation/Key.h"

// User-defaults suites and the keys read from them.
namespace telvane {

inline constexpr Key kTelvaneDefaultsSuite{"com.corvex.telvane"};
inline constexpr Key kDefaultsEnvironmentType{"environmentType"};
inline constexpr Key kDefaultsStorebagURL{"telvane_storebag_url"};
inline constexpr Key kDefaultsHTTPSPostURL{"httpsPostURL"};
inline constexpr Key kDefaultsHTTPSRealtimePostURL{"httpsRealtimePostURL"};
inline constexpr Key kDefaultsForceEventLogging{"forceEventLogging"};
inline constexpr Key kDefaultsUUIDRespectDNU{"uuidRespectDNU"};
inline constexpr Key kDefaultsUUIDOverrideDNU{"uuidOverrideDNU"};

inline constexpr Key kTimedDefaultsSuite{"com.corvex.timed"};
inline constexpr Key kDefaultsAutomaticTimeZoneEnabled{"TMAutomaticTimeZoneEnabled"};

}  // namespace telvane
