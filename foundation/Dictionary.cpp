#include <algorithm>

#include "foundation/ContainerStorage.h"
#include "foundation/Value.h"

namespace telvane {
namespace {

constexpr size_t kFirstRoom = 8;

}  // namespace

Dictionary::Dictionary(std::initializer_list<DictionaryItem> items) {
  reserve(items.size());
  for (const DictionaryItem& item : items) set(item.key, item.value);
}

Dictionary::Dictionary(const Dictionary& other) noexcept : _storage(other._storage) {
  if (_storage != nullptr) _storage->count.retain();
}

Dictionary& Dictionary::operator=(const Dictionary& other) noexcept {
  Dictionary copy(other);
  std::swap(_storage, copy._storage);
  return *this;
}

Dictionary& Dictionary::operator=(Dictionary&& other) noexcept {
  Dictionary taken(std::move(other));
  std::swap(_storage, taken._storage);
  return *this;
}

void Dictionary::release(DictionaryStorage* storage) noexcept { SharedStorage::release(storage); }

size_t Dictionary::size() const noexcept { return _storage == nullptr ? 0 : _storage->size; }

const Value& Dictionary::operator[](const Key& key) const noexcept {
  const uint32_t position = _storage == nullptr ? DictionaryStorage::kNotFound : _storage->find(key.view(), key.hash());
  return position == DictionaryStorage::kNotFound ? Value::none() : _storage->begin()[position].value;
}

const Value& Dictionary::operator[](std::string_view key) const noexcept {
  const uint32_t position = _storage == nullptr ? DictionaryStorage::kNotFound : _storage->find(key);
  return position == DictionaryStorage::kNotFound ? Value::none() : _storage->begin()[position].value;
}

// What is set is present, so an absent value means that the key is not there.
bool Dictionary::contains(const Key& key) const noexcept { return (*this)[key].isPresent(); }

bool Dictionary::contains(std::string_view key) const noexcept { return (*this)[key].isPresent(); }

void Dictionary::set(const Key& key, Value value) {
  if (!value.isPresent()) {
    remove(key);
  } else if (!replace(key, key.hash(), value)) {
    writable(size() + 1).append(key, key.hash(), std::move(value));
  }
}

void Dictionary::set(const String& key, Value value) {
  const uint32_t hash = keyHash(key);
  if (!value.isPresent()) {
    remove(key);
  } else if (!replace(key, hash, value)) {
    writable(size() + 1).append(key, hash, std::move(value));
  }
}

void Dictionary::set(const char* key, Value value) { set(String(key), std::move(value)); }

bool Dictionary::remove(std::string_view key) {
  const uint32_t position = _storage == nullptr ? DictionaryStorage::kNotFound : _storage->find(key);
  if (position == DictionaryStorage::kNotFound) return false;
  removeAt({&position, 1});
  return true;
}

Value Dictionary::take(const Key& key) {
  const uint32_t position = _storage == nullptr ? DictionaryStorage::kNotFound : _storage->find(key, key.hash());
  if (position == DictionaryStorage::kNotFound) return {};
  Value value = std::move(writable(size()).begin()[position].value);
  _storage->removeAt({&position, 1});
  return value;
}

void Dictionary::addEntriesFrom(const Dictionary& other) {
  if (other.empty() || other._storage == _storage) return;
  if (empty()) {
    *this = other;
    return;
  }
  const Dictionary source(other);
  writable(size() + source.size());
  for (const DictionaryEntry& entry : source) {
    Value value(entry.value);
    if (!replace(entry.key, entry.hash, value)) {
      writable(size() + 1).append(entry.key, entry.hash, std::move(value));
    }
  }
}

void Dictionary::reserve(size_t count) {
  if (count > 0) writable(count);
}

const DictionaryEntry* Dictionary::begin() const noexcept { return _storage == nullptr ? nullptr : _storage->begin(); }

const DictionaryEntry* Dictionary::end() const noexcept { return begin() + size(); }

TELVANE_EXPORT bool operator==(const Dictionary& a, const Dictionary& b) noexcept {
  if (a.size() != b.size()) return false;
  return std::all_of(a.begin(), a.end(), [&b](const DictionaryEntry& entry) {
    const uint32_t position = b._storage->find(entry.key, entry.hash);
    return position != DictionaryStorage::kNotFound && b._storage->begin()[position].value == entry.value;
  });
}

bool Dictionary::replace(std::string_view key, uint32_t hash, Value& value) {
  const uint32_t position = _storage == nullptr ? DictionaryStorage::kNotFound : _storage->find(key, hash);
  if (position == DictionaryStorage::kNotFound) return false;
  writable(size()).begin()[position].value = std::move(value);
  return true;
}

DictionaryStorage& Dictionary::writable(size_t room) {
  if (_storage == nullptr) {
    _storage = DictionaryStorage::withRoom(std::max(room, kFirstRoom));
  } else if (!_storage->count.isUnique()) {
    release(std::exchange(_storage, _storage->copy(room)));
  } else if (room > _storage->capacity) {
    _storage = DictionaryStorage::grown(_storage, room);
  }
  return *_storage;
}

void Dictionary::removeAt(std::span<const uint32_t> positions) { writable(size()).removeAt(positions); }

}  // namespace telvane
