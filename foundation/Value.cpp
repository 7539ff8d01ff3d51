#include "foundation/Value.h"

#include <algorithm>
#include <cstddef>
#include <memory>

namespace telvane {
namespace {

template <class Elements, class ValueOf>
size_t depthOfElements(const Elements& elements, size_t limit, ValueOf valueOf) noexcept {
  size_t deepest = 0;
  for (const auto& element : elements) {
    deepest = std::max(deepest, valueOf(element).depth(limit - 1));
    if (deepest == limit - 1) break;
  }
  return deepest + 1;
}

}  // namespace

// Never destroyed, because threads may still read through references to it while the process ends.
const Value& Value::none() noexcept {
  alignas(Value) static std::byte place[sizeof(Value)];
  static const Value* const none = std::construct_at(reinterpret_cast<Value*>(place));
  return *none;
}

size_t Value::depth(size_t limit) const noexcept {
  if (limit <= 1) return limit;
  if (_kind == Kind::Array)
    return depthOfElements(
        _array, limit, [](const Value& value) -> auto& { return value; });
  if (_kind != Kind::Dictionary) return 1;
  return depthOfElements(
      _dictionary, limit, [](const DictionaryEntry& entry) -> auto& { return entry.value; });
}

TELVANE_EXPORT bool operator==(const Value& a, const Value& b) noexcept {
  if (a._kind != b._kind) return false;
  switch (a._kind) {
    case Value::Kind::Real:
      return a.realBits() == b.realBits();
    case Value::Kind::String:
      return a._string == b._string;
    case Value::Kind::Data:
      return a._data == b._data;
    case Value::Kind::Date:
      return a._date == b._date;
    case Value::Kind::Array:
      return a._array == b._array;
    case Value::Kind::Dictionary:
      return a._dictionary == b._dictionary;
    default:
      return a._raw.first == b._raw.first;
  }
}

}  // namespace telvane
