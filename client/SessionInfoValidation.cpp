#include "client/SessionInfoValidation.h"

#include "interfaces/ClientTypes.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"

namespace telvane {
namespace {

void setError(std::optional<Error>* error, TelvaneErrorCode code, const char* text) {
  if (error != nullptr) *error = makeTelvaneError(text, static_cast<int64_t>(code));
}

}  // namespace

bool validateSessionInfo(Log& log, const Value& sessionInfo, std::optional<Error>* error) {
  const Dictionary* info = sessionInfo.dictionary();
  if (info == nullptr) {
    log.error("validateSessionInfo: sessionInfo is nil");
    setError(error, TelvaneErrorCode::MissingSessionInfo, "The session info is missing");
    return false;
  }
  if (clientType((*info)[kTelvaneSessionInfoClientType].int32Value()) == nullptr) {
    log.error("validateSessionInfo: clientType is invalid");
    setError(error, TelvaneErrorCode::InvalidClientType, "The client type of the session info is not valid");
    return false;
  }
  if (error != nullptr) error->reset();
  return true;
}

}  // namespace telvane
