#include "daemon/HierarchySharedData.h"

#include <algorithm>

namespace telvane {
namespace {

constexpr int64_t kMoreThanFits = HierarchySharedData::kMaximumBytes + 1;

int64_t boundedSize(std::string_view key, const Value& value);

// Both end as soon as it is known that the value does not fit: it may be as large as a message, and the lock is held.
int64_t boundedSize(const Value& value) {
  int64_t bytes = sizeof(Value) + static_cast<int64_t>(value.text().size());
  if (const Data* data = value.data()) bytes += static_cast<int64_t>(data->size());
  if (const Array* array = value.array()) {
    for (auto each = array->begin(); each != array->end() && bytes < kMoreThanFits; ++each) bytes += boundedSize(*each);
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    for (auto each = dictionary->begin(); each != dictionary->end() && bytes < kMoreThanFits; ++each) {
      bytes += boundedSize(each->key.view(), each->value);
    }
  }
  return std::min(bytes, kMoreThanFits);
}

int64_t boundedSize(std::string_view key, const Value& value) {
  return static_cast<int64_t>(sizeof(String) + key.size()) + boundedSize(value);
}

}  // namespace

HierarchySharedData::Addition HierarchySharedData::addEntriesFrom(const Dictionary& entries) {
  const int64_t growth = growthBy(entries);
  if (_bytes + growth > kMaximumBytes) {
    const bool isAgain = _hasRefused;
    _hasRefused = true;
    return isAgain ? Addition::RefusedAgain : Addition::Refused;
  }
  _entries.addEntriesFrom(entries);
  _bytes += growth;
  _hasRefused = false;
  return Addition::Taken;
}

int64_t HierarchySharedData::growthBy(const Dictionary& entries) const {
  int64_t growth = 0;
  for (const DictionaryEntry& entry : entries) {
    growth += boundedSize(entry.key.view(), entry.value);
    const Value& replaced = _entries[entry.key.view()];
    if (replaced.isPresent()) growth -= boundedSize(entry.key.view(), replaced);
    // What is still to come can take away no more than there is.
    if (growth > 2 * kMaximumBytes) break;
  }
  return growth;
}

void HierarchySharedData::remove(const String& key) {
  const Value& removed = _entries[key.view()];
  if (!removed.isPresent()) return;
  _bytes -= boundedSize(key.view(), removed);
  _entries.remove(key);
}

}  // namespace telvane
