#include "tools/RepeatedKeys.h"

#include <algorithm>
#include <utility>

#include "platform/JSON.h"
#include "tools/LintText.h"

namespace telvane {
namespace {

constexpr std::string_view kBlanks = " \t\r\n";

// The five entities that XML has of itself; numbered ones are left as they are, the same in each of two equal keys.
std::string withoutEntities(std::string_view text) {
  constexpr std::pair<std::string_view, char> kEntities[] = {
      {"&amp;", '&'}, {"&lt;", '<'}, {"&gt;", '>'}, {"&quot;", '"'}, {"&apos;", '\''}};
  std::string result;
  while (!text.empty()) {
    size_t size = 1;
    char letter = text.front();
    for (const auto& [entity, meant] : kEntities) {
      if (!text.starts_with(entity)) continue;
      size = entity.size();
      letter = meant;
    }
    result += letter;
    text.remove_prefix(size);
  }
  return result;
}

}  // namespace

void RepeatedKeys::lint() {
  if (_rest.starts_with("bplist")) return;
  const size_t first = _rest.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return;
  if (_rest[first] == '{' || _rest[first] == '[') {
    lintJSON();
  } else {
    lintXML();
  }
}

std::string_view RepeatedKeys::takeUntil(std::string_view mark) {
  const size_t at = _rest.find(mark);
  const std::string_view taken = _rest.substr(0, at);
  _rest.remove_prefix(at != std::string_view::npos ? at + mark.size() : _rest.size());
  return taken;
}

// What stands between the marks is numbers, true, false and null, which no key can be.
void RepeatedKeys::lintJSON() {
  while (!_rest.empty()) {
    const char c = _rest.front();
    if (c == '"') {
      lintJSONText();
      continue;
    }
    _rest.remove_prefix(1);
    if (c == '{' || c == '[') open(c == '{');
    if (c == '}' || c == ']') close();
    if (c == '{' || c == ',') _isKeyNext = isInDictionary();
    if (c == ',') takeValue();
  }
}

void RepeatedKeys::lintJSONText() {
  size_t end = 1;
  while (end < _rest.size() && _rest[end] != '"') end += _rest[end] == '\\' ? 2 : 1;
  const std::string_view text = _rest.substr(0, end + 1);
  _rest.remove_prefix(std::min(end + 1, _rest.size()));
  if (!std::exchange(_isKeyNext, false)) return;
  const Result<Value> key = json::parse(text.size() > end ? "[" + std::string(text) + "]" : std::string("[]"));
  const Array* wrapped = key.has_value() ? key->array() : nullptr;
  takeKey(std::string(wrapped != nullptr ? (*wrapped)[0].text() : std::string_view()));
}

void RepeatedKeys::lintXML() {
  while (!_rest.empty()) {
    takeUntil("<");
    if (_rest.starts_with("!--")) {
      takeUntil("-->");
    } else if (_rest.starts_with("![CDATA[")) {
      takeUntil("]]>");
    } else if (_rest.starts_with("?") || _rest.starts_with("!")) {
      takeUntil(">");
    } else {
      const std::string_view tag = takeUntil(">");
      lintTag(tag.substr(0, tag.find_first_of(" \t\r\n/", 1)), tag.ends_with('/'));
    }
  }
}

void RepeatedKeys::lintTag(std::string_view name, bool isEmpty) {
  if (name == "plist" || name == "/plist") return;
  if (name == "dict" || name == "array") {
    open(name == "dict");
    if (!isEmpty) return;
    close();
    takeValue();
  } else if (name == "/dict" || name == "/array") {
    close();
    takeValue();
  } else if (name == "key") {
    takeKey(withoutEntities(isEmpty ? std::string_view() : takeUntil("</key>")));
  } else if (!name.starts_with('/')) {
    takeValue();
  }
}

std::string RepeatedKeys::nextPath() const {
  if (_open.empty()) return {};
  const Container& container = _open.back();
  if (!container.isDictionary) return linttext::pathTo(container.path, container.index);
  return linttext::pathTo(container.path, std::string_view(container.key));
}

void RepeatedKeys::open(bool isDictionary) {
  // The containers of a document that a parser took are no deeper than that; what is, has its finding elsewhere.
  constexpr size_t kMostLevels = 64;
  std::string path = _open.size() < kMostLevels ? nextPath() : std::string();
  _open.push_back({.isDictionary = isDictionary, .path = std::move(path)});
}

void RepeatedKeys::close() {
  if (!_open.empty()) _open.pop_back();
}

void RepeatedKeys::takeValue() {
  if (!_open.empty()) ++_open.back().index;
}

void RepeatedKeys::takeKey(std::string key) {
  if (!isInDictionary()) return;
  if (!_report.mayGoOn()) {
    _rest = {};
    return;
  }
  Container& dictionary = _open.back();
  dictionary.key = key;
  if (dictionary.keys.insert(std::move(key)).second) return;
  _report.error(nextPath(), "stands twice in its dictionary, of which only the last one counts; take one out");
}

}  // namespace telvane
