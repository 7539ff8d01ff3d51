#include "util/UserDefaultsEnvironment.h"

#include "interfaces/DefaultsKeys.h"
#include "interfaces/StorebagKeys.h"

namespace telvane {

uint32_t userDefaultsEnvironment(const ProcessContext& context) {
  const Value stored = context.platform().userDefaults.objectForKey(kTelvaneDefaultsSuite, kDefaultsEnvironmentType);
  uint32_t type = context.isInternalBuild() ? kEnvironmentTypeInternal : kEnvironmentTypeRelease;
  if (stored.isPresent()) {
    type = stored.uint32Value();
    if (type > kEnvironmentTypeRelease) {
      context.log().error("userDefaultsEnvironment: Invalid environment type {}", type);
      type = kEnvironmentTypeInternal;
    }
  }
  context.log().message("userDefaultsEnvironment: Environment type {}", type);
  return type;
}

std::string_view environmentNameForType(uint32_t type) noexcept {
  switch (type) {
    case kEnvironmentTypeDevelopment:
      return kEnvironmentDevelopment;
    case kEnvironmentTypeInternal:
      return kEnvironmentInternal;
    case kEnvironmentTypeSeed:
      return kEnvironmentSeed;
    case kEnvironmentTypeRelease:
      return kEnvironmentRelease;
    default:
      return {};
  }
}

}  // namespace telvane
