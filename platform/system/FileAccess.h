#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "platform/system/FileDescriptor.h"

// Whole files by real path, for the classes of this folder. Errors are of kPlatformErrorDomain with errno as code.
namespace telvane::fileaccess {

// What tells one content of a path from the next without reading it.
struct Identity {
  uint64_t device = 0;
  uint64_t node = 0;
  int64_t size = -1;
  int64_t modified = 0;  // nanoseconds since 1970
  int64_t changed = 0;
  friend bool operator==(const Identity&, const Identity&) = default;
};

struct Content {
  Data data;
  Identity identity;
};

// Returns the identity of the file, or of its absence.
Identity identityOf(const std::string& path) noexcept;
// Reads a regular file (never blocks on a pipe). More than maximumSize bytes: EFBIG.
Result<Content> read(const std::string& path, uint64_t maximumSize);
// Writes into a new file beside the path, makes it durable, and puts it in the path's place; leaves nothing behind when
// that fails. mode: for the new file, before the process's mask.
Result<void> replace(const std::string& path, const Data& data, mode_t mode);
// Writes over the file or makes it.
Result<void> overwrite(const std::string& path, const Data& data, mode_t mode);
// Opens a new file that has no name, to be read and written, mode 0600; it goes with its last descriptor, whatever ends
// the process. EOPNOTSUPP where the folder's file system has no such files.
Result<FileDescriptor> openWithoutName(const std::string& folder);
// Creates the folder and those above it.
Result<void> createDirectory(const std::string& path);

}  // namespace telvane::fileaccess
