#include "client/ValueSize.h"

namespace telvane {
namespace {

// Deeper values do not reach the daemon, so what is below need not be counted.
constexpr int kMaximumDepth = 64;

uint64_t sizeOf(const Value& value, int depth) noexcept;
uint64_t sizeOf(const Array& array, int depth) noexcept;

uint64_t sizeOf(const Dictionary& dictionary, int depth) noexcept {
  uint64_t size = sizeof(Dictionary);
  for (const DictionaryEntry& entry : dictionary) {
    size += sizeof(DictionaryEntry) - sizeof(Value) + entry.key.size() + sizeOf(entry.value, depth);
  }
  return size;
}

uint64_t sizeOf(const Value& value, int depth) noexcept {
  uint64_t size = sizeof(Value);
  if (depth == 0) return size;
  if (value.string() != nullptr) return size + value.string()->size();
  if (value.data() != nullptr) return size + value.data()->size();
  if (value.dictionary() != nullptr) return size + sizeOf(*value.dictionary(), depth - 1);
  if (value.array() != nullptr) return size + sizeOf(*value.array(), depth - 1);
  return size;
}

uint64_t sizeOf(const Array& array, int depth) noexcept {
  uint64_t size = 0;
  for (const Value& element : array) size += sizeOf(element, depth);
  return size;
}

}  // namespace

uint64_t estimatedSize(const Value& value) noexcept { return sizeOf(value, kMaximumDepth); }
uint64_t estimatedSize(const Dictionary& dictionary) noexcept { return sizeOf(dictionary, kMaximumDepth); }
uint64_t estimatedSize(const Array& array) noexcept { return sizeOf(array, kMaximumDepth); }

}  // namespace telvane
