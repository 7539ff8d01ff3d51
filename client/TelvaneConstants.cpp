#include "client/include/telvane/TelvaneConstants.h"

#include "interfaces/BackendNames.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"

// An array needs its text spelled out; the assertion keeps it the key that the rest of the house reads.
#define TELVANE_DEFINE_CONSTANT(name, text) \
  extern "C" constexpr char name[] = text;  \
  static_assert(telvane::name == std::string_view(text))

TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoEnableFlag, "EnableFlag");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoClientType, "ComponentType");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoClientVersion, "ClientVersion");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoSessionID, "SessionID");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoBatchEvent, "BatchEvents");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoRequireUserInfo, "RequireUserDict");
TELVANE_DEFINE_CONSTANT(kTelvaneSessionInfoHierarchyToken, "HierarchyToken");

TELVANE_DEFINE_CONSTANT(kTelvaneHierarchyTokenTokenID, "token");
TELVANE_DEFINE_CONSTANT(kTelvaneHierarchyTokenLevel, "level");

TELVANE_DEFINE_CONSTANT(kTelvaneUserInfoClientName, "_clientName");
TELVANE_DEFINE_CONSTANT(kTelvaneUserInfoServiceName, "_serviceName");

TELVANE_DEFINE_CONSTANT(kTelvaneMessageParametersCategory, "ParametersCategory");
TELVANE_DEFINE_CONSTANT(kTelvaneMessageParametersType, "ParametersType");
TELVANE_DEFINE_CONSTANT(kTelvaneMessageParametersPayload, "ParametersPayload");
TELVANE_DEFINE_CONSTANT(kTelvaneMessageParametersFlag, "ParametersFlag");

TELVANE_DEFINE_CONSTANT(kTelvaneMessageBlobClientData, "ClientData");
TELVANE_DEFINE_CONSTANT(kTelvaneMessageBlobSharedData, "SharedData");

TELVANE_DEFINE_CONSTANT(kTelvaneLogDataData, "LogData");
TELVANE_DEFINE_CONSTANT(kTelvaneLogDataStartTime, "StartTime");
TELVANE_DEFINE_CONSTANT(kTelvaneLogDataEndTime, "EndTime");

TELVANE_DEFINE_CONSTANT(kTelvaneBackendDashboard, "dashboard");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendUploadServer, "upload_server");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendHTTPPost, "splunk");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendHTTPPost2, "gonzo");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendWattbook, "power");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendQRS, "qrs");
TELVANE_DEFINE_CONSTANT(kTelvaneBackendVDR, "vdr");

TELVANE_DEFINE_CONSTANT(kTelvaneErrorDomain, "TelvaneErrorDomain");
