#include "client/HierarchyToken.h"

#include "interfaces/SessionKeys.h"

namespace telvane {

std::optional<Dictionary> newHierarchyTokenFromParentToken(Random& random, const Value& parentToken) {
  if (!parentToken.isPresent()) {
    return Dictionary{{kTelvaneHierarchyTokenTokenID, random.newUUID().string()}, {kTelvaneHierarchyTokenLevel, 0}};
  }
  if (!parentToken.isDictionary()) return std::nullopt;
  const Dictionary& parent = *parentToken.dictionary();
  const Value& token = parent[kTelvaneHierarchyTokenTokenID];
  if (!token.isPresent()) return std::nullopt;
  // In unsigned arithmetic, because the parent's level comes from outside and may be the largest there is.
  const auto level = static_cast<int32_t>(parent[kTelvaneHierarchyTokenLevel].uint32Value() + 1u);
  return Dictionary{{kTelvaneHierarchyTokenTokenID, token}, {kTelvaneHierarchyTokenLevel, level}};
}

}  // namespace telvane
