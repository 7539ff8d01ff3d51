#include "platform/system/DictionaryFiles.h"

#include <time.h>

#include <algorithm>
#include <cerrno>
#include <span>

#include "platform/Crypto.h"
#include "platform/PropertyList.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

constexpr uint64_t kLargestFile = 16u << 20;
constexpr size_t kMostFilesKept = 64;           // names can come from outside; the rest is read anew
constexpr int64_t kSettlingTime = 100'000'000;  // nanoseconds, far above the step of a file's times

int64_t nanosecondsNow() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  return int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

bool isSettled(const fileaccess::Identity& identity) {
  return nanosecondsNow() - std::max(identity.modified, identity.changed) > kSettlingTime;
}

}  // namespace

DictionaryFiles::Content DictionaryFiles::read(const std::string& path) {
  const fileaccess::Identity identity = fileaccess::identityOf(path);
  {
    const MutexLock lock(_mutex);
    const auto kept = _kept.find(path);
    if (kept != _kept.end() && kept->second.isSettled && kept->second.identity == identity) return kept->second.content;
  }
  return readAgain(path);
}

DictionaryFiles::Content DictionaryFiles::readAgain(const std::string& path) {
  Kept loaded = load(path);
  const Content content = loaded.content;
  const MutexLock lock(_mutex);
  if (_kept.size() >= kMostFilesKept && _kept.count(path) == 0) _kept.clear();
  _kept[path] = std::move(loaded);
  return content;
}

DictionaryFiles::Kept DictionaryFiles::load(const std::string& path) {
  const Result<fileaccess::Content> file = fileaccess::read(path, kLargestFile);
  if (file) return {file->identity, isSettled(file->identity), parse(path, file->data)};
  const int64_t code = file.error().code();
  if (code == ENOENT || code == ENOTDIR) return {{}, true, {State::Absent, {}}};
  report(path, std::to_string(code), file.error());
  return {{}, false, {code == EFBIG ? State::Garbage : State::Unreadable, {}}};
}

DictionaryFiles::Content DictionaryFiles::parse(const std::string& path, const Data& data) {
  const Result<Value> value = propertylist::parse(data);
  if (value && value->isDictionary()) return {State::Usable, *value->dictionary()};
  const auto digest = crypto::sha256(std::span(data.bytes(), data.size()));
  report(path, crypto::lowercaseHex(digest),
         value ? platformError(EINVAL, "Its root is no dictionary") : value.error());
  return {State::Garbage, {}};
}

void DictionaryFiles::report(const std::string& path, const std::string& contentMark, const Error& error) {
  {
    const MutexLock lock(_mutex);
    if (_reported.size() >= kMostFilesKept) _reported.clear();
    std::string& last = _reported[path];
    if (last == contentMark) return;
    last = contentMark;
  }
  _log.error("The file {} counts as empty: {}", path, error);
}

}  // namespace telvane
