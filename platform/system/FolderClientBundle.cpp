#include "platform/system/FolderClientBundle.h"

namespace telvane {
namespace {

constexpr Key kVersion{"CFBundleVersion"};
constexpr uint64_t kLargestKey = 64u << 10;

}  // namespace

std::string FolderClientBundle::folderFor(const Environment& environment, const Paths& paths) {
  return environment.bundle ? *environment.bundle : paths.belowRoot(TELVANE_INSTALLED_BUNDLE);
}

std::optional<String> FolderClientBundle::version() const {
  const Value version = _files.read(_folder + "/Info.plist").dictionary[kVersion];
  if (const String* text = version.string()) return *text;
  if (version.isPresent() && !_isWrongTypeReported.exchange(true)) {
    _log.error("{} in {}/Info.plist is no text: it counts as absent", kVersion, _folder);
  }
  return std::nullopt;
}

std::optional<Data> FolderClientBundle::publicKey() const {
  Result<fileaccess::Content> file = fileaccess::read(_folder + "/publicKey.der", kLargestKey);
  const int64_t code = file ? 0 : file.error().code();
  const bool isNews = _reportedKeyFailure.exchange(code) != code;
  if (file) return std::move(file->data);
  if (isNews) _log.error("No configuration can be verified: {}", file.error());
  return std::nullopt;
}

}  // namespace telvane
