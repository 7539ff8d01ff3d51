#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>

#include "foundation/Error.h"

namespace telvane {

// A file that is sent as a body: held open, so that it may be removed meanwhile, and as large as it was when it was
// opened. Owned by its task; read by one thread at a time.
class UploadFile {
 public:
  // Opens a regular file. The error's code is errno's value.
  static Result<std::unique_ptr<UploadFile>> open(const std::string& path);
  ~UploadFile();
  UploadFile(const UploadFile&) = delete;
  UploadFile& operator=(const UploadFile&) = delete;

  uint64_t size() const noexcept { return _size; }
  // Reads up to the buffer's size from the offset, never past size(). Returns the number of bytes, 0 at the end, or -1
  // when reading failed or the file has become shorter.
  int64_t read(uint64_t offset, std::span<char> buffer) const;

 private:
  UploadFile(int descriptor, uint64_t size) : _descriptor(descriptor), _size(size) {}

  const int _descriptor;
  const uint64_t _size;
};

}  // namespace telvane
