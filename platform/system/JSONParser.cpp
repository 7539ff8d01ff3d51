#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include <cerrno>
#include <charconv>
#include <cmath>
#include <optional>
#include <vector>

#include "platform/JSON.h"
#include "platform/system/PlatformError.h"

namespace telvane::json {
namespace {

// Iterative, so that depth costs no stack; text checked for valid UTF-8. Numbers come as text, because the library's
// own exact conversion of a zero with an exponent is undefined.
constexpr unsigned kFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseValidateEncodingFlag;

// Reads the whole text as this type of number; nothing when it does not fit.
template <class Number>
std::optional<Number> numberOf(std::string_view text) {
  Number number{};
  const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
  const bool isWhole = read.ec == std::errc() && read.ptr == text.data() + text.size();
  return isWhole ? std::optional(number) : std::nullopt;
}

// A real too small for any but 0 is 0; one too large for any is nothing.
std::optional<double> realOf(std::string_view text) {
  const std::optional<double> number = numberOf<double>(text);
  if (number) return std::isfinite(*number) ? number : std::nullopt;
  const size_t exponent = text.find_first_of("eE");
  const bool isTiny = exponent != std::string_view::npos && text.substr(exponent + 1).starts_with('-');
  return isTiny || text.starts_with("0.") || text.starts_with("-0.") ? std::optional(0.0) : std::nullopt;
}

// Builds the value from the reader's events. A false answer ends the reading.
class Builder {
 public:
  explicit Builder(size_t maximumDepth) noexcept : _maximumDepth(maximumDepth) {}

  bool Null() { return add(Value()); }
  bool Bool(bool value) { return add(value); }
  // Only RawNumber is asked for with these flags; the reader wants the others to be there.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(int64_t) { return false; }
  bool Uint64(uint64_t) { return false; }
  bool Double(double) { return false; }
  bool RawNumber(const char* text, rapidjson::SizeType size, bool) { return addNumber({text, size}); }
  bool String(const char* text, rapidjson::SizeType size, bool) { return add(std::string_view(text, size)); }
  bool StartObject() { return open(Dictionary()); }
  bool Key(const char* text, rapidjson::SizeType size, bool) {
    _open.back().key = telvane::String(std::string_view(text, size));
    return true;
  }
  bool EndObject(rapidjson::SizeType) { return close(); }
  bool StartArray() { return open(Array()); }
  bool EndArray(rapidjson::SizeType) { return close(); }

  Value takeRoot() { return std::move(_root); }
  // Why an answer was false, or null: the text is well-formed as far as it was read.
  const char* refusal() const noexcept { return _refusal; }
  int refusalCode() const noexcept { return _refusalCode; }

 private:
  // A container whose end has not come; one of the two is in use.
  struct Container {
    bool isDictionary;
    Dictionary dictionary;
    Array array;
    telvane::String key;  // of the next value
  };

  bool add(Value value) {
    if (_open.size() + 1 > _maximumDepth) return refuseDepth();
    if (_open.empty()) {
      _root = std::move(value);
    } else if (Container& container = _open.back(); container.isDictionary) {
      container.dictionary.set(container.key, std::move(value));
    } else {
      container.array.append(std::move(value));
    }
    return true;
  }

  template <class T>
  bool open(T) {
    if (_open.size() + 1 > _maximumDepth) return refuseDepth();
    _open.push_back({.isDictionary = std::is_same_v<T, Dictionary>});
    return true;
  }

  bool close() {
    Container closed = std::move(_open.back());
    _open.pop_back();
    return closed.isDictionary ? add(std::move(closed.dictionary)) : add(std::move(closed.array));
  }

  bool addNumber(std::string_view text) {
    if (const auto integer = numberOf<int64_t>(text)) return add(*integer);
    if (const auto integer = numberOf<uint64_t>(text)) return add(*integer);
    if (const auto real = realOf(text)) return add(*real);
    return refuse("The JSON text has a number that is out of range", EINVAL);
  }

  bool refuseDepth() { return refuse("The JSON text is nested too deep", ELOOP); }

  bool refuse(const char* reason, int code) {
    _refusal = reason;
    _refusalCode = code;
    return false;
  }

  const size_t _maximumDepth;
  const char* _refusal = nullptr;
  int _refusalCode = 0;
  std::vector<Container> _open;
  Value _root;
};

}  // namespace

Result<Value> parse(std::string_view text, const Limits& limits) {
  if (text.size() > limits.maximumBytes) return platformError(EFBIG, "The JSON text is too large");
  rapidjson::MemoryStream stream(text.data(), text.size());
  rapidjson::Reader reader;
  Builder builder(limits.maximumDepth);
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, builder);
  if (builder.refusal() != nullptr) return platformError(builder.refusalCode(), builder.refusal());
  if (result.IsError()) {
    return platformError(EINVAL, fmt::format("The text is no JSON: {} (at byte {})",
                                             rapidjson::GetParseError_En(result.Code()), result.Offset()));
  }
  // The reader takes a null character for the end of the text.
  if (stream.Tell() < text.size()) return platformError(EINVAL, "The text is no JSON: a null character");
  return builder.takeRoot();
}

}  // namespace telvane::json
