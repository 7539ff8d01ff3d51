#pragma once

#include <compare>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <utility>

#include "foundation/Export.h"
#include "foundation/SharedCount.h"

namespace telvane {

class Key;

// An immutable piece of UTF-8 text that is cheap to pass on: a pointer, a size, and the way back to the shared,
// reference-counted buffer that it is a slice of. Text with static storage (dictionary keys, literals) has no buffer
// and is never copied, so a known key costs no allocation.
//
// A value: copies share the bytes. Safe to read from any thread; one object is not to be assigned from two threads.
// A slice keeps its whole buffer alive, which is why decoders put the strings of one batch into one buffer.
// At most 4 GiB - 1 byte; longer text is cut. A moved-from string is empty.
class TELVANE_EXPORT String {
 public:
  constexpr String() noexcept = default;
  // Copies the bytes into a buffer of its own.
  String(std::string_view text);
  String(const std::string& text) : String(std::string_view(text)) {}
  String(const char* text) : String(std::string_view(text)) {}
  // Refers to the key's text; copies nothing. Defined in Key.h.
  constexpr String(const Key& key) noexcept;
  String(const String& other) noexcept : _text(other._text), _size(other._size), _offset(other._offset) {
    if (_offset != 0) count().retain();
  }
  String(String&& other) noexcept
      : _text(std::exchange(other._text, "")),
        _size(std::exchange(other._size, 0)),
        _offset(std::exchange(other._offset, 0)) {}
  String& operator=(const String& other) noexcept {
    String copy(other);
    swap(copy);
    return *this;
  }
  String& operator=(String&& other) noexcept {
    String taken(std::move(other));
    swap(taken);
    return *this;
  }
  constexpr ~String() {
    if (_offset != 0) releaseBuffer();
  }

  // Refers to text that lives for the whole process; copies nothing.
  static constexpr String fromStatic(std::string_view text) noexcept {
    return String(text.data(), static_cast<uint32_t>(text.size()));
  }

  std::string_view view() const noexcept { return {_text, _size}; }
  operator std::string_view() const noexcept { return view(); }
  std::string str() const { return std::string(view()); }
  uint32_t size() const noexcept { return _size; }
  bool empty() const noexcept { return _size == 0; }

  friend bool operator==(const String& a, const String& b) noexcept { return a.view() == b.view(); }
  friend bool operator==(const String& a, std::string_view b) noexcept { return a.view() == b; }
  friend bool operator==(const String& a, const std::string& b) noexcept { return a.view() == b; }
  friend bool operator==(const String& a, const char* b) noexcept { return a.view() == std::string_view(b); }
  // Orders by bytes.
  friend std::strong_ordering operator<=>(const String& a, const String& b) noexcept { return a.view() <=> b.view(); }
  friend std::strong_ordering operator<=>(const String& a, std::string_view b) noexcept { return a.view() <=> b; }

 private:
  friend class StringBuffer;
  constexpr String(const char* text, uint32_t size, uint32_t offset = 0) noexcept
      : _text(text), _size(size), _offset(offset) {}

  void swap(String& other) noexcept {
    std::swap(_text, other._text);
    std::swap(_size, other._size);
    std::swap(_offset, other._offset);
  }
  // By address rather than by pointer: GCC 12 takes the literal "" for the buffer that a head would stand before.
  SharedCount& count() const noexcept {
    const uintptr_t head = reinterpret_cast<uintptr_t>(_text) - _offset;
    return *reinterpret_cast<SharedCount*>(head);  // NOLINT(performance-no-int-to-ptr)
  }
  void releaseBuffer() noexcept {
    if (count().release()) freeBuffer(&count());
  }
  static SharedCount* makeBuffer(size_t size, uint32_t owners);
  static void freeBuffer(SharedCount* head) noexcept;

  const char* _text = "";
  uint32_t _size = 0;
  // Distance from the shared buffer's head, a SharedCount, to _text; 0 for text with static storage.
  uint32_t _offset = 0;
};

static_assert(sizeof(String) == 16);

// Builds many strings in one shared buffer: one allocation for all strings of a decoded batch. The buffer lives until
// the last slice is gone. A capacity below the sum of all appended sizes costs an allocation for each text that is too
// much, and nothing else.
class TELVANE_EXPORT StringBuffer {
 public:
  // capacity: the number of bytes that will be appended in all.
  explicit StringBuffer(size_t capacity);
  StringBuffer(const StringBuffer&) = delete;
  StringBuffer& operator=(const StringBuffer&) = delete;
  ~StringBuffer();

  // Copies text into the buffer and returns the slice. Text that does not fit any more gets a buffer of its own.
  String append(std::string_view text);

 private:
  // The buffer starts with this many owners, which append hands out one by one without touching the shared count, and
  // the destructor gives back the rest. It leaves three times as many to copies of the slices.
  static constexpr uint32_t kOwnersToHandOut = 1u << 30;

  SharedCount* _head = nullptr;  // null when the capacity is 0
  size_t _used = 0;
  size_t _capacity = 0;
  uint32_t _owners = kOwnersToHandOut;
};

}  // namespace telvane

template <>
struct std::hash<telvane::String> {
  size_t operator()(const telvane::String& text) const noexcept { return std::hash<std::string_view>()(text.view()); }
};
