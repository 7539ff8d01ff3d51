#include <algorithm>

#include "foundation/ContainerStorage.h"

namespace telvane {

uint32_t DictionaryStorage::find(std::string_view key, uint32_t hash) const noexcept {
  if (index != nullptr) {
    const auto found = index->find(key);
    return found == index->end() ? kNotFound : found->second;
  }
  for (uint32_t position = 0; position < entries.size(); ++position) {
    const DictionaryEntry& entry = entries[position];
    if (entry.hash == hash && entry.key.view() == key) return position;
  }
  return kNotFound;
}

uint32_t DictionaryStorage::find(std::string_view key) const noexcept {
  return find(key, index != nullptr ? 0 : keyHash(key));
}

void DictionaryStorage::append(String key, uint32_t hash, Value value) {
  const auto position = static_cast<uint32_t>(entries.size());
  entries.push_back({std::move(key), hash, std::move(value)});
  if (index != nullptr) {
    index->emplace(entries.back().key.view(), position);
  } else if (entries.size() > kLargestWithoutIndex) {
    index = std::make_unique<DictionaryIndex>();
    for (uint32_t i = 0; i <= position; ++i) index->emplace(entries[i].key.view(), i);
  }
}

void DictionaryStorage::removeAt(std::span<const uint32_t> positions) {
  if (index != nullptr) removeFromIndex(positions);
  size_t kept = positions.front();
  size_t next = 0;
  for (size_t i = kept; i < entries.size(); ++i) {
    if (next < positions.size() && positions[next] == i) {
      ++next;
    } else {
      entries[kept++] = std::move(entries[i]);
    }
  }
  entries.resize(kept);
}

void DictionaryStorage::removeFromIndex(std::span<const uint32_t> positions) {
  const size_t left = entries.size() - positions.size();
  if (left <= kLargestWithoutIndex) {
    index.reset();
    return;
  }
  for (const uint32_t position : positions) index->erase(entries[position].key.view());
  const bool removesTheTail = positions.front() == left;
  if (removesTheTail) return;
  for (auto& [key, position] : *index) {
    const auto before = std::lower_bound(positions.begin(), positions.end(), position);
    position -= static_cast<uint32_t>(before - positions.begin());
  }
}

}  // namespace telvane
