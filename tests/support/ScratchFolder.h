#pragma once

#include <string>
#include <string_view>

namespace telvane::testing {

// A folder of a test's own, which goes with all that is in it.
class ScratchFolder {
 public:
  // Throws std::system_error when it cannot be made.
  ScratchFolder();
  ~ScratchFolder();
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;

  const std::string& path() const noexcept { return _path; }
  // The absolute path of something in the folder, which need not be there.
  std::string at(std::string_view name) const { return _path + "/" + std::string(name); }
  // Writes a file, with the folders above it, and returns its absolute path.
  std::string write(std::string_view name, std::string_view content) const;
  // The content of a file in the folder; empty when there is none.
  std::string read(std::string_view name) const;

 private:
  std::string _path;
};

}  // namespace telvane::testing
