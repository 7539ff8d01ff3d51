#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "foundation/Value.h"
#include "util/ProcessContext.h"

namespace telvane {

// The part of a storebag that this device uses.
struct StorebagSection {
  std::string_view environment;       // the environment whose section was looked for; empty when it has none
  std::string_view name;              // the section that was taken; empty when there is none
  std::optional<Dictionary> content;  // with "release_timeout" added when the bag has it
};

// Takes the section of the device's environment out of a bag whose macros are expanded; the release section instead of
// a missing seed section (one error line). No content, and an error line, when there is none.
StorebagSection storebagSectionForEnvironment(const ProcessContext& context, const Dictionary& bag, int32_t clientType);

}  // namespace telvane
