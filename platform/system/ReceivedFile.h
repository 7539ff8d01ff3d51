#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A file that arrives piece by piece: without a name until it is whole, then there under one that was free, so whoever
// looks into the folder finds whole files only, and none is ever overwritten. What was not kept goes with the object,
// and with the process however that ends. Used by one thread at a time. Errors are of kPlatformErrorDomain with errno
// as code.
class ReceivedFile {
 public:
  // folder: a real path, made when it is missing. Mode 0600.
  static Result<std::unique_ptr<ReceivedFile>> begin(const std::string& folder);
  // What begin does where the file system has no files without a name: the file is called ".receiving-…" until it is
  // whole, and one of those stays when the process is killed. REQUIRES: the folder is there.
  static Result<std::unique_ptr<ReceivedFile>> beginUnderHiddenName(const std::string& folder);
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

  // Gives the file this name; errno on failure.
  int link(const std::string& path) const;
  // Makes the folder's new entry last, too.
  Result<std::string> settled(std::string name) const;

  const std::string _folder;
  const std::string _hiddenPath;  // empty while it has none
  const FileDescriptor _file;
  uint64_t _size = 0;
};

}  // namespace telvane
