#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "foundation/ExtensionToken.h"

namespace telvane {

// The right to read one file that another process handed over, from its consumption until it is let go of. Everything
// is read through the descriptor that came with it, so what happens to the path meanwhile changes nothing about what is
// read, and a descriptor that gives no right to read (one opened for its path alone, or for writing) gives none here.
// Owned by who consumed the token; used by one thread at a time.
class SandboxExtension {
 public:
  virtual ~SandboxExtension() = default;
  // Whether the path names, at this moment and itself (not as a symbolic link), the file that the token stands for, and
  // this is a regular file.
  virtual bool isRegularFile() const = 0;
  // How many bytes the file has at this moment.
  virtual Result<uint64_t> size() const = 0;
  // Reads up to length bytes from the offset on; fewer only at the file's end. REQUIRES: the buffer has that room.
  virtual Result<size_t> readAt(uint64_t offset, char* buffer, size_t length) const = 0;
  // Deletes the file by its path, if that still names this file and who handed the token over could have deleted it.
  // Whatever is in doubt stays; the error says what was.
  virtual Result<void> removeFile() = 0;
};

// Consumes the tokens that clients hand over. Safe from any thread.
class SandboxExtensions {
 public:
  virtual ~SandboxExtensions() = default;
  // path: absolute and without symbolic links in its folders, as the client knows it; it is looked up as it is, not
  // below the instance's root. The descriptor of the token is borrowed until the extension is let go of.
  // Returns null for a token without a descriptor.
  virtual std::unique_ptr<SandboxExtension> consume(const std::string& path, const ExtensionToken& token) = 0;
};

}  // namespace telvane
