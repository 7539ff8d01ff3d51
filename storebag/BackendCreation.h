#pragma once

#include <memory>
#include <optional>
#include <utility>
#include <vector>

#include "backends/TelvaneBackend.h"
#include "foundation/Value.h"
#include "util/ProcessContext.h"

namespace telvane {

// A session's backends by name, in the order of the storebag section's entries.
using BackendTable = std::vector<std::pair<String, std::shared_ptr<TelvaneBackend>>>;

// Makes a backend of every entry of a storebag section and stamps it with the session's and the device's identity.
// storebag, sessionInfo: dictionaries, else nothing is made (one error line). userInfo: a dictionary or absent.
// deviceIdentifier: the device's unique identifier, may be empty. Entries whose name stands for no backend are skipped.
std::optional<BackendTable> createBackends(const ProcessContext& context, const Value& storebag,
                                           const Value& sessionInfo, const Value& userInfo, String deviceIdentifier);

}  // namespace telvane
