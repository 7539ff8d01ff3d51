#include "platform/identifiers/PersistentIdentifiers.h"

namespace telvane {

Value getPersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log,
                                    const IdentifierPlace& place) {
  Value identifier = userDefaults.objectForKeyOrStore(place.suite, place.key,
                                                      [&random]() -> Value { return random.newUUID().string(); });
  log.message("getPersistentIdentifierForDNU: The value for {}: {}", place.key, identifier);
  return identifier;
}

void regeneratePersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log,
                                          const IdentifierPlace& place) {
  const std::string identifier = random.newUUID().string();
  const Result<void> stored = userDefaults.setObject(place.suite, place.key, identifier);
  if (!stored) {
    log.error("regeneratePersistentIdentifierForDNU: Failed to store the value for {}: {}", place.key, stored.error());
    return;
  }
  log.message("regeneratePersistentIdentifierForDNU: Set new value for {}: {}", place.key, identifier);
}

}  // namespace telvane
