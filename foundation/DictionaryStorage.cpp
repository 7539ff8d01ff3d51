#include <algorithm>

#include "foundation/ContainerStorage.h"

namespace telvane {

DictionaryStorage* DictionaryStorage::copy(size_t room) const {
  DictionaryStorage* copy = withRoom(std::max<size_t>(room, size));
  copy->ElementStorage::append(begin(), end());
  copy->marks = marks;
  if (index != nullptr) copy->index = std::make_unique<DictionaryIndex>(*index);
  return copy;
}

uint32_t DictionaryStorage::find(std::string_view key, uint32_t hash) const noexcept {
  if (index != nullptr) {
    const auto found = index->find(key);
    return found == index->end() ? kNotFound : found->second;
  }
  if ((marks & mark(hash)) == 0) return kNotFound;
  const DictionaryEntry* entries = begin();
  for (uint32_t position = 0; position < size; ++position) {
    if (entries[position].hash == hash && entries[position].key.view() == key) return position;
  }
  return kNotFound;
}

uint32_t DictionaryStorage::find(std::string_view key) const noexcept {
  return find(key, index != nullptr ? 0 : keyHash(key));
}

void DictionaryStorage::append(String key, uint32_t hash, Value value) {
  const uint32_t position = size;
  const DictionaryEntry& added = ElementStorage::append({std::move(key), hash, std::move(value)});
  marks |= mark(hash);
  if (index != nullptr) {
    index->emplace(added.key.view(), position);
  } else if (size > kLargestWithoutIndex) {
    index = std::make_unique<DictionaryIndex>();
    for (uint32_t i = 0; i <= position; ++i) index->emplace(begin()[i].key.view(), i);
  }
}

void DictionaryStorage::removeAt(std::span<const uint32_t> positions) {
  if (index != nullptr) removeFromIndex(positions);
  DictionaryEntry* entries = begin();
  uint32_t kept = positions.front();
  size_t next = 0;
  for (uint32_t i = kept; i < size; ++i) {
    if (next < positions.size() && positions[next] == i) {
      ++next;
    } else {
      entries[kept++] = std::move(entries[i]);
    }
  }
  truncate(kept);
}

void DictionaryStorage::removeFromIndex(std::span<const uint32_t> positions) {
  const size_t left = size - positions.size();
  if (left <= kLargestWithoutIndex) {
    index.reset();
    return;
  }
  for (const uint32_t position : positions) index->erase(begin()[position].key.view());
  const bool removesTheTail = positions.front() == left;
  if (removesTheTail) return;
  for (auto& [key, position] : *index) {
    const auto before = std::lower_bound(positions.begin(), positions.end(), position);
    position -= static_cast<uint32_t>(before - positions.begin());
  }
}

}  // namespace telvane
