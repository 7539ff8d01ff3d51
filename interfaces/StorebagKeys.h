#pragma once

#include "foundation/Key.h"

// The keys of a storebag: envelope, inner bag, environment sections, and the profiles of backends.
namespace telvane {

inline constexpr Key kEnvelopeBag{"bag"};
inline constexpr Key kEnvelopeSignature{"signature"};

inline constexpr Key kStorebagSharedValues{"shared_values"};
inline constexpr Key kStorebagVersion{"version"};
inline constexpr Key kStorebagRefreshCycle{"refresh_cycle"};
inline constexpr Key kStorebagReleaseTimeout{"release_timeout"};

inline constexpr Key kEnvironmentDevelopment{"development"};
inline constexpr Key kEnvironmentInternal{"corvex_internal"};
inline constexpr Key kEnvironmentSeed{"seed"};
inline constexpr Key kEnvironmentRelease{"release"};

inline constexpr Key kProfileActive{"active"};
inline constexpr Key kProfileClients{"clients"};
inline constexpr Key kProfileDisplayURL{"display_url"};
inline constexpr Key kProfilePostURL{"post_url"};
inline constexpr Key kProfileIP{"ip"};
inline constexpr Key kProfilePort{"port"};
inline constexpr Key kProfileReliable{"reliable"};

inline constexpr Key kClientEntryClient{"client"};
inline constexpr Key kClientEntryService{"service"};
inline constexpr Key kClientEntryExpedite{"expedite"};
inline constexpr Key kClientEntryEnabledSince{"enabledSince"};
inline constexpr Key kClientEntryOverrideDNU{"override_dnu"};
inline constexpr Key kClientEntryLocaleWhitelist{"locale_whitelist"};
inline constexpr Key kClientEntryDeviceWhitelist{"device_whitelist"};
inline constexpr Key kClientEntryDeviceBlacklist{"device_blacklist"};
inline constexpr Key kClientEntryFilters{"filters"};
inline constexpr Key kClientEntrySamplingThreshold{"sampling_threshold"};
inline constexpr Key kClientEntryPerCountrySamplingThresholds{"per_country_sampling_thresholds"};
inline constexpr Key kClientEntryOverrideSampling{"override_sampling"};
inline constexpr Key kClientEntryCustomClientId{"custom_clientId"};
inline constexpr Key kClientEntryEventThreshold{"event_threshold"};
inline constexpr Key kClientEntryExtrasOnInternal{"extras_on_internal"};
inline constexpr Key kClientEntryPostURL{"post_url"};
inline constexpr Key kClientEntryRealtimePostURL{"realtime_post_url"};
inline constexpr Key kClientEntryEventWhitelist{"event_whitelist"};
inline constexpr Key kClientEntryEventBlacklist{"event_blacklist"};
inline constexpr Key kClientEntryIncludeSessionID{"include_session_id"};
inline constexpr Key kClientEntryUseWiFiOnly{"use_wifi_only"};

inline constexpr Key kPerCountryCountry{"country"};
inline constexpr Key kPerCountryThreshold{"threshold"};

inline constexpr Key kFilterMethod{"method"};
inline constexpr Key kFilterStatus{"status"};
inline constexpr Key kFilterKey{"key"};
inline constexpr Key kFilterValue{"value"};
inline constexpr Key kFilterAction{"action"};

}  // namespace telvane
