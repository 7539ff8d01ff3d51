#pragma once

#include <cstdint>
#include <string_view>

#include "util/ProcessContext.h"

namespace telvane {

// The section of a storebag that this device uses.
enum Environment : uint32_t {
  kEnvironmentTypeNone = 0,
  kEnvironmentTypeDevelopment = 1,
  kEnvironmentTypeInternal = 2,
  kEnvironmentTypeSeed = 3,
  kEnvironmentTypeRelease = 4,
};

// Reads the environment number from the user defaults: internal or release by the build when absent, internal (and an
// error line) when it is 5 or more. Read anew at each call.
uint32_t userDefaultsEnvironment(const ProcessContext& context);
// The section's key for 1 to 4; an empty view for anything else.
std::string_view environmentNameForType(uint32_t type) noexcept;

}  // namespace telvane
