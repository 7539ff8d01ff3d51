#pragma once

#include "foundation/Key.h"

// The keys of every dictionary that crosses between client, daemon and backends. All numbers travel as number values
// and are read leniently; unsigned 16-bit ones keep their low 16 bits.
namespace telvane {

// Session info: sent once per session, or with each one-shot message.
inline constexpr Key kTelvaneSessionInfoEnableFlag{"EnableFlag"};
inline constexpr Key kTelvaneSessionInfoClientType{"ComponentType"};
inline constexpr Key kTelvaneSessionInfoClientVersion{"ClientVersion"};
inline constexpr Key kTelvaneSessionInfoSessionID{"SessionID"};
inline constexpr Key kTelvaneSessionInfoBatchEvent{"BatchEvents"};
inline constexpr Key kTelvaneSessionInfoRequireUserInfo{"RequireUserDict"};
// A hierarchy token dictionary; anything else is ignored.
inline constexpr Key kTelvaneSessionInfoHierarchyToken{"HierarchyToken"};

// Hierarchy token.
inline constexpr Key kTelvaneHierarchyTokenTokenID{"token"};
inline constexpr Key kTelvaneHierarchyTokenLevel{"level"};

// User info: valid when it holds at least one of the two names; other keys ride along.
inline constexpr Key kTelvaneUserInfoClientName{"_clientName"};
inline constexpr Key kTelvaneUserInfoServiceName{"_serviceName"};

// Message.
inline constexpr Key kTelvaneMessageParametersCategory{"ParametersCategory"};
inline constexpr Key kTelvaneMessageParametersType{"ParametersType"};
inline constexpr Key kTelvaneMessageParametersPayload{"ParametersPayload"};
inline constexpr Key kTelvaneMessageParametersFlag{"ParametersFlag"};

// Message blob: what the daemon makes of one message for its backends.
inline constexpr Key kTelvaneMessageBlobSharedData{"SharedData"};
inline constexpr Key kTelvaneMessageBlobClientData{"ClientData"};

// Log data: one element of an uploaded array.
inline constexpr Key kTelvaneLogDataData{"LogData"};
inline constexpr Key kTelvaneLogDataStartTime{"StartTime"};
inline constexpr Key kTelvaneLogDataEndTime{"EndTime"};

}  // namespace telvane
