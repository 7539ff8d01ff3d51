#include "storebag/StorebagCache.h"

#include "interfaces/DefaultsKeys.h"

namespace telvane {
namespace {

constexpr char kDaemonCacheFolder[] = "~/Library/Caches/telvaned";
constexpr char kStorebagFolder[] = "~/Library/Caches/telvaned/storebags";
constexpr uint64_t kMaximumEnvelopeSize = 16u << 20;
constexpr int32_t kDefaultMaxAge = 86400;
constexpr char kMaxAgeMetric[] = "max-age";
constexpr char kLastModifiedMetric[] = "Last-Modified";
constexpr char kProtectionAttribute[] = "{\n    NSFileProtectionKey = NSFileProtectionNone;\n}";

std::string cachedMetricKey(std::string_view name, std::string_view metric) {
  return fmt::format("CACHED_{}_{}", name, metric);
}

// The number behind "max-age" among the header's pieces, split at every "=" and every blank.
int32_t maxAgeOfCacheControl(const std::string* header) {
  if (header == nullptr) return kDefaultMaxAge;
  std::string_view rest = *header;
  bool isNext = false;
  for (;;) {
    const size_t end = rest.find_first_of("= ");
    const std::string_view piece = rest.substr(0, end);
    if (isNext) return Value(piece).int32Value();
    isNext = piece == kMaxAgeMetric;
    if (end == std::string_view::npos) return kDefaultMaxAge;
    rest.remove_prefix(end + 1);
  }
}

}  // namespace

std::string StorebagCache::storebagCacheURLForName(std::string_view name) const {
  // A folder that cannot be made shows itself when the file is read or written.
  static_cast<void>(_context.platform().files.createDirectory(kStorebagFolder).has_value());
  return fmt::format("{}/{}", kStorebagFolder, name);
}

bool StorebagCache::saveStorebagToDisk(std::string_view name, const Data& envelope) const {
  FileSystem& files = _context.platform().files;
  const std::string path = storebagCacheURLForName(name);
  const Result<void> written = files.writeAtomically(path, envelope);
  if (written.has_value()) return true;
  _context.log().error("saveStorebagToDisk: could not save storebag '{}' to file 'file://{}'. Error is '{}'", name,
                       files.resolve(path), written.error());
  return false;
}

std::optional<Data> StorebagCache::loadStorebagFromDisk(std::string_view name) const {
  FileSystem& files = _context.platform().files;
  const std::string path = storebagCacheURLForName(name);
  if (_context.isInternalBuild()) {
    setStorageClassProtectionLevel(files.resolve(kDaemonCacheFolder));
    setStorageClassProtectionLevel(files.resolve(kStorebagFolder));
    setStorageClassProtectionLevel(files.resolve(path));
  }
  Result<Data> data = files.read(path, kMaximumEnvelopeSize);
  if (data.has_value()) return std::move(*data);
  _context.log().error("loadStorebagFromDisk: could not load storebag '{}' from file 'file://{}'. Error is '{}'", name,
                       files.resolve(path), data.error());
  return std::nullopt;
}

void StorebagCache::setStorageClassProtectionLevel(const std::string& path) const {
  const Result<void> done = _context.platform().files.setProtectionNone(path);
  if (done.has_value()) return;
  _context.log().error("setStorageClassProtectionLevel: could not set attribute {} to file '{}'. Error is '{}'",
                       kProtectionAttribute, path, done.error());
}

std::optional<Date> StorebagCache::storebagCacheModificationDate(std::string_view name) const {
  return _context.platform().files.modificationDate(storebagCacheURLForName(name));
}

int32_t StorebagCache::lastLoadedMaxAge(std::string_view name) const {
  const int32_t maxAge = _context.platform()
                             .userDefaults.objectForKey(kTelvaneDefaultsSuite, cachedMetricKey(name, kMaxAgeMetric))
                             .int32Value();
  _context.log().message("getLastLoadedStorebagMetricsWithName: maxAge is {} for storebag {}", maxAge, name);
  return maxAge;
}

bool StorebagCache::updateLastModified(std::string_view name, std::optional<String>& lastModified) const {
  const Value stored =
      _context.platform().userDefaults.objectForKey(kTelvaneDefaultsSuite, cachedMetricKey(name, kLastModifiedMetric));
  if (!stored.isString()) return false;
  if (lastModified.has_value() && *lastModified == *stored.string()) {
    _context.log().message(
        "getLastLoadedStorebagMetricsWithName: 'Last-Modified' has not changed for storebag '{}': '{}'", name, stored);
    return true;
  }
  lastModified = *stored.string();
  _context.log().message("getLastLoadedStorebagMetricsWithName: 'Last-Modified' has changed to '{}' for storebag '{}'",
                         stored, name);
  return false;
}

void StorebagCache::saveLastLoadedStorebagMetricsWithName(std::string_view name, const URLResponse& response) const {
  UserDefaults& defaults = _context.platform().userDefaults;
  const int32_t maxAge = maxAgeOfCacheControl(response.header("Cache-Control"));
  const std::string* lastModified = response.header("Last-Modified");
  const Value lastModifiedValue = lastModified != nullptr ? Value(*lastModified) : Value();
  for (const auto& [metric, value] : {std::pair<const char*, Value>{kMaxAgeMetric, Value(maxAge)},
                                      std::pair<const char*, Value>{kLastModifiedMetric, lastModifiedValue}}) {
    const Result<void> stored = defaults.setObject(kTelvaneDefaultsSuite, cachedMetricKey(name, metric), value);
    if (stored.has_error()) {
      _context.log().error("saveLastLoadedStorebagMetricsWithName: could not store {} of storebag '{}': {}", metric,
                           name, stored.error());
    }
  }
  _context.log().message(
      "saveLastLoadedStorebagMetricsWithName: New storebag '{}' received: maxAge {}, Last-Modified '{}'", name, maxAge,
      lastModifiedValue);
}

}  // namespace telvane
