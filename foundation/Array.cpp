#include <algorithm>
#include <cassert>

#include "foundation/ContainerStorage.h"
#include "foundation/Value.h"

namespace telvane {
namespace {

constexpr size_t kFirstRoom = 4;

}  // namespace

Array::Array(std::initializer_list<Value> values) {
  if (values.size() == 0) return;
  _storage = ArrayStorage::withRoom(values.size());
  _storage->append(values.begin(), values.end());
}

Array::Array(const Array& other) noexcept : _storage(other._storage) {
  if (_storage != nullptr) _storage->count.retain();
}

Array& Array::operator=(const Array& other) noexcept {
  Array copy(other);
  std::swap(_storage, copy._storage);
  return *this;
}

Array& Array::operator=(Array&& other) noexcept {
  Array taken(std::move(other));
  std::swap(_storage, taken._storage);
  return *this;
}

void Array::release(ArrayStorage* storage) noexcept { SharedStorage::release(storage); }

size_t Array::size() const noexcept { return _storage == nullptr ? 0 : _storage->size; }

const Value& Array::operator[](size_t index) const noexcept {
  return index < size() ? _storage->begin()[index] : Value::none();
}

void Array::reserve(size_t count) {
  if (count > 0) writable(count);
}

void Array::append(Value value) { writable(size() + 1).append(std::move(value)); }

void Array::replace(size_t index, Value value) {
  assert(index < size());
  writable(size()).begin()[index] = std::move(value);
}

Value Array::take(size_t index) {
  if (index >= size()) return {};
  return std::exchange(writable(size()).begin()[index], Value());
}

const Value* Array::begin() const noexcept { return _storage == nullptr ? nullptr : _storage->begin(); }

const Value* Array::end() const noexcept { return begin() + size(); }

TELVANE_EXPORT bool operator==(const Array& a, const Array& b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end());
}

ArrayStorage& Array::writable(size_t room) {
  if (_storage == nullptr) {
    _storage = ArrayStorage::withRoom(std::max(room, kFirstRoom));
  } else if (!_storage->count.isUnique()) {
    ArrayStorage* own = ArrayStorage::withRoom(std::max(room, size()));
    own->append(begin(), end());
    release(std::exchange(_storage, own));
  } else if (room > _storage->capacity) {
    _storage = ArrayStorage::grown(_storage, room);
  }
  return *_storage;
}

}  // namespace telvane
