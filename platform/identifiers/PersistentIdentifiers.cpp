#include "platform/identifiers/PersistentIdentifiers.h"

namespace telvane {
namespace {

// The suite of Telvane's own settings.
constexpr Key kSuite{"com.corvex.telvane"};
constexpr Key kRespectDNU{"uuidRespectDNU"};
constexpr Key kOverrideDNU{"uuidOverrideDNU"};

}  // namespace

Key persistentIdentifierKeyForDNU(bool respectsDNU) noexcept { return respectsDNU ? kRespectDNU : kOverrideDNU; }

Value getPersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log, bool respectsDNU) {
  const Key key = persistentIdentifierKeyForDNU(respectsDNU);
  Value identifier =
      userDefaults.objectForKeyOrStore(kSuite, key, [&random]() -> Value { return random.newUUID().string(); });
  log.message("getPersistentIdentifierForDNU: The value for {}: {}", key, identifier);
  return identifier;
}

void regeneratePersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log, bool respectsDNU) {
  const Key key = persistentIdentifierKeyForDNU(respectsDNU);
  const std::string identifier = random.newUUID().string();
  const Result<void> stored = userDefaults.setObject(kSuite, key, identifier);
  if (!stored) {
    log.error("regeneratePersistentIdentifierForDNU: Failed to store the value for {}: {}", key, stored.error());
    return;
  }
  log.message("regeneratePersistentIdentifierForDNU: Set new value for {}: {}", key, identifier);
}

}  // namespace telvane
