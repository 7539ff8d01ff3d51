#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "platform/Mutex.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A file that grows at its end. What one call appends stands together, whoever else appends. Safe from any thread.
class AppendFile {
 public:
  // Opens the file, making it (mode 0600) when there is none.
  static Result<std::unique_ptr<AppendFile>> open(const std::string& path);
  // Writes all of it, or returns an error after which a part of it may stand in the file.
  Result<void> append(std::string_view text);

 private:
  explicit AppendFile(FileDescriptor file) : _file(std::move(file)) {}

  Mutex _mutex;
  FileDescriptor _file GUARDED_BY(_mutex);
};

}  // namespace telvane
