#include "platform/system/PropertyListUserDefaults.h"

#include <cerrno>
#include <cstdio>

#include "platform/PropertyList.h"
#include "platform/system/PlatformError.h"
#include "platform/system/SuiteLock.h"

namespace telvane {
namespace {

constexpr size_t kLongestSuiteName = 200;
constexpr mode_t kMode = 0600;
constexpr std::string_view kUserFolder = "~/Library/Preferences";
constexpr std::string_view kSystemFolder = "/etc/telvane/defaults/";

bool isSuiteName(std::string_view suite) {
  const bool hasSize = !suite.empty() && suite.size() <= kLongestSuiteName;
  return hasSize && suite.front() != '.' && suite.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

Error badSuiteName(std::string_view suite) {
  return platformError(EINVAL, "No suite can have the name \"" + std::string(suite) + "\"");
}

Result<SuiteLock> lockSuite(const std::string& folder, std::string_view suite) {
  if (const Result<void> made = fileaccess::createDirectory(folder); !made) return made.error();
  return SuiteLock::acquire(folder + "/." + std::string(suite) + ".lock");
}

}  // namespace

std::string PropertyListUserDefaults::userPath(std::string_view suite) const {
  return _paths.resolve(std::string(kUserFolder)) + "/" + std::string(suite) + ".plist";
}

std::string PropertyListUserDefaults::systemPath(std::string_view suite) const {
  return _paths.belowRoot(std::string(kSystemFolder)) + std::string(suite) + ".plist";
}

Value PropertyListUserDefaults::objectForKey(std::string_view suite, std::string_view key) const {
  if (!isSuiteName(suite)) return Value();
  Value value = _files.read(userPath(suite)).dictionary[key];
  return value.isPresent() ? value : _files.read(systemPath(suite)).dictionary[key];
}

Dictionary PropertyListUserDefaults::dictionaryRepresentation(std::string_view suite) const {
  if (!isSuiteName(suite)) return Dictionary();
  Dictionary all = _files.read(systemPath(suite)).dictionary;
  all.addEntriesFrom(_files.read(userPath(suite)).dictionary);
  return all;
}

Result<void> PropertyListUserDefaults::setObject(std::string_view suite, std::string_view key, Value value) {
  if (!isSuiteName(suite)) return badSuiteName(suite);
  const Result<SuiteLock> lock = lockSuite(_paths.resolve(std::string(kUserFolder)), suite);
  if (!lock) return lock.error();
  const std::string path = userPath(suite);
  return store(path, _files.readAgain(path), key, std::move(value));
}

Value PropertyListUserDefaults::objectForKeyOrStore(std::string_view suite, std::string_view key,
                                                    UniqueFunction<Value()> make) {
  if (Value value = objectForKey(suite, key); value.isPresent()) return value;
  if (!isSuiteName(suite)) {
    _log.error("Cannot store {}: {}", key, badSuiteName(suite));
    return make();
  }
  const Result<SuiteLock> lock = lockSuite(_paths.resolve(std::string(kUserFolder)), suite);
  const std::string path = userPath(suite);
  const DictionaryFiles::Content old = _files.readAgain(path);
  if (const Value& value = old.dictionary[key]; value.isPresent()) return value;
  Value made = make();
  const Result<void> stored = lock ? store(path, old, key, made) : Result<void>(lock.error());
  if (!stored) _log.error("Cannot store {} in the suite {}: {}", key, suite, stored.error());
  return made;
}

Result<void> PropertyListUserDefaults::store(const std::string& path, const DictionaryFiles::Content& old,
                                             std::string_view key, Value value) {
  if (old.state == DictionaryFiles::State::Unreadable) {
    return platformError(EACCES, "The present content of " + path + " cannot be read and is not replaced");
  }
  if (old.dictionary[key] == value) return {};
  Dictionary changed = old.dictionary;
  changed.set(String(key), std::move(value));
  const Result<Data> bytes = propertylist::serialize(changed, propertylist::Format::Binary);
  if (!bytes) return bytes.error();
  // What the next reader refused would count as garbage, and the suite would begin anew without its old entries.
  if (const Result<Value> readBack = propertylist::parse(*bytes); !readBack) {
    return platformError(static_cast<int>(readBack.error().code()),
                         path + " is not changed, since it could not be read back: " + readBack.error().description());
  }
  if (old.state == DictionaryFiles::State::Garbage && std::rename(path.c_str(), (path + ".corrupt").c_str()) != 0) {
    return errnoError(errno, "Cannot keep the garbage in " + path);
  }
  return fileaccess::replace(path, *bytes, kMode);
}

}  // namespace telvane
