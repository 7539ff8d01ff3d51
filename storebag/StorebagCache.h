#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "foundation/Data.h"
#include "foundation/Date.h"
#include "platform/URLSession.h"
#include "util/ProcessContext.h"

namespace telvane {

// The signed bags on disk (one file per bag name, the envelope as received) and, in the user defaults, how long each
// stays fresh. Callers hold the storebag lock around calls that belong together. A value without state of its own.
class StorebagCache {
 public:
  explicit StorebagCache(const ProcessContext& context) : _context(context) {}

  bool saveStorebagToDisk(std::string_view name, const Data& envelope) const;
  std::optional<Data> loadStorebagFromDisk(std::string_view name) const;
  std::optional<Date> storebagCacheModificationDate(std::string_view name) const;

  // Seconds that the last 200 answer keeps the bag fresh; 0 when there was none.
  int32_t lastLoadedMaxAge(std::string_view name) const;
  // Compares the stored Last-Modified with the given one and puts it in its place. Returns true when they are equal.
  bool updateLastModified(std::string_view name, std::optional<String>& lastModified) const;
  void saveLastLoadedStorebagMetricsWithName(std::string_view name, const URLResponse& response) const;

 private:
  std::string storebagCacheURLForName(std::string_view name) const;
  void setStorageClassProtectionLevel(const std::string& path) const;

  const ProcessContext& _context;
};

}  // namespace telvane
