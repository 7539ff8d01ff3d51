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
// Which of the device's two identifiers: the one that respects the user's wish not to be followed, or the one that
// overrides it.
constexpr Key defaultsKeyOfIdentifierForDNU(bool respectsDNU) noexcept {
  return respectsDNU ? kDefaultsUUIDRespectDNU : kDefaultsUUIDOverrideDNU;
}

inline constexpr Key kTimedDefaultsSuite{"com.corvex.timed"};
inline constexpr Key kDefaultsAutomaticTimeZoneEnabled{"TMAutomaticTimeZoneEnabled"};

}  // namespace telvane
