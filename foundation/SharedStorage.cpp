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
    std::unique_ptr<ArrayStorage> array(static_cast<ArrayStorage*>(storage));
    for (Value& value : array->values) releaseContent(value, unowned);
  } else {
    std::unique_ptr<DictionaryStorage> dictionary(static_cast<DictionaryStorage*>(storage));
    for (DictionaryEntry& entry : dictionary->entries) releaseContent(entry.value, unowned);
  }
}

void SharedStorage::releaseContent(Value& value, SharedStorage*& unowned) noexcept {
  SharedStorage* content = nullptr;
  if (value._kind == Value::Kind::Array) content = std::exchange(value._array._storage, nullptr);
  if (value._kind == Value::Kind::Dictionary) content = std::exchange(value._dictionary._storage, nullptr);
  if (content != nullptr && content->count.release()) content->_next = std::exchange(unowned, content);
}

}  // namespace telvane
