#pragma once

#include <memory>
#include <string>

#include "platform/TemporaryFile.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A temporary file on a disk. Where the file system cannot make one without a name, its name is taken away at once.
class UnnamedFile final : public TemporaryFile {
 public:
  // folder: a real path, which is there. Mode 0600. The error's code is errno's value.
  static Result<std::unique_ptr<UnnamedFile>> open(const std::string& folder);

  uint64_t size() const noexcept override { return _size; }
  int64_t read(uint64_t offset, std::span<char> buffer) const override;
  Result<void> append(std::string_view bytes) override;

 private:
  explicit UnnamedFile(FileDescriptor file) : _file(std::move(file)) {}

  const FileDescriptor _file;
  uint64_t _size = 0;
};

}  // namespace telvane
