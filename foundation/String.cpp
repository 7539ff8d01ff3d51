#include "foundation/String.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>

namespace telvane {
namespace {

constexpr size_t kHeadSize = sizeof(SharedCount);
constexpr size_t kMaximumSize = std::numeric_limits<uint32_t>::max();

char* bytesOf(SharedCount* head) noexcept { return reinterpret_cast<char*>(head) + kHeadSize; }

}  // namespace

SharedCount* String::makeBuffer(size_t size, uint32_t owners) {
  return ::new (::operator new(kHeadSize + size)) SharedCount(owners);
}

void String::freeBuffer(SharedCount* head) noexcept {
  head->~SharedCount();
  ::operator delete(head);
}

String::String(std::string_view text) {
  const size_t size = std::min(text.size(), kMaximumSize);
  if (size == 0) return;
  char* bytes = bytesOf(makeBuffer(size, 1));
  std::memcpy(bytes, text.data(), size);
  _text = bytes;
  _size = static_cast<uint32_t>(size);
  _offset = kHeadSize;
}

StringBuffer::StringBuffer(size_t capacity) : _capacity(capacity) {
  if (capacity > 0) _head = String::makeBuffer(capacity, _owners);
}

StringBuffer::~StringBuffer() {
  if (_head != nullptr && _head->release(_owners)) String::freeBuffer(_head);
}

String StringBuffer::append(std::string_view text) {
  if (text.empty()) return String();
  const size_t offset = kHeadSize + _used;
  if (text.size() > _capacity - _used || offset > kMaximumSize || text.size() > kMaximumSize || _owners == 1) {
    return String(text);
  }
  char* bytes = bytesOf(_head) + _used;
  std::memcpy(bytes, text.data(), text.size());
  _used += text.size();
  --_owners;
  return String(bytes, static_cast<uint32_t>(text.size()), static_cast<uint32_t>(offset));
}

}  // namespace telvane
