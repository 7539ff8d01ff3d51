#pragma once

#include <string>

#include "foundation/Export.h"
#include "foundation/Value.h"

namespace telvane {

// Describes a value as description() does, cut at this many bytes (not inside a character) and then "..."; what lies
// behind is not described at all. For lines about values whose size is somebody else's choice.
TELVANE_EXPORT std::string shortDescription(const Value& value, size_t limit);

}  // namespace telvane
