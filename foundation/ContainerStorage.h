#pragma once

#include <algorithm>
#include <cstdint>
#include <limits>
#include <map>
#include <memory>
#include <new>
#include <span>
#include <stdexcept>
#include <string_view>
#include <type_traits>
#include <utility>

#include "foundation/SharedCount.h"
#include "foundation/Value.h"

// The shared insides of Array and Dictionary; only their sources read this.
namespace telvane {

// What both have in common: their owners, how many elements there are, and the way to free them.
struct SharedStorage {
  SharedStorage(Value::Kind kindOfContainer, uint32_t room) noexcept : capacity(room), kind(kindOfContainer) {}

  // Takes one owner away and frees the storage with the last one; with it go the containers inside that have no other
  // owner, one after the other rather than one within the other, so that no depth overflows the stack.
  static void release(SharedStorage* storage) noexcept;

  SharedCount count;
  uint32_t size = 0;
  const uint32_t capacity;
  const Value::Kind kind;

 private:
  static void releaseContent(Value& value, SharedStorage*& unowned) noexcept;
  static void freeOne(SharedStorage* storage, SharedStorage*& unowned) noexcept;

  SharedStorage* _next = nullptr;  // links what waits to be freed
};

// A storage whose elements stand right behind its head, so that a container costs one allocation. Storage is the class
// that derives from this.
template <class Storage, class Element>
struct ElementStorage : SharedStorage {
  using SharedStorage::SharedStorage;

  // Returns storage without elements, with room for so many.
  static Storage* withRoom(size_t room) {
    static_assert(sizeof(Storage) % alignof(Element) == 0 && std::is_nothrow_move_constructible_v<Element>);
    if (room > std::numeric_limits<uint32_t>::max())
      throw std::length_error("a container holds at most 2^32 - 1 elements");
    void* place = ::operator new(sizeof(Storage) + room * sizeof(Element));
    return new (place) Storage(static_cast<uint32_t>(room));
  }
  // Returns storage with more room and the elements of the old one, which goes. REQUIRES: a sole owner.
  static Storage* grown(Storage* old, size_t room) {
    Storage* storage = withRoom(std::max(room, std::min<size_t>(size_t{2} * old->capacity, UINT32_MAX)));
    std::uninitialized_move(old->begin(), old->end(), storage->begin());
    storage->size = old->size;
    storage->takeHeadOf(*old);
    old->truncate(0);
    free(old);
    return storage;
  }
  // REQUIRES: no elements.
  static void free(Storage* storage) noexcept {
    storage->~Storage();
    ::operator delete(storage);
  }

  Element* begin() noexcept { return reinterpret_cast<Element*>(static_cast<Storage*>(this) + 1); }
  Element* end() noexcept { return begin() + size; }
  const Element* begin() const noexcept {
    return reinterpret_cast<const Element*>(static_cast<const Storage*>(this) + 1);
  }
  const Element* end() const noexcept { return begin() + size; }

  // REQUIRES: room for one more.
  Element& append(Element element) noexcept {
    Element* added = std::construct_at(end(), std::move(element));
    ++size;
    return *added;
  }
  // REQUIRES: room for them.
  void append(const Element* first, const Element* last) {
    std::uninitialized_copy(first, last, end());
    size += static_cast<uint32_t>(last - first);
  }
  // Keeps the first elements only.
  void truncate(uint32_t kept) noexcept {
    std::destroy(begin() + kept, end());
    size = kept;
  }
};

struct ArrayStorage : ElementStorage<ArrayStorage, Value> {
  explicit ArrayStorage(uint32_t room) noexcept : ElementStorage(Value::Kind::Array, room) {}
  void takeHeadOf(ArrayStorage&) noexcept {}
};

// A search tree rather than a hash table: keys come from outside, and no choice of keys makes a tree slow. The views
// are of the entries' own keys, whose bytes stay where they are when a key is moved or shared.
using DictionaryIndex = std::map<std::string_view, uint32_t>;

struct DictionaryStorage : ElementStorage<DictionaryStorage, DictionaryEntry> {
  explicit DictionaryStorage(uint32_t room) noexcept : ElementStorage(Value::Kind::Dictionary, room) {}

  // Up to this many entries a scan over the hashes is faster than the tree.
  static constexpr size_t kLargestWithoutIndex = 64;
  static constexpr uint32_t kNotFound = UINT32_MAX;

  // Returns an own storage with the same entries and room for so many.
  DictionaryStorage* copy(size_t room) const;
  // Returns the key's position among the entries, or kNotFound.
  uint32_t find(std::string_view key, uint32_t hash) const noexcept;
  uint32_t find(std::string_view key) const noexcept;
  // REQUIRES: the key is not there, and there is room.
  void append(String key, uint32_t hash, Value value);
  // Removes the entries at these ascending positions; the order of the others stays.
  void removeAt(std::span<const uint32_t> positions);

  // What moves over beside the entries when storage grows.
  void takeHeadOf(DictionaryStorage& old) noexcept {
    marks = old.marks;
    index = std::move(old.index);
  }

  // One bit for each hash that was ever set: most keys that are not there are told so by one look.
  uint64_t marks = 0;
  std::unique_ptr<DictionaryIndex> index;  // null up to kLargestWithoutIndex

 private:
  static uint64_t mark(uint32_t hash) noexcept { return uint64_t{1} << (hash & 63); }
  void removeFromIndex(std::span<const uint32_t> positions);
};

}  // namespace telvane
