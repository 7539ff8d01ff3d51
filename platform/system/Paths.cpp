#include "platform/system/Paths.h"

#include <pwd.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <string_view>
#include <vector>

namespace telvane {
namespace {

constexpr std::array<std::string_view, 4> kSystemFolders = {"/run", "/etc", "/var", "/tmp/tvnstorage"};
constexpr std::string_view kNoHome = "/nonexistent";
constexpr size_t kUserRecordSize = 16384;

bool isAtOrBelow(std::string_view path, std::string_view folder) {
  return path.starts_with(folder) && (path.size() == folder.size() || path[folder.size()] == '/');
}

std::string absoluteFolder(const std::string& path) {
  std::error_code failure;
  std::string absolute = std::filesystem::absolute(path, failure).string();
  if (failure) absolute = path;
  while (absolute.ends_with('/')) absolute.pop_back();
  return absolute;
}

std::string homeInUserDatabase() {
  passwd record{};
  passwd* found = nullptr;
  std::vector<char> texts(kUserRecordSize);
  const int code = ::getpwuid_r(::getuid(), &record, texts.data(), texts.size(), &found);
  return code == 0 && found != nullptr && found->pw_dir != nullptr ? found->pw_dir : "";
}

bool isInSystemFolder(std::string_view path) {
  for (const std::string_view folder : kSystemFolders) {
    if (isAtOrBelow(path, folder)) return true;
  }
  return false;
}

}  // namespace

Paths Paths::fromEnvironment(const Environment& environment) {
  const std::string home = environment.home ? *environment.home : homeInUserDatabase();
  return {.root = environment.root ? absoluteFolder(*environment.root) : "",
          .home = home.empty() ? "" : absoluteFolder(home)};
}

std::string Paths::resolve(const std::string& path) const {
  if (isAtOrBelow(path, "~")) return (home.empty() ? std::string(kNoHome) : home) + path.substr(1);
  const bool isBelowRootAlready = !root.empty() && isAtOrBelow(path, root);
  if (isBelowRootAlready || !isInSystemFolder(path)) return path;
  return root + path;
}

}  // namespace telvane
