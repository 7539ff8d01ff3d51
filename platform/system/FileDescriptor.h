#pragma once

#include <utility>

namespace telvane {

// Owns an open file descriptor.
class FileDescriptor {
 public:
  FileDescriptor() noexcept = default;
  explicit FileDescriptor(int fd) noexcept : _fd(fd) {}
  FileDescriptor(FileDescriptor&& other) noexcept : _fd(std::exchange(other._fd, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept;
  ~FileDescriptor();

  int get() const noexcept { return _fd; }
  bool isOpen() const noexcept { return _fd >= 0; }

 private:
  int _fd = -1;
};

}  // namespace telvane
