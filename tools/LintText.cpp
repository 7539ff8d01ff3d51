#include "tools/LintText.h"

#include <fmt/format.h>

#include <algorithm>

#include "foundation/Description.h"
#include "platform/JSON.h"
#include "tools/VisibleText.h"

namespace telvane::linttext {
namespace {

constexpr size_t kLongestText = 60;  // bytes
constexpr size_t kLongestList = 8;

bool isPlain(char c) noexcept {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' || c == '-' ||
         c == '_' || c == '=';
}

// Cut between two characters.
std::string_view firstBytes(std::string_view text) noexcept {
  if (text.size() <= kLongestText) return text;
  size_t end = kLongestText;
  while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xC0) == 0x80) --end;
  return text.substr(0, end);
}

}  // namespace

std::string pathTo(std::string_view parent, std::string_view key) {
  const bool isBare = !key.empty() && key.size() <= kLongestText && std::all_of(key.begin(), key.end(), isPlain);
  const std::string name = isBare ? std::string(key) : quoted(key);
  return parent.empty() ? name : fmt::format("{}/{}", parent, name);
}

std::string pathTo(std::string_view parent, size_t index) { return fmt::format("{}[{}]", parent, index); }

std::string quoted(std::string_view text) {
  const std::string_view shown = firstBytes(text);
  const Result<std::string> json = json::serialize(Value(shown));
  std::string result = json.has_value() ? visibleText(*json) : std::string("\"\"");
  if (shown.size() < text.size()) result += "...";
  return result;
}

std::string shortForm(const Value& value) {
  if (value.isString()) return quoted(value.text());
  if (value.kind() == Value::Kind::Boolean) return *value.boolean() ? "true" : "false";
  return value.isNumber() ? description(value) : std::string(kindName(value));
}

std::string_view kindName(const Value& value) noexcept {
  switch (value.kind()) {
    case Value::Kind::None:
      return "null";
    case Value::Kind::Boolean:
      return "a boolean";
    case Value::Kind::Integer:
    case Value::Kind::UnsignedInteger:
    case Value::Kind::Real:
      return "a number";
    case Value::Kind::String:
      return "text";
    case Value::Kind::Data:
      return "data";
    case Value::Kind::Date:
      return "a date";
    case Value::Kind::Array:
      return "an array";
    case Value::Kind::Dictionary:
      return "a dictionary";
  }
  return {};
}

std::string listed(std::span<const std::string> names) {
  const auto shown = names.first(std::min(names.size(), kLongestList));
  const std::string text = fmt::format("{}", fmt::join(shown, ", "));
  return shown.size() == names.size() ? text : fmt::format("{} and {} more", text, names.size() - shown.size());
}

}  // namespace telvane::linttext
