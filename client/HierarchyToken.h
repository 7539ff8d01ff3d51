#pragma once

#include <optional>

#include "foundation/Value.h"
#include "platform/Random.h"

namespace telvane {

// Makes the token of a new hierarchy (level 0), or of the level below the parent token's. Returns nothing when the
// parent is there but is no dictionary, or has no token.
std::optional<Dictionary> newHierarchyTokenFromParentToken(Random& random, const Value& parentToken);

}  // namespace telvane
