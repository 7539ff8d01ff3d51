#pragma once

#include <cstdint>
#include <span>

namespace telvane {

// Bytes that a request sends and that are not held in memory. Shared by who made them and the tasks that send them;
// safe from any thread.
class BodyFile {
 public:
  virtual ~BodyFile() = default;
  // How many bytes there are; constant from when they were handed over.
  virtual uint64_t size() const noexcept = 0;
  // Reads up to the buffer's size from the offset, never past size(). Returns the number of bytes, 0 at the end, or -1
  // when reading failed or the file has become shorter.
  virtual int64_t read(uint64_t offset, std::span<char> buffer) const = 0;
};

}  // namespace telvane
