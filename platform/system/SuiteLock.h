#pragma once

#include <string>

#include "foundation/Error.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// Keeps every other process and thread that asks for the same lock file waiting, until it is let go.
class SuiteLock {
 public:
  // Waits for the lock of this file, which is made when it is not there (and stays). Error: errno.
  static Result<SuiteLock> acquire(const std::string& path);
  SuiteLock(SuiteLock&&) noexcept = default;
  SuiteLock& operator=(SuiteLock&&) = delete;
  // Unlocks rather than only closes: a child that was forked meanwhile has the descriptor too.
  ~SuiteLock();

 private:
  explicit SuiteLock(FileDescriptor file) noexcept : _file(std::move(file)) {}
  FileDescriptor _file;
};

}  // namespace telvane
