#pragma once

#include "foundation/Key.h"

// The names of backends: keys of a storebag section and of a session's backends, and what clients are told.
namespace telvane {

inline constexpr Key kTelvaneBackendDashboard{"dashboard"};
inline constexpr Key kTelvaneBackendUploadServer{"upload_server"};
// Any backend whose name contains this text is one of these.
inline constexpr Key kTelvaneBackendHTTPPost{"splunk"};
inline constexpr Key kTelvaneBackendHTTPPost2{"gonzo"};
inline constexpr Key kTelvaneBackendWattbook{"power"};
inline constexpr Key kTelvaneBackendQRS{"qrs"};
inline constexpr Key kTelvaneBackendVDR{"vdr"};

// The answer of fetchDisplayURL when no backend has one.
inline constexpr Key kDisplayURLNotAvailable{"URL not available"};

}  // namespace telvane
