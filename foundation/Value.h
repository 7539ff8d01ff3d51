#pragma once

#include <bit>
#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "foundation/Data.h"
#include "foundation/Date.h"
#include "foundation/Export.h"
#include "foundation/Key.h"
#include "foundation/String.h"

namespace telvane {

class Value;
struct SharedStorage;
struct ArrayStorage;
struct DictionaryStorage;
struct DictionaryEntry;
struct DictionaryItem;

// An ordered list of values. A value itself: copies share their storage, and the first change through a shared copy
// makes an own one. Safe to read from any thread. A moved-from array is empty.
//
// Array{a, b} lists its elements. A single one that is itself an array is written Array{Value(a)}: of Array{a}, GCC
// makes a list of one and Clang a copy.
class TELVANE_EXPORT Array {
 public:
  Array() noexcept = default;
  Array(std::initializer_list<Value> values);
  Array(const Array& other) noexcept;
  Array(Array&& other) noexcept : _storage(std::exchange(other._storage, nullptr)) {}
  Array& operator=(const Array& other) noexcept;
  Array& operator=(Array&& other) noexcept;
  ~Array() {
    if (_storage != nullptr) release(_storage);
  }

  size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  // Returns the value at the index, or an absent value when there is none.
  const Value& operator[](size_t index) const noexcept;
  void reserve(size_t count);
  void append(Value value);
  // Replaces the value at the index. REQUIRES: index < size().
  void replace(size_t index, Value value);
  // Returns the value at the index and leaves an absent one there; nothing is copied when this is the only owner.
  Value take(size_t index);
  const Value* begin() const noexcept;
  const Value* end() const noexcept;

  friend bool operator==(const Array& a, const Array& b) noexcept;

 private:
  friend struct SharedStorage;
  static void release(ArrayStorage* storage) noexcept;
  // Returns storage that is not shared, with room for at least this many values.
  ArrayStorage& writable(size_t room);
  ArrayStorage* _storage = nullptr;
};

// A dictionary with text keys, enumerated in the order in which keys were first set. A value itself, shared and copied
// on write like Array. Small ones (the usual event) are searched by hash in a flat list, large ones have an index,
// which stays fast whatever keys a sender makes up. A moved-from dictionary is empty.
class TELVANE_EXPORT Dictionary {
 public:
  Dictionary() noexcept = default;
  // Of several equal keys the last one's value counts; absent values are left out.
  Dictionary(std::initializer_list<DictionaryItem> items);
  Dictionary(const Dictionary& other) noexcept;
  Dictionary(Dictionary&& other) noexcept : _storage(std::exchange(other._storage, nullptr)) {}
  Dictionary& operator=(const Dictionary& other) noexcept;
  Dictionary& operator=(Dictionary&& other) noexcept;
  ~Dictionary() {
    if (_storage != nullptr) release(_storage);
  }

  size_t size() const noexcept;
  bool empty() const noexcept { return size() == 0; }
  // Returns the value under the key, or an absent value when there is none (never a dangling reference while this
  // dictionary lives unchanged).
  const Value& operator[](const Key& key) const noexcept;
  const Value& operator[](std::string_view key) const noexcept;
  const Value& operator[](const char* key) const noexcept { return (*this)[std::string_view(key)]; }
  bool contains(const Key& key) const noexcept;
  bool contains(std::string_view key) const noexcept;
  bool contains(const char* key) const noexcept { return contains(std::string_view(key)); }
  // Sets or replaces; an absent value removes the key.
  void set(const Key& key, Value value);
  void set(const String& key, Value value);
  void set(const char* key, Value value);
  // Removes the key; the order of the others stays. Returns whether it was there. Takes time in proportion to the
  // size; to remove many, use keepIf.
  bool remove(std::string_view key);
  // Removes the key and returns its value, or an absent one; nothing is copied when this is the only owner.
  Value take(const Key& key);
  // Sets all entries of the other dictionary, replacing equal keys.
  void addEntriesFrom(const Dictionary& other);
  // Keeps only the entries for which keep(entry key, entry value) is true. Asks once for each entry, in order.
  template <class Predicate>
  void keepIf(Predicate keep);
  // Makes room for this many entries in all.
  void reserve(size_t count);
  const DictionaryEntry* begin() const noexcept;
  const DictionaryEntry* end() const noexcept;

  // Two dictionaries are equal when they hold equal values under the same keys, in whatever order.
  friend bool operator==(const Dictionary& a, const Dictionary& b) noexcept;

 private:
  friend struct SharedStorage;
  static void release(DictionaryStorage* storage) noexcept;
  // Returns storage that is not shared, with room for at least this many entries.
  DictionaryStorage& writable(size_t room);
  // Replaces the value when the key is there; returns whether it was.
  bool replace(std::string_view key, uint32_t hash, Value& value);
  // Removes the entries at these ascending positions.
  void removeAt(std::span<const uint32_t> positions);
  DictionaryStorage* _storage = nullptr;
};

// One property-list value: absent, boolean, integer, real, text, data, date, array or dictionary. 24 bytes; text and
// containers are shared and copied on write, so passing one on costs no more than a counter. A moved-from value is
// absent.
//
// A boolean, an integer and a real stay what they are through every coder: Value(true) != Value(1) != Value(1.0).
// Integers are signed 64-bit; UnsignedInteger holds only what does not fit there (above 2^63 - 1).
class TELVANE_EXPORT Value {
 public:
  enum class Kind : uint8_t { None, Boolean, Integer, UnsignedInteger, Real, String, Data, Date, Array, Dictionary };

  // An absent value.
  Value() noexcept : _raw{} {}
  // Templates, so that neither a pointer nor an enumeration slips in as a boolean or a number.
  template <std::same_as<bool> T>
  Value(T value) noexcept : _raw{value ? 1u : 0u, 0}, _kind(Kind::Boolean) {}
  template <std::integral T>
  requires(!std::same_as<T, bool>) Value(T value)
  noexcept : _raw{static_cast<uint64_t>(value), 0}, _kind(Kind::Integer) {
    if constexpr (std::unsigned_integral<T>) {
      if (integerBits() < 0) _kind = Kind::UnsignedInteger;
    }
  }
  template <std::floating_point T>
  Value(T value) noexcept : _raw{std::bit_cast<uint64_t>(static_cast<double>(value)), 0}, _kind(Kind::Real) {}
  Value(telvane::String text) noexcept : _string(std::move(text)), _kind(Kind::String) {}
  Value(const char* text) : Value(telvane::String(text)) {}
  Value(std::string_view text) : Value(telvane::String(text)) {}
  Value(const std::string& text) : Value(telvane::String(text)) {}
  Value(const Key& text) : Value(text.string()) {}
  Value(telvane::Data data) noexcept : _data(std::move(data)), _kind(Kind::Data) {}
  Value(telvane::Date date) noexcept : _raw{}, _kind(Kind::Date) { std::construct_at(&_date, date); }
  Value(telvane::Array array) noexcept : _raw{}, _kind(Kind::Array) { std::construct_at(&_array, std::move(array)); }
  Value(telvane::Dictionary dictionary) noexcept : _raw{}, _kind(Kind::Dictionary) {
    std::construct_at(&_dictionary, std::move(dictionary));
  }
  Value(const Value& other) noexcept : _raw{} { copyFrom(other); }
  Value(Value&& other) noexcept : _raw{} { takeFrom(other); }
  Value& operator=(const Value& other) noexcept {
    Value copy(other);
    return *this = std::move(copy);
  }
  // The old content goes last, because the other value may live in it.
  Value& operator=(Value&& other) noexcept {
    Value taken(std::move(other));
    const Value old(std::move(*this));
    takeFrom(taken);
    return *this;
  }
  ~Value() { destroy(); }

  // The absent value, for references to nothing.
  static const Value& none() noexcept;

  Kind kind() const noexcept { return _kind; }
  bool isPresent() const noexcept { return _kind != Kind::None; }
  // Whether it is a boolean, an integer or a real.
  bool isNumber() const noexcept { return _kind >= Kind::Boolean && _kind <= Kind::Real; }
  bool isString() const noexcept { return _kind == Kind::String; }
  bool isArray() const noexcept { return _kind == Kind::Array; }
  bool isDictionary() const noexcept { return _kind == Kind::Dictionary; }

  // Typed access: null when the value is of another kind.
  const telvane::String* string() const noexcept { return _kind == Kind::String ? &_string : nullptr; }
  const telvane::Data* data() const noexcept { return _kind == Kind::Data ? &_data : nullptr; }
  const telvane::Date* date() const noexcept { return _kind == Kind::Date ? &_date : nullptr; }
  const telvane::Array* array() const noexcept { return _kind == Kind::Array ? &_array : nullptr; }
  const telvane::Dictionary* dictionary() const noexcept { return _kind == Kind::Dictionary ? &_dictionary : nullptr; }
  // The same, to be changed or moved from.
  telvane::Dictionary* dictionary() noexcept { return _kind == Kind::Dictionary ? &_dictionary : nullptr; }
  // Only of Kind::Boolean.
  std::optional<bool> boolean() const noexcept {
    return _kind == Kind::Boolean ? std::optional(_raw.first != 0) : std::nullopt;
  }
  // Only of Kind::Integer.
  std::optional<int64_t> integer() const noexcept {
    return _kind == Kind::Integer ? std::optional(integerBits()) : std::nullopt;
  }
  // Only of Kind::UnsignedInteger.
  std::optional<uint64_t> unsignedInteger() const noexcept {
    return _kind == Kind::UnsignedInteger ? std::optional(_raw.first) : std::nullopt;
  }
  // Only of Kind::Real.
  std::optional<double> real() const noexcept { return _kind == Kind::Real ? std::optional(realBits()) : std::nullopt; }
  // The text, or an empty view for any other kind.
  std::string_view text() const noexcept { return _kind == Kind::String ? _string.view() : std::string_view(); }

  // Lenient conversions, the one place where numbers are read from whatever came. Anything that is not a number, a
  // boolean or text that begins with a number counts as 0, 0.0, false.
  //
  // integerValue: reals are truncated and clamped to the range (not-a-number is 0), UnsignedInteger wraps, text is read
  // as leading blanks, sign and decimal digits, clamped to the range.
  int64_t integerValue() const noexcept;
  // The same, as the two's complement bits; negative numbers wrap.
  uint64_t unsignedValue() const noexcept { return static_cast<uint64_t>(integerValue()); }
  // The 32-bit forms cut the integer value to its low 32 bits.
  int32_t int32Value() const noexcept { return static_cast<int32_t>(integerValue()); }
  uint32_t uint32Value() const noexcept { return static_cast<uint32_t>(unsignedValue()); }
  uint16_t low16Bits() const noexcept { return static_cast<uint16_t>(unsignedValue()); }
  // Text is read as leading blanks, sign, decimal digits with a point, and exponent; beyond the range it is infinite.
  double realValue() const noexcept;
  // A number is true unless 0 or not-a-number; text is true when, after blanks, sign and zeros, it begins with Y, y, T,
  // t or 1 to 9.
  bool booleanValue() const noexcept;

  // The nesting depth: 1 for anything but a container, 1 more than the deepest element for a container.
  // Counting stops at limit, which is then the result.
  size_t depth(size_t limit) const noexcept;

  // Exact equality of kind and content; reals compare by value, so a not-a-number equals nothing.
  friend bool operator==(const Value& a, const Value& b) noexcept;

 private:
  friend struct SharedStorage;

  struct Raw {
    uint64_t first = 0;
    uint64_t second = 0;
  };

  int64_t integerBits() const noexcept { return static_cast<int64_t>(_raw.first); }
  double realBits() const noexcept { return std::bit_cast<double>(_raw.first); }
  void copyFrom(const Value& other) noexcept;
  void takeFrom(Value& other) noexcept;
  void destroy() noexcept;

  // Nothing, a boolean (0 or 1) and numbers live in _raw.first as bits. None of the others refers to its own address,
  // so that any value is moved by moving _raw; GCC and Clang define that for a union. All 16 bytes are always set.
  union {
    Raw _raw;
    telvane::String _string;
    telvane::Data _data;
    telvane::Date _date;
    telvane::Array _array;
    telvane::Dictionary _dictionary;
  };
  Kind _kind = Kind::None;
};

static_assert(sizeof(Value) == 24);
static_assert(sizeof(String) == 16 && sizeof(Data) == 16, "moved as Raw");

struct DictionaryEntry {
  String key;
  uint32_t hash = 0;
  Value value;
};

// What Dictionary{{kKey, value}, ...} is listed with.
struct DictionaryItem {
  Key key;
  Value value;
};

// REQUIRES: this value is absent.
inline void Value::copyFrom(const Value& other) noexcept {
  switch (other._kind) {
    case Kind::String:
      std::construct_at(&_string, other._string);
      break;
    case Kind::Data:
      std::construct_at(&_data, other._data);
      break;
    case Kind::Array:
      std::construct_at(&_array, other._array);
      break;
    case Kind::Dictionary:
      std::construct_at(&_dictionary, other._dictionary);
      break;
    default:
      _raw = other._raw;
  }
  _kind = other._kind;
}

// REQUIRES: this value is absent.
inline void Value::takeFrom(Value& other) noexcept {
  _raw = std::exchange(other._raw, Raw());
  _kind = std::exchange(other._kind, Kind::None);
}

inline void Value::destroy() noexcept {
  switch (_kind) {
    case Kind::String:
      std::destroy_at(&_string);
      break;
    case Kind::Data:
      std::destroy_at(&_data);
      break;
    case Kind::Array:
      std::destroy_at(&_array);
      break;
    case Kind::Dictionary:
      std::destroy_at(&_dictionary);
      break;
    default:
      break;
  }
}

template <class Predicate>
void Dictionary::keepIf(Predicate keep) {
  std::vector<uint32_t> removed;
  uint32_t position = 0;
  for (const DictionaryEntry* entry = begin(); entry != end(); ++entry, ++position) {
    if (!keep(entry->key, entry->value)) removed.push_back(position);
  }
  if (!removed.empty()) removeAt(removed);
}

}  // namespace telvane
