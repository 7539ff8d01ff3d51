#pragma once

#include <optional>

#include "foundation/Error.h"
#include "foundation/Value.h"
#include "platform/Log.h"

namespace telvane {

// Whether a session can be made from the session info: it is a dictionary and its client type is a known one. Sets
// *error to the reason, or to nothing on success; error may be null.
bool validateSessionInfo(Log& log, const Value& sessionInfo, std::optional<Error>* error);

}  // namespace telvane
