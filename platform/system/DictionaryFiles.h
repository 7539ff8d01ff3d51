#pragma once

#include <map>
#include <string>

#include "foundation/Value.h"
#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/system/FileAccess.h"

namespace telvane {

// Reads property-list files whose root is a dictionary, by real path. Keeps what it read until the file changes. What
// cannot be used counts as an empty dictionary and is reported with one error line per content. Safe from any thread.
class DictionaryFiles {
 public:
  enum class State { Usable, Absent, Garbage, Unreadable };
  struct Content {
    State state = State::Absent;
    Dictionary dictionary;  // empty unless usable
  };

  explicit DictionaryFiles(Log& log) noexcept : _log(log) {}

  // Returns the file's present content.
  Content read(const std::string& path) EXCLUDES(_mutex);
  // The same without trust in what was kept; for whoever holds a lock that keeps others from writing.
  Content readAgain(const std::string& path) EXCLUDES(_mutex);

 private:
  struct Kept {
    fileaccess::Identity identity;
    // Whether a later change is sure to show in the identity: times are coarse and file numbers are used again.
    bool isSettled = false;
    Content content;
  };

  Kept load(const std::string& path) EXCLUDES(_mutex);
  Content parse(const std::string& path, const Data& data) EXCLUDES(_mutex);
  // Writes the error line unless it is the last one of this path for the same content.
  void report(const std::string& path, const std::string& contentMark, const Error& error) EXCLUDES(_mutex);

  Log& _log;
  Mutex _mutex;
  std::map<std::string, Kept> _kept GUARDED_BY(_mutex);
  std::map<std::string, std::string> _reported GUARDED_BY(_mutex);  // mark of the content by path
};

}  // namespace telvane
