#include "platform/ipc/WireCoding.h"

#include <kj/exception.h>

#include <algorithm>
#include <chrono>
#include <cstring>

#include "platform/ipc/Limits.h"

namespace telvane::ipc::wirecoding {

namespace {

constexpr uint64_t kListBytes = 8;  // the tag in front of a list of structs
constexpr uint64_t kValueBytes = 32;
// A buffer is made before its strings are seen, so a peer's hint is believed only up to here.
constexpr uint64_t kMostTextBytes = 1u << 20;

uint64_t padded(uint64_t bytes) { return (bytes + 7) & ~uint64_t{7}; }

void add(Measure& sum, const Value& value, size_t nesting);

void addText(Measure& sum, const String& text) {
  sum.wireBytes += padded(text.size() + 1u);
  sum.textBytes += text.size();
}

bool enter(Measure& sum, size_t values, size_t nesting) {
  sum.wireBytes += kListBytes + kValueBytes * values;
  if (nesting > kMaximumNesting) sum.isTooDeep = true;
  return !sum.isTooDeep;
}

void addArray(Measure& sum, const Array& array, size_t nesting) {
  if (!enter(sum, array.size(), nesting)) return;
  for (const Value& element : array) add(sum, element, nesting);
}

void addDictionary(Measure& sum, const Dictionary& dictionary, size_t nesting) {
  if (!enter(sum, dictionary.size(), nesting)) return;
  for (const DictionaryEntry& entry : dictionary) {
    addText(sum, entry.key);
    add(sum, entry.value, nesting);
  }
}

void add(Measure& sum, const Value& value, size_t nesting) {
  switch (value.kind()) {
    case Value::Kind::String:
      return addText(sum, *value.string());
    case Value::Kind::Data:
      sum.wireBytes += padded(value.data()->size());
      return;
    case Value::Kind::Array:
      return addArray(sum, *value.array(), nesting + 1);
    case Value::Kind::Dictionary:
      return addDictionary(sum, *value.dictionary(), nesting + 1);
    default:
      return;
  }
}

void copyText(const String& text, capnp::Text::Builder to) {
  if (!text.empty()) std::memcpy(to.begin(), text.view().data(), text.size());
}

void encodeValue(const Value& value, wire::Value::Builder to);

void encodeDictionary(const Dictionary& dictionary, capnp::List<wire::Value>::Builder list) {
  uint32_t index = 0;
  for (const DictionaryEntry& entry : dictionary) {
    auto to = list[index++];
    copyText(entry.key, to.initKey(entry.key.size()));
    encodeValue(entry.value, to);
  }
}

void encodeValue(const Value& value, wire::Value::Builder to) {
  switch (value.kind()) {
    case Value::Kind::None:
      return;  // what a new struct holds
    case Value::Kind::Boolean:
      return to.setBoolean(*value.boolean());
    case Value::Kind::Integer:
      return to.setInteger(*value.integer());
    case Value::Kind::UnsignedInteger:
      return to.setUnsigned(*value.unsignedInteger());
    case Value::Kind::Real:
      return to.setReal(*value.real());
    case Value::Kind::String:
      return copyText(*value.string(), to.initString(value.string()->size()));
    case Value::Kind::Data:
      return to.setData(capnp::Data::Reader(value.data()->bytes(), value.data()->size()));
    case Value::Kind::Date:
      return to.setDate(value.date()->time().time_since_epoch().count());
    case Value::Kind::Array:
      return encode(*value.array(), to.initArray(static_cast<unsigned>(value.array()->size())));
    case Value::Kind::Dictionary:
      return encodeDictionary(*value.dictionary(),
                              to.initDictionary(static_cast<unsigned>(value.dictionary()->size())));
  }
}

}  // namespace

void refuse(const char* text) {
  kj::throwFatalException(kj::Exception(kj::Exception::Type::FAILED, "", 0, kj::heapString(text)));
}

Measure measure(const Array& values) {
  Measure sum;
  addArray(sum, values, 0);
  return sum;
}

void encode(const Array& values, capnp::List<wire::Value>::Builder list) {
  uint32_t index = 0;
  for (const Value& value : values) encodeValue(value, list[index++]);
}

Decoder::Decoder(uint64_t textBytes, size_t maximumValues)
    : _text(std::min(textBytes, kMostTextBytes)), _valuesLeft(maximumValues) {}

Array Decoder::decode(capnp::List<wire::Value>::Reader list) { return decodeArray(list, 0); }

void Decoder::count(size_t values, size_t nesting) {
  if (nesting > kMaximumNesting) refuse("a value is nested deeper than 64 levels");
  if (values > _valuesLeft) refuse("a message holds too many values");
  _valuesLeft -= values;
}

Array Decoder::decodeArray(capnp::List<wire::Value>::Reader list, size_t nesting) {
  count(list.size(), nesting);
  Array array;
  array.reserve(list.size());
  for (auto element : list) array.append(decodeValue(element, nesting));
  return array;
}

Dictionary Decoder::decodeDictionary(capnp::List<wire::Value>::Reader list, size_t nesting) {
  count(list.size(), nesting);
  Dictionary dictionary;
  dictionary.reserve(list.size());
  for (auto entry : list) dictionary.set(decodeText(entry.getKey()), decodeValue(entry, nesting));
  return dictionary;
}

Value Decoder::decodeValue(wire::Value::Reader value, size_t nesting) {
  switch (value.which()) {
    case wire::Value::NONE:
      return {};
    case wire::Value::BOOLEAN:
      return value.getBoolean();
    case wire::Value::INTEGER:
      return value.getInteger();
    case wire::Value::UNSIGNED:
      return value.getUnsigned();
    case wire::Value::REAL:
      return value.getReal();
    case wire::Value::STRING:
      return decodeText(value.getString());
    case wire::Value::DATA: {
      const auto data = value.getData();
      return Data::copyOf(std::span<const uint8_t>(data.begin(), data.size()));
    }
    case wire::Value::DATE:
      return Date(Date::TimePoint(std::chrono::microseconds(value.getDate())));
    case wire::Value::ARRAY:
      return decodeArray(value.getArray(), nesting + 1);
    case wire::Value::DICTIONARY:
      return decodeDictionary(value.getDictionary(), nesting + 1);
  }
  refuse("a value is of an unknown kind");
}

String Decoder::decodeText(capnp::Text::Reader text) { return _text.append({text.begin(), text.size()}); }

}  // namespace telvane::ipc::wirecoding
