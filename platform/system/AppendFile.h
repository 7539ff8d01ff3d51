#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/AppendableFile.h"
#include "platform/Mutex.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// A file that grows at its end. What one call appends stands together, whoever else appends. Safe from any thread.
class AppendFile final : public AppendableFile {
 public:
  // Opens the file, making it (mode 0600) when there is none.
  static Result<std::unique_ptr<AppendFile>> open(const std::string& path);
  // Opens a regular file that is there, never through a symbolic link (ELOOP).
  static Result<std::unique_ptr<AppendFile>> openExisting(const std::string& path);
  Result<void> append(std::string_view text) override;

 private:
  explicit AppendFile(FileDescriptor file) : _file(std::move(file)) {}
  // Cuts off the last bytes, where they are the last that anybody has added.
  void takeBack(size_t size) REQUIRES(_mutex);

  Mutex _mutex;
  FileDescriptor _file GUARDED_BY(_mutex);
};

}  // namespace telvane
