#include "platform/system/PropertyListNode.h"

#include <locale.h>
#include <stdlib.h>

#include <bit>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <limits>
#include <string>
#include <vector>

#include "platform/PropertyList.h"
#include "platform/system/PlatformError.h"
#include "platform/system/PropertyListScan.h"
#include "platform/system/UTF8.h"

namespace telvane::propertylist {
namespace {

constexpr size_t kMaximumDepth = 64;
constexpr double kSecondsFrom1970To2001 = 978307200;
// A binary property list of one scalar: the magic, the object, a table of one offset, the trailer.
constexpr std::string_view kMagic = "bplist00";
constexpr size_t kTrailerSize = 32;
constexpr uint8_t kMarkerWideInteger = 0x14;
constexpr uint8_t kMarkerDate = 0x33;

struct Freeing {
  void operator()(char* bytes) const noexcept { free(bytes); }
};

// The library's own functions cut dates to 32 bits and do not tell -1 from 2^64 - 1. Its binary form does both right,
// so the rare scalars that need it go through that.
std::string binaryForm(plist_t node) {
  char* bytes = nullptr;
  uint32_t size = 0;
  plist_to_bin(node, &bytes, &size);
  const std::unique_ptr<char, Freeing> owned(bytes);
  return bytes == nullptr ? std::string() : std::string(bytes, size);
}

uint64_t bigEndian(std::string_view bytes) {
  uint64_t number = 0;
  for (const char c : bytes.substr(0, sizeof number)) number = number << 8 | static_cast<uint8_t>(c);
  return number;
}

void appendBigEndian(std::string& bytes, uint64_t number) {
  for (int shift = 56; shift >= 0; shift -= 8) bytes += static_cast<char>(number >> shift & 0xFF);
}

plist_t newNodeOfBinaryObject(const std::string& object) {
  std::string bytes(kMagic);
  bytes += object;
  bytes += static_cast<char>(kMagic.size());   // the table: where the object is
  bytes += std::string(6, '\0') + "\x01\x01";  // sizes of an offset and of a reference
  appendBigEndian(bytes, 1);
  appendBigEndian(bytes, 0);
  appendBigEndian(bytes, kMagic.size() + object.size());
  plist_t node = nullptr;
  plist_from_bin(bytes.data(), static_cast<uint32_t>(bytes.size()), &node);
  return node;
}

plist_t newDateNode(const Date& date) {
  std::string object(1, static_cast<char>(kMarkerDate));
  appendBigEndian(object, std::bit_cast<uint64_t>(date.secondsSince1970() - kSecondsFrom1970To2001));
  return newNodeOfBinaryObject(object);
}

plist_t newWideIntegerNode(uint64_t number) {
  std::string object(1, static_cast<char>(kMarkerWideInteger));
  appendBigEndian(object, 0);
  appendBigEndian(object, number);
  return newNodeOfBinaryObject(object);
}

// Text as the library takes it: valid, and ended by a null character.
std::string terminated(std::string_view text) { return utf8::isValid(text) ? std::string(text) : utf8::repaired(text); }

Result<Value> integerOf(plist_t node) {
  uint64_t number = 0;
  plist_get_uint_val(node, &number);
  if (number <= static_cast<uint64_t>(std::numeric_limits<int64_t>::max())) return Value(static_cast<int64_t>(number));
  const std::string form = binaryForm(node);
  const bool isWide = form.size() > kMagic.size() && static_cast<uint8_t>(form[kMagic.size()]) == kMarkerWideInteger;
  return isWide ? Value(number) : Value(static_cast<int64_t>(number));
}

Result<Value> dateOf(plist_t node) {
  const std::string form = binaryForm(node);
  if (form.size() < kMagic.size() + 1 + sizeof(double) + kTrailerSize) return malformed("a date is wrong");
  const auto seconds = std::bit_cast<double>(bigEndian(std::string_view(form).substr(kMagic.size() + 1)));
  return Value(Date::fromSecondsSince1970(seconds + kSecondsFrom1970To2001));
}

Value dataOf(plist_t node) {
  uint64_t size = 0;
  const char* bytes = plist_get_data_ptr(node, &size);
  return bytes == nullptr ? Value(Data()) : Value(Data::copyOf(std::string_view(bytes, size)));
}

Value textOf(plist_t node) {
  uint64_t size = 0;
  const char* text = plist_get_string_ptr(node, &size);
  return text == nullptr ? Value("") : Value(std::string_view(text, size));
}

// Converts a tree of nodes with a bound on depth and number.
class NodeReader {
 public:
  explicit NodeReader(const Limits& limits) : _limits(limits) {}

  Result<Value> read(plist_t node, size_t level) {
    if (level > _limits.maximumDepth) return tooDeep();
    if (++_count > _limits.maximumNodes) return tooLarge();
    switch (plist_get_node_type(node)) {
      case PLIST_BOOLEAN:
        return booleanOf(node);
      case PLIST_UINT:
        return integerOf(node);
      case PLIST_REAL:
        return realOf(node);
      case PLIST_STRING:
        return textOf(node);
      case PLIST_DATA:
        return dataOf(node);
      case PLIST_DATE:
        return dateOf(node);
      case PLIST_ARRAY:
        return readArray(node, level);
      case PLIST_DICT:
        return readDictionary(node, level);
      default:
        return malformed("it holds what is neither number, text, data, date, array nor dictionary");
    }
  }

 private:
  static Value booleanOf(plist_t node) {
    uint8_t value = 0;
    plist_get_bool_val(node, &value);
    return value != 0;
  }

  static Value realOf(plist_t node) {
    double value = 0;
    plist_get_real_val(node, &value);
    return value;
  }

  Result<Value> readArray(plist_t node, size_t level) {
    Array array;
    array.reserve(plist_array_get_size(node));
    plist_array_iter iterator = nullptr;
    plist_array_new_iter(node, &iterator);
    const std::unique_ptr<char, Freeing> owned(static_cast<char*>(iterator));
    for (;;) {
      plist_t element = nullptr;
      plist_array_next_item(node, iterator, &element);
      if (element == nullptr) return Value(std::move(array));
      Result<Value> value = read(element, level + 1);
      if (!value) return value;
      array.append(std::move(*value));
    }
  }

  Result<Value> readDictionary(plist_t node, size_t level) {
    Dictionary dictionary;
    plist_dict_iter iterator = nullptr;
    plist_dict_new_iter(node, &iterator);
    const std::unique_ptr<char, Freeing> owned(static_cast<char*>(iterator));
    for (;;) {
      char* key = nullptr;
      plist_t element = nullptr;
      plist_dict_next_item(node, iterator, &key, &element);
      const std::unique_ptr<char, Freeing> ownedKey(key);
      if (element == nullptr) return Value(std::move(dictionary));
      Result<Value> value = read(element, level + 1);
      if (!value) return value;
      dictionary.set(String(key == nullptr ? "" : key), std::move(*value));
    }
  }

  const Limits& _limits;
  size_t _count = 0;
};

plist_t newNodeAt(const Value& value, size_t level);

plist_t newArrayNode(const Array& array, size_t level) {
  OwnedNode node(plist_new_array());
  for (const Value& element : array) {
    if (plist_t child = newNodeAt(element, level + 1)) plist_array_append_item(node.get(), child);
  }
  return node.release();
}

plist_t newDictionaryNode(const Dictionary& dictionary, size_t level) {
  OwnedNode node(plist_new_dict());
  for (const DictionaryEntry& entry : dictionary) {
    plist_t child = newNodeAt(entry.value, level + 1);
    if (child != nullptr) plist_dict_set_item(node.get(), terminated(entry.key.view()).c_str(), child);
  }
  return node.release();
}

plist_t newNodeAt(const Value& value, size_t level) {
  if (level > kMaximumDepth) return nullptr;
  switch (value.kind()) {
    case Value::Kind::None:
      return nullptr;
    case Value::Kind::Boolean:
      return plist_new_bool(*value.boolean() ? 1 : 0);
    // The library keeps a negative number as its two's complement, marked as signed.
    case Value::Kind::Integer:
      return plist_new_uint(static_cast<uint64_t>(*value.integer()));
    case Value::Kind::UnsignedInteger:
      return newWideIntegerNode(*value.unsignedInteger());
    case Value::Kind::Real:
      return plist_new_real(*value.real());
    case Value::Kind::String:
      return plist_new_string(terminated(value.text()).c_str());
    case Value::Kind::Data:
      return plist_new_data(reinterpret_cast<const char*>(value.data()->bytes()), value.data()->size());
    case Value::Kind::Date:
      return newDateNode(*value.date());
    case Value::Kind::Array:
      return newArrayNode(*value.array(), level);
    case Value::Kind::Dictionary:
      return newDictionaryNode(*value.dictionary(), level);
  }
  return nullptr;
}

}  // namespace

PlainNumbers::PlainNumbers() noexcept : _plain(newlocale(LC_ALL_MASK, "C", nullptr)) {
  if (_plain != nullptr) _before = uselocale(static_cast<locale_t>(_plain));
}

PlainNumbers::~PlainNumbers() {
  if (_plain == nullptr) return;
  uselocale(static_cast<locale_t>(_before));
  freelocale(static_cast<locale_t>(_plain));
}

Result<Value> fromNode(void* node, const Limits& limits) {
  if (node == nullptr) return Value();
  return NodeReader(limits).read(node, 1);
}

void* newNode(const Value& value) { return newNodeAt(value, 1); }

}  // namespace telvane::propertylist
