#include "tests/support/MemoryUserDefaults.h"

#include <utility>

namespace telvane::testing {

Value MemoryUserDefaults::objectForKey(std::string_view suite, std::string_view key) const {
  MutexLock lock(_mutex);
  return objectLocked(suite, key);
}

Dictionary MemoryUserDefaults::dictionaryRepresentation(std::string_view suite) const {
  MutexLock lock(_mutex);
  Dictionary entries;
  if (const auto found = _systemWide.find(suite); found != _systemWide.end()) entries = found->second;
  if (const auto found = _user.find(suite); found != _user.end()) entries.addEntriesFrom(found->second);
  return entries;
}

Result<void> MemoryUserDefaults::setObject(std::string_view suite, std::string_view key, Value value) {
  MutexLock lock(_mutex);
  if (_writeError) return Error::withDescription(kPlatformErrorDomain, *_writeError, "user defaults: write fails");
  _user[std::string(suite)].set(String(key), std::move(value));
  return {};
}

Value MemoryUserDefaults::objectForKeyOrStore(std::string_view suite, std::string_view key,
                                              UniqueFunction<Value()> make) {
  if (Value present = objectForKey(suite, key); present.isPresent()) return present;
  Value made = make();
  MutexLock lock(_mutex);
  if (Value present = objectLocked(suite, key); present.isPresent()) return present;
  if (!_writeError) _user[std::string(suite)].set(String(key), made);
  return made;
}

void MemoryUserDefaults::setSystemWide(std::string_view suite, std::string_view key, Value value) {
  MutexLock lock(_mutex);
  _systemWide[std::string(suite)].set(String(key), std::move(value));
}

void MemoryUserDefaults::failWrites(std::optional<int> errorNumber) {
  MutexLock lock(_mutex);
  _writeError = errorNumber;
}

const Value& MemoryUserDefaults::lookUp(const Suites& suites, std::string_view suite, std::string_view key) {
  const auto found = suites.find(suite);
  return found == suites.end() ? Value::none() : found->second[key];
}

Value MemoryUserDefaults::objectLocked(std::string_view suite, std::string_view key) const {
  const Value& own = lookUp(_user, suite, key);
  return own.isPresent() ? own : lookUp(_systemWide, suite, key);
}

}  // namespace telvane::testing
