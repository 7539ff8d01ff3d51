#include <rapidjson/prettywriter.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>

#include "platform/JSON.h"
#include "platform/system/PlatformError.h"
#include "platform/system/UTF8.h"

namespace telvane::json {
namespace {

constexpr size_t kMaximumDepth = 64;
constexpr unsigned kIndentation = 2;
constexpr size_t kChunkSize = 1024;
constexpr size_t kLongestReal = 32;

// Gathers small pieces before they go into the string, whose appending costs more than they do.
class StringStream {
 public:
  using Ch = char;
  explicit StringStream(std::string& text) noexcept : _text(text) {}

  void Put(char c) {
    if (_used == kChunkSize) Flush();
    _chunk[_used++] = c;
  }
  void Flush() {
    _text.append(_chunk.data(), _used);
    _used = 0;
  }
  void put(std::string_view piece) {
    if (piece.size() > kChunkSize - _used) Flush();
    if (piece.size() > kChunkSize) {
      _text.append(piece);
      return;
    }
    std::memcpy(_chunk.data() + _used, piece.data(), piece.size());
    _used += piece.size();
  }

 private:
  std::string& _text;
  std::array<char, kChunkSize> _chunk;
  size_t _used = 0;
};

constexpr uint64_t kEachByte = 0x0101010101010101u;

bool isPlainByte(uint8_t byte) { return byte >= 0x20 && byte < 0x80 && byte != '"' && byte != '\\'; }

// The high bit of some byte is set when one of the eight cannot stand between quotes as it is.
uint64_t marksOf(const char* bytes) {
  const auto marksZero = [](uint64_t word) { return (word - kEachByte) & ~word; };
  uint64_t word = 0;
  std::memcpy(&word, bytes, sizeof word);
  return word | (word - 0x20 * kEachByte) | marksZero(word ^ ('"' * kEachByte)) | marksZero(word ^ ('\\' * kEachByte));
}

// Whether JSON text can hold the bytes between quotes as they are. Most text can, and is then copied in one piece.
bool isPlain(std::string_view text) {
  constexpr size_t kStep = sizeof(uint64_t);
  if (text.size() < kStep) return std::all_of(text.begin(), text.end(), isPlainByte);
  uint64_t marks = marksOf(text.data() + text.size() - kStep);  // the last ones, perhaps a second time
  for (size_t position = 0; position + kStep <= text.size(); position += kStep)
    marks |= marksOf(text.data() + position);
  return (marks & (0x80 * kEachByte)) == 0;
}

// Writes values through one of the library's writers, which knows about commas, indentation and escapes.
template <class Writer>
class ValueWriter : private Writer {
 public:
  explicit ValueWriter(StringStream& stream) : Writer(stream), _stream(stream) {}

  // The library's writer, to be set up.
  Writer& layout() noexcept { return *this; }

  // Returns what is wrong with the value, or null.
  const char* write(const Value& value, size_t level) {
    if (level > kMaximumDepth) return "nested deeper than 64 levels";
    switch (value.kind()) {
      case Value::Kind::None:
        return "an absent value";
      case Value::Kind::Boolean:
        this->Bool(*value.boolean());
        return nullptr;
      case Value::Kind::Integer:
        this->Int64(*value.integer());
        return nullptr;
      case Value::Kind::UnsignedInteger:
        this->Uint64(*value.unsignedInteger());
        return nullptr;
      case Value::Kind::Real:
        return writeReal(*value.real());
      case Value::Kind::String:
        writeText(value.text());
        return nullptr;
      case Value::Kind::Data:
        return "data";
      case Value::Kind::Date:
        return "a date";
      case Value::Kind::Array:
        return writeArray(*value.array(), level);
      case Value::Kind::Dictionary:
        return writeDictionary(*value.dictionary(), level);
    }
    return "a value of unknown kind";
  }

 private:
  const char* writeArray(const Array& array, size_t level) {
    this->StartArray();
    for (const Value& element : array) {
      if (const char* problem = write(element, level + 1)) return problem;
    }
    this->EndArray();
    return nullptr;
  }

  const char* writeDictionary(const Dictionary& dictionary, size_t level) {
    this->StartObject();
    for (const DictionaryEntry& entry : dictionary) {
      writeText(entry.key.view());
      if (const char* problem = write(entry.value, level + 1)) return problem;
    }
    this->EndObject();
    return nullptr;
  }

  void writeText(std::string_view text) {
    if (isPlain(text)) {
      this->RawValue("\"", 1, rapidjson::kStringType);
      _stream.put(text);
      _stream.Put('"');
    } else if (utf8::isValid(text)) {
      this->String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
    } else {
      const std::string repaired = utf8::repaired(text);
      this->String(repaired.data(), static_cast<rapidjson::SizeType>(repaired.size()));
    }
  }

  // The shortest digits that read back as the same number, and a point or exponent so that it reads back as a real.
  const char* writeReal(double number) {
    if (!std::isfinite(number)) return "a number that is not finite";
    std::array<char, kLongestReal> digits;
    char* end = std::to_chars(digits.data(), digits.data() + digits.size() - 2, number).ptr;
    if (std::string_view(digits.data(), static_cast<size_t>(end - digits.data())).find_first_of(".e") ==
        std::string_view::npos) {
      *end++ = '.';
      *end++ = '0';
    }
    this->RawValue(digits.data(), static_cast<size_t>(end - digits.data()), rapidjson::kNumberType);
    return nullptr;
  }

  StringStream& _stream;
};

using CompactWriter = rapidjson::Writer<StringStream>;
using PrettyWriter = rapidjson::PrettyWriter<StringStream>;

const char* write(const Value& value, Style style, StringStream& stream) {
  if (style == Style::Compact) {
    ValueWriter<CompactWriter> writer(stream);
    return writer.write(value, 1);
  }
  ValueWriter<PrettyWriter> writer(stream);
  writer.layout().SetIndent(' ', kIndentation);
  return writer.write(value, 1);
}

}  // namespace

Result<std::string> serialize(const Value& value, Style style) {
  std::string text;
  if (const Result<void> appended = append(value, style, text); !appended) return appended.error();
  return text;
}

Result<void> append(const Value& value, Style style, std::string& buffer) {
  const size_t size = buffer.size();
  StringStream stream(buffer);
  if (const char* problem = write(value, style, stream)) {
    buffer.resize(size);
    return platformError(EINVAL, std::string("JSON cannot hold ") + problem);
  }
  stream.Flush();
  return {};
}

}  // namespace telvane::json
