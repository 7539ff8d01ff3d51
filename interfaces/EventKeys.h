#pragma once

#include "foundation/Key.h"

// The keys of the event dictionary and of the posted body, as a collector receives them.
namespace telvane {

inline constexpr Key kEventStartTS{"_startTS"};
inline constexpr Key kEventSender{"_sender"};
inline constexpr Key kEventClientVersion{"_clientVersion"};
inline constexpr Key kEventSessionID{"_sessionID"};
inline constexpr Key kEventEventNumber{"_eventNumber"};
inline constexpr Key kEventMethod{"_method"};
inline constexpr Key kEventStatus{"_status"};
inline constexpr Key kEventClientTS{"_clientTS"};
inline constexpr Key kEventEventTime{"eventTime"};
inline constexpr Key kEventProductFamily{"_productFamily"};
inline constexpr Key kEventProductModel{"_productModel"};
inline constexpr Key kEventOSVersion{"_osVersion"};
inline constexpr Key kEventBuild{"_build"};
inline constexpr Key kEventInternal{"_internal"};
inline constexpr Key kEventReportVers{"_reportVers"};
inline constexpr Key kEventTimezoneOffset{"_timezoneOffset"};
inline constexpr Key kEventBytesSentSinceLastReport{"_bytesSentSinceLastReport"};

// Added to the session-stop event.
inline constexpr Key kEventOpt{"Opt"};
inline constexpr Key kEventSamplingThreshold{"SamplingThreshold"};
inline constexpr Key kEventOverrideSampling{"OverrideSampling"};
inline constexpr Key kEventBatch{"Batch"};
inline constexpr Key kEventTotalBytesSent{"_totalBytesSent"};
inline constexpr Key kEventStorebagVersion{"StorebagVersion"};
inline constexpr Key kEventGracefulTermination{"GracefulTermination"};

// The session-start event.
inline constexpr Key kEventSerialNum{"SerialNum"};
inline constexpr Key kEventVersion{"Version"};
inline constexpr Key kEventBuildNumber{"Build"};
inline constexpr Key kEventHardware{"Hardware"};
inline constexpr Key kEventProduct{"Product"};
inline constexpr Key kEventReportVersion{"ReportVers"};
inline constexpr Key kEventLocale{"Locale"};
inline constexpr Key kEventAutomaticTimeSet{"AutomaticTimeSet"};

// The event that tells a dashboard where uploaded log data lie.
inline constexpr Key kEventLogDataUploadLocation{"LogDataUploadLocation"};

// The posted body.
inline constexpr Key kBodyPostTime{"postTime"};
inline constexpr Key kBodyClientId{"clientId"};
inline constexpr Key kBodyEvents{"events"};

}  // namespace telvane
