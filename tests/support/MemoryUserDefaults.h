#pragma once

#include <map>
#include <optional>
#include <string>

#include "platform/Mutex.h"
#include "platform/UserDefaults.h"

namespace telvane::testing {

// Settings in memory, the user's over the system-wide ones. Safe from any thread.
class MemoryUserDefaults final : public UserDefaults {
 public:
  Value objectForKey(std::string_view suite, std::string_view key) const override;
  Dictionary dictionaryRepresentation(std::string_view suite) const override;
  Result<void> setObject(std::string_view suite, std::string_view key, Value value) override;
  Value objectForKeyOrStore(std::string_view suite, std::string_view key, UniqueFunction<Value()> make) override;

  // Sets what the system's administrator set.
  void setSystemWide(std::string_view suite, std::string_view key, Value value);
  // From here on writes fail with the error number; nothing lets them succeed again.
  void failWrites(std::optional<int> errorNumber);

 private:
  using Suites = std::map<std::string, Dictionary, std::less<>>;

  static const Value& lookUp(const Suites& suites, std::string_view suite, std::string_view key);
  Value objectLocked(std::string_view suite, std::string_view key) const REQUIRES(_mutex);

  mutable Mutex _mutex;
  Suites _user GUARDED_BY(_mutex);
  Suites _systemWide GUARDED_BY(_mutex);
  std::optional<int> _writeError GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
