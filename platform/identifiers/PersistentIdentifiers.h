#pragma once

#include "foundation/Key.h"
#include "foundation/Value.h"
#include "platform/Log.h"
#include "platform/Random.h"
#include "platform/UserDefaults.h"

// The two identifiers of this device that outlive processes, kept in the user defaults. Clients and the daemon read
// them, each from its own user's defaults. Safe from any thread and any process: reading and making are one step.
namespace telvane {

// Where one of the two is kept.
struct IdentifierPlace {
  Key suite;
  Key key;
};

// Returns the stored identifier, whatever its type; only when there is none makes a UUID text (36 characters,
// upper-case) and stores it.
Value getPersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log, const IdentifierPlace& place);

// Replaces the stored identifier with a new UUID text. A failed write is logged; the old one then stays.
void regeneratePersistentIdentifierForDNU(UserDefaults& userDefaults, Random& random, Log& log,
                                          const IdentifierPlace& place);

}  // namespace telvane
