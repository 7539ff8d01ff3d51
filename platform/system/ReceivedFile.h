#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A file that arrives piece by piece: hidden in its folder until it is whole, then there under a name that was free, so
// whoever looks into the folder finds whole files only, and none is ever overwritten. What was not kept goes with the
// object. Used by one thread at a time. Errors are of kPlatformErrorDomain with errno as code.
class ReceivedFile {
 public:
  // folder: a real path, made when it is missing. Mode 0600.
  static Result<std::unique_ptr<ReceivedFile>> begin(const std::string& folder);
  ~ReceivedFile();
  ReceivedFile(const ReceivedFile&) = delete;
  ReceivedFile& operator=(const ReceivedFile&) = delete;

  Result<void> append(std::string_view bytes);
  uint64_t size() const noexcept { return _size; }
  // Writes it to the disk for good and gives it the name, or "2-NAME", "3-NAME"… when that is taken, and returns which.
  // REQUIRES: the name has no '/'.
  Result<std::string> keepAs(const std::string& name);

 private:
  ReceivedFile(std::string folder, std::string hiddenPath, FileDescriptor file)
      : _folder(std::move(folder)), _hiddenPath(std::move(hiddenPath)), _file(std::move(file)) {}

  // Makes the folder's new entry last, too.
  Result<std::string> settled(std::string name) const;

  const std::string _folder;
  const std::string _hiddenPath;
  const FileDescriptor _file;
  uint64_t _size = 0;
};

}  // namespace telvane
