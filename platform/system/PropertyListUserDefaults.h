#pragma once

#include <string>

#include "platform/Log.h"
#include "platform/UserDefaults.h"
#include "platform/system/DictionaryFiles.h"
#include "platform/system/Paths.h"

namespace telvane {

// User defaults as binary property lists: ~/Library/Preferences/<suite>.plist, and below the root
// /etc/telvane/defaults/<suite>.plist for what the user has not set.
//
// Writers take turns through a lock on the file .<suite>.lock beside the list, read the list anew, and put a new file
// in its place. A list that was garbage is kept as <suite>.plist.corrupt when the first write replaces it; one that
// cannot be read is not replaced, the write fails. So does one of what could not be read back, such as more than
// 16 MiB: the list stays as it is.
//
// A suite's name is 1 to 200 bytes without a slash, a null character, or a dot in front: any other is an empty suite
// that cannot be written (EINVAL).
class PropertyListUserDefaults final : public UserDefaults {
 public:
  PropertyListUserDefaults(Paths paths, Log& log) : _paths(std::move(paths)), _log(log), _files(log) {}

  Value objectForKey(std::string_view suite, std::string_view key) const override;
  Dictionary dictionaryRepresentation(std::string_view suite) const override;
  // Waits while another process writes the suite.
  Result<void> setObject(std::string_view suite, std::string_view key, Value value) override;
  // Calls make() with the suite's lock held: it must not come back to this suite.
  Value objectForKeyOrStore(std::string_view suite, std::string_view key, UniqueFunction<Value()> make) override;

 private:
  std::string userPath(std::string_view suite) const;
  std::string systemPath(std::string_view suite) const;
  // REQUIRES: the caller holds the suite's lock.
  Result<void> store(const std::string& path, const DictionaryFiles::Content& old, std::string_view key, Value value);

  const Paths _paths;
  Log& _log;
  mutable DictionaryFiles _files;  // what it keeps shows in nothing but speed
};

}  // namespace telvane
