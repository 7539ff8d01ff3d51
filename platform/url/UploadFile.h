#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>

#include "foundation/Error.h"
#include "platform/BodyFile.h"

namespace telvane {

// A file that is sent as a body: held open, so that it may be removed meanwhile, and as large as it was when it was
// opened. Shared by its tasks; safe from any thread.
class UploadFile final : public BodyFile {
 public:
  // Opens a regular file. The error's code is errno's value.
  static Result<std::unique_ptr<UploadFile>> open(const std::string& path);
  ~UploadFile() override;
  UploadFile(const UploadFile&) = delete;
  UploadFile& operator=(const UploadFile&) = delete;

  uint64_t size() const noexcept override { return _size; }
  int64_t read(uint64_t offset, std::span<char> buffer) const override;

 private:
  UploadFile(int descriptor, uint64_t size) : _descriptor(descriptor), _size(size) {}

  const int _descriptor;
  const uint64_t _size;
};

}  // namespace telvane
