#include <utility>

#include "foundation/ContainerStorage.h"

namespace telvane {

void SharedStorage::release(SharedStorage* storage) noexcept {
  if (!storage->count.release()) return;
  SharedStorage* unowned = storage;
  while (unowned != nullptr) {
    SharedStorage* next = std::exchange(unowned, unowned->_next);
    freeOne(next, unowned);
  }
}

void SharedStorage::freeOne(SharedStorage* storage, SharedStorage*& unowned) noexcept {
  if (storage->kind == Value::Kind::Array) {
    auto* array = static_cast<ArrayStorage*>(storage);
    for (Value& value : *array) releaseContent(value, unowned);
    array->truncate(0);
    ArrayStorage::free(array);
  } else {
    auto* dictionary = static_cast<DictionaryStorage*>(storage);
    for (DictionaryEntry& entry : *dictionary) releaseContent(entry.value, unowned);
    dictionary->truncate(0);
    DictionaryStorage::free(dictionary);
  }
}

void SharedStorage::releaseContent(Value& value, SharedStorage*& unowned) noexcept {
  SharedStorage* content = nullptr;
  if (value._kind == Value::Kind::Array) content = std::exchange(value._array._storage, nullptr);
  if (value._kind == Value::Kind::Dictionary) content = std::exchange(value._dictionary._storage, nullptr);
  if (content != nullptr && content->count.release()) content->_next = std::exchange(unowned, content);
}

}  // namespace telvane
