#include "foundation/Description.h"

#include <algorithm>
#include <charconv>
#include <limits>
#include <string_view>
#include <vector>

#include "foundation/ShortDescription.h"

namespace telvane {
namespace {

constexpr size_t kDeepestDescribed = 64;
constexpr size_t kIndentation = 4;

bool isBareCharacter(char c) {
  const bool isAlphanumeric = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
  return isAlphanumeric || c == '_' || c == '.' || c == '/' || c == '$';
}

template <class Number>
void appendNumber(std::string& text, Number number) {
  char buffer[40];
  const auto result = std::to_chars(std::begin(buffer), std::end(buffer), number);
  text.append(buffer, result.ptr);
}

constexpr size_t kUnlimited = std::numeric_limits<size_t>::max() - 1;
constexpr std::string_view kEllipsis = "...";

// Writes one description; the text so far and how deep in containers it stands. Stops soon behind the limit.
class Describer {
 public:
  explicit Describer(size_t limit = kUnlimited) noexcept : _limit(limit) {}
  void describe(const Value& value);
  void describeArray(const Array& array);
  void describeDictionary(const Dictionary& dictionary);
  void describeText(std::string_view text);
  void describeData(const Data& data);
  // Cuts what stands behind the limit.
  std::string take();

 private:
  void appendQuoted(std::string_view text);
  bool isTooDeep();
  bool isFull() const noexcept { return _text.size() > _limit; }
  // Of what is still to be described, as many bytes as make the text full for sure.
  std::string_view within(std::string_view bytes) const noexcept {
    return isFull() ? std::string_view() : bytes.substr(0, _limit - _text.size() + 1);
  }
  void beginLine() { _text.append(_depth * kIndentation, ' '); }

  const size_t _limit;
  std::string _text;
  size_t _depth = 0;
};

void Describer::describe(const Value& value) {
  switch (value.kind()) {
    case Value::Kind::None:
      _text += "(null)";
      break;
    case Value::Kind::Boolean:
    case Value::Kind::Integer:
      appendNumber(_text, value.integerValue());
      break;
    case Value::Kind::UnsignedInteger:
      appendNumber(_text, value.unsignedValue());
      break;
    case Value::Kind::Real:
      appendNumber(_text, value.realValue());
      break;
    case Value::Kind::String:
      describeText(value.text());
      break;
    case Value::Kind::Data:
      describeData(*value.data());
      break;
    case Value::Kind::Date:
      describeText(value.date()->description());
      break;
    case Value::Kind::Array:
      describeArray(*value.array());
      break;
    case Value::Kind::Dictionary:
      describeDictionary(*value.dictionary());
      break;
  }
}

void Describer::describeArray(const Array& array) {
  if (isTooDeep()) return;
  _text += "(\n";
  ++_depth;
  for (const Value& value : array) {
    if (isFull()) return;
    if (&value != array.begin()) _text += ",\n";
    beginLine();
    describe(value);
  }
  --_depth;
  if (!array.empty()) _text += '\n';
  beginLine();
  _text += ')';
}

void Describer::describeDictionary(const Dictionary& dictionary) {
  if (isTooDeep()) return;
  std::vector<const DictionaryEntry*> entries;
  entries.reserve(dictionary.size());
  for (const DictionaryEntry& entry : dictionary) entries.push_back(&entry);
  const auto isBefore = [](const auto* a, const auto* b) { return a->key < b->key; };
  if (entries.size() > _limit) {  // no more are shown than fit in
    std::partial_sort(entries.begin(), entries.begin() + static_cast<std::ptrdiff_t>(_limit), entries.end(), isBefore);
  } else {
    std::sort(entries.begin(), entries.end(), isBefore);
  }
  _text += "{\n";
  ++_depth;
  for (const DictionaryEntry* entry : entries) {
    if (isFull()) return;
    beginLine();
    describeText(entry->key);
    _text += " = ";
    describe(entry->value);
    _text += ";\n";
  }
  --_depth;
  beginLine();
  _text += '}';
}

void Describer::describeText(std::string_view text) {
  const bool isBare = _depth == 0 || (!text.empty() && std::all_of(text.begin(), text.end(), isBareCharacter));
  if (isBare) {
    _text += within(text);
  } else {
    appendQuoted(within(text));
  }
}

void Describer::describeData(const Data& data) {
  const std::string_view shown = within(data.view());
  _text += shown.size() == data.size() ? data.description() : Data::copyOf(shown).description();
}

void Describer::appendQuoted(std::string_view text) {
  _text += '"';
  for (const char c : text) {
    switch (c) {
      case '"':
        _text += "\\\"";
        break;
      case '\\':
        _text += "\\\\";
        break;
      case '\n':
        _text += "\\n";
        break;
      case '\r':
        _text += "\\r";
        break;
      case '\t':
        _text += "\\t";
        break;
      default:
        _text += c;
    }
  }
  _text += '"';
}

bool Describer::isTooDeep() {
  if (_depth < kDeepestDescribed) return false;
  _text += kEllipsis;
  return true;
}

std::string Describer::take() {
  if (!isFull()) return std::move(_text);
  const auto isContinuation = [](char c) { return (static_cast<unsigned char>(c) & 0xC0) == 0x80; };
  size_t end = _limit;
  while (end > 0 && isContinuation(_text[end])) --end;
  _text.resize(end);
  _text += kEllipsis;
  return std::move(_text);
}

}  // namespace

std::string description(const Value& value) {
  Describer describer;
  describer.describe(value);
  return describer.take();
}

std::string shortDescription(const Value& value, size_t limit) {
  Describer describer(limit);
  describer.describe(value);
  return describer.take();
}

std::string description(const Dictionary& dictionary) {
  Describer describer;
  describer.describeDictionary(dictionary);
  return describer.take();
}

std::string description(const Array& array) {
  Describer describer;
  describer.describeArray(array);
  return describer.take();
}

}  // namespace telvane
