#pragma once

#include <memory>
#include <string_view>

#include "foundation/Error.h"
#include "foundation/UniqueFunction.h"
#include "foundation/Value.h"

namespace telvane {

// Persistent settings, one dictionary per suite, shared by all processes of the user. Safe from any thread and any
// process: a change is written at once and never seen half; a file changed by another process is read anew.
// A suite's file that is no property list, or no dictionary, counts as empty (one error line per content).
class UserDefaults {
 public:
  virtual ~UserDefaults() = default;
  // Returns the user's value, else the system-wide one, else an absent value.
  virtual Value objectForKey(std::string_view suite, std::string_view key) const = 0;
  // Returns all entries of the suite as objectForKey would answer them.
  virtual Dictionary dictionaryRepresentation(std::string_view suite) const = 0;
  // Sets the user's value; an absent value removes the key.
  virtual Result<void> setObject(std::string_view suite, std::string_view key, Value value) = 0;
  // Returns the value under the key; where there is none, stores the one that make() returns, in one step that no
  // other process can come between. A failed write is logged; the new value is returned all the same.
  virtual Value objectForKeyOrStore(std::string_view suite, std::string_view key, UniqueFunction<Value()> make) = 0;
};

}  // namespace telvane
