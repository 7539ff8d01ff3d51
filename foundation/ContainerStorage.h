#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <span>
#include <string_view>
#include <vector>

#include "foundation/SharedCount.h"
#include "foundation/Value.h"

// The shared insides of Array and Dictionary; only their sources read this.
namespace telvane {

// What both have in common: their owners, and the way to free them.
struct SharedStorage {
  explicit SharedStorage(Value::Kind kindOfContainer) noexcept : kind(kindOfContainer) {}

  // Takes one owner away and frees the storage with the last one; with it go the containers inside that have no other
  // owner, one after the other rather than one within the other, so that no depth overflows the stack.
  static void release(SharedStorage* storage) noexcept;

  SharedCount count;
  const Value::Kind kind;

 private:
  static void releaseContent(Value& value, SharedStorage*& unowned) noexcept;
  static void freeOne(SharedStorage* storage, SharedStorage*& unowned) noexcept;

  SharedStorage* _next = nullptr;  // links what waits to be freed
};

struct ArrayStorage : SharedStorage {
  ArrayStorage() noexcept : SharedStorage(Value::Kind::Array) {}

  std::vector<Value> values;
};

// A search tree rather than a hash table: keys come from outside, and no choice of keys makes a tree slow. The views
// are of the entries' own keys, whose bytes stay where they are when a key is moved or shared.
using DictionaryIndex = std::map<std::string_view, uint32_t>;

struct DictionaryStorage : SharedStorage {
  DictionaryStorage() noexcept : SharedStorage(Value::Kind::Dictionary) {}

  // Up to this many entries a scan over the hashes is faster than the tree.
  static constexpr size_t kLargestWithoutIndex = 64;
  static constexpr uint32_t kNotFound = UINT32_MAX;

  // Returns the key's position in entries, or kNotFound.
  uint32_t find(std::string_view key, uint32_t hash) const noexcept;
  uint32_t find(std::string_view key) const noexcept;
  // REQUIRES: the key is not there.
  void append(String key, uint32_t hash, Value value);
  // Removes the entries at these ascending positions; the order of the others stays.
  void removeAt(std::span<const uint32_t> positions);

  std::vector<DictionaryEntry> entries;
  std::unique_ptr<DictionaryIndex> index;  // null up to kLargestWithoutIndex

 private:
  void removeFromIndex(std::span<const uint32_t> positions);
};

}  // namespace telvane
