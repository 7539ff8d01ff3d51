#include "storebag/StorebagSection.h"

#include "interfaces/StorebagKeys.h"
#include "util/UserDefaultsEnvironment.h"

namespace telvane {

StorebagSection storebagSectionForEnvironment(const ProcessContext& context, const Dictionary& bag,
                                              int32_t clientType) {
  const std::string_view environment = environmentNameForType(userDefaultsEnvironment(context));
  StorebagSection result{.environment = environment, .name = environment, .content = {}};
  const Dictionary* section = bag[environment].dictionary();
  if (section == nullptr && userDefaultsEnvironment(context) == kEnvironmentTypeSeed) {
    context.log().error("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
    result.name = kEnvironmentRelease;
    section = bag[kEnvironmentRelease].dictionary();
  }
  if (section == nullptr) {
    context.log().error(
        "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type {} with {} environment",
        clientType, environment.empty() ? "(null)" : environment);
    result.name = {};
    return result;
  }
  result.content = *section;
  if (bag.contains(kStorebagReleaseTimeout)) {
    result.content->set(kStorebagReleaseTimeout, bag[kStorebagReleaseTimeout]);
  }
  return result;
}

}  // namespace telvane
