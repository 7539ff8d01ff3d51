#include "platform/KeyedArchive.h"

#include <fmt/format.h>

#include <cerrno>

#include "platform/system/PlatformError.h"

namespace telvane::keyedarchive {
namespace {

constexpr Key kVersionKey{"$version"};
constexpr Key kRoot{"root"};

}  // namespace

Result<Data> archive(const Value& root) {
  if (!root.isPresent()) return platformError(EINVAL, "there is nothing to archive");
  return propertylist::serialize(Dictionary{{kVersionKey, kVersion}, {kRoot, root}}, propertylist::Format::Binary);
}

Result<Value> unarchive(const Data& archive, const propertylist::Limits& limits) {
  const Result<Value> list = propertylist::parse(archive, limits);
  if (list.has_error()) return list;
  const Dictionary* dictionary = list->dictionary();
  if (dictionary == nullptr || !(*dictionary)[kVersionKey].integer().has_value() || !dictionary->contains(kRoot)) {
    return platformError(EINVAL, "this property list is no archive");
  }
  const int64_t version = *(*dictionary)[kVersionKey].integer();
  if (version != kVersion) return platformError(ENOTSUP, fmt::format("the archive is of version {}", version));
  return (*dictionary)[kRoot];
}

}  // namespace telvane::keyedarchive
