#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "foundation/Data.h"
#include "foundation/Date.h"
#include "foundation/Error.h"
#include "platform/AppendableFile.h"
#include "platform/TemporaryFile.h"

namespace telvane {

// Files by path. A path that begins with "~" is in the user's home; every other absolute path of the system (those
// under /run, /etc, /var, /tmp/tvnstorage) is looked up below the instance's root, so that a whole instance can live in
// a scratch folder. Safe from any thread. Errors are of kPlatformErrorDomain with errno as code.
class FileSystem {
 public:
  virtual ~FileSystem() = default;
  // Turns a path as above into the real absolute path of this instance.
  virtual std::string resolve(const std::string& path) const = 0;
  // Reads a whole regular file, at most maximumSize bytes (more is an error, EFBIG).
  virtual Result<Data> read(const std::string& path, uint64_t maximumSize) const = 0;
  // Writes a file so that a reader sees the old or the new content, never a part (temporary file, fsync, rename).
  virtual Result<void> writeAtomically(const std::string& path, const Data& data) = 0;
  virtual Result<void> write(const std::string& path, const Data& data) = 0;
  // Opens a regular file for adding at its end. Never makes one (ENOENT) and never opens what a symbolic link leads to
  // (ELOOP).
  virtual Result<std::unique_ptr<AppendableFile>> openForAppending(const std::string& path) = 0;
  // Makes an empty file that has no name, on the disk that the folder is on; this user alone may read it. The folder is
  // created when it is missing.
  virtual Result<std::unique_ptr<TemporaryFile>> newTemporaryFile(const std::string& folder) = 0;
  // Creates the folder and those above it; fine when it exists.
  virtual Result<void> createDirectory(const std::string& path) = 0;
  virtual Result<void> remove(const std::string& path) = 0;
  virtual std::optional<Date> modificationDate(const std::string& path) const = 0;
  // When the file or folder was made; a symbolic link is not followed. Nothing when there is none, or when the system
  // does not tell.
  virtual std::optional<Date> creationDate(const std::string& path) const = 0;
  // Names of the regular files in the folder itself, in ascending order; symbolic links are left out. What is in its
  // subfolders is not looked at.
  virtual Result<std::vector<std::string>> filesIn(const std::string& path) const = 0;
  // Paths of all regular files below the folder at any depth, relative to it, in ascending order; symbolic links are
  // not followed. A subfolder that this user may not read counts as empty; for the folder itself that is an error.
  virtual Result<std::vector<std::string>> filesBelow(const std::string& path) const = 0;
  // Makes the file or folder readable without the user's key, where the platform protects files by class. A plain
  // success where it does not.
  virtual Result<void> setProtectionNone(const std::string& path) = 0;
};

}  // namespace telvane
