#include "tests/support/ScratchFolder.h"

#include <stdlib.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <system_error>

namespace telvane::testing {

ScratchFolder::ScratchFolder() : _path((std::filesystem::temp_directory_path() / "telvane-test-XXXXXX").string()) {
  if (mkdtemp(_path.data()) == nullptr) throw std::system_error(errno, std::generic_category(), _path);
}

ScratchFolder::~ScratchFolder() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

std::string ScratchFolder::write(std::string_view name, std::string_view content) const {
  const std::string path = at(name);
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file.write(content.data(), static_cast<std::streamsize>(content.size()));
  if (!file.flush()) throw std::system_error(errno, std::generic_category(), path);
  return path;
}

std::string ScratchFolder::read(std::string_view name) const {
  std::ifstream file(at(name), std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

}  // namespace telvane::testing
