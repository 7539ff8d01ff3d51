#include <algorithm>
#include <array>
#include <vector>

#include "platform/system/PropertyListScan.h"

namespace telvane::propertylist {
namespace {

constexpr std::string_view kBlanks = " \t\r\n";
constexpr std::string_view kWrapper = "plist";
constexpr std::string_view kDictionary = "dict";
constexpr std::string_view kArray = "array";
constexpr std::string_view kKey = "key";
constexpr std::array<std::string_view, 7> kLeaves = {"string", "integer", "real", "true", "false", "date", "data"};

bool isLeaf(std::string_view name) {
  return name == kKey || std::find(kLeaves.begin(), kLeaves.end(), name) != kLeaves.end();
}
bool isContainer(std::string_view name) { return name == kWrapper || name == kDictionary || name == kArray; }

// Reads the text strictly, so that any reader must see the structure that was measured.
class XMLScan {
 public:
  XMLScan(std::string_view text, const Limits& limits) : _rest(text), _limits(limits) {}

  Result<void> run() {
    do {
      if (!skipBetweenElements()) return malformed("a comment or declaration is wrong");
      const Result<void> step = _rest.starts_with("</") ? closeElement() : openElement();
      if (!step) return step;
    } while (!_open.empty());
    if (!skipBetweenElements()) return malformed("a comment or declaration is wrong");
    if (!_rest.empty()) return malformed("something follows the end");
    return {};
  }

 private:
  struct Element {
    std::string_view name;
    size_t children = 0;
  };

  // Skips the piece of text that begins with the opening and ends with the closing mark.
  bool skipEnclosed(std::string_view opening, std::string_view closing) {
    const size_t end = _rest.find(closing, opening.size());
    if (end == std::string_view::npos) return false;
    _rest.remove_prefix(end + closing.size());
    return true;
  }

  bool skipBetweenElements() {
    for (;;) {
      _rest.remove_prefix(std::min(_rest.find_first_not_of(kBlanks), _rest.size()));
      if (_rest.starts_with("<?")) {
        if (!skipEnclosed("<?", "?>")) return false;
      } else if (_rest.starts_with("<!--")) {
        if (!skipEnclosed("<!--", "-->")) return false;
      } else if (_rest.starts_with("<!DOCTYPE") && _open.empty()) {
        // Declarations inside could define entities, which no property list needs.
        const std::string_view declaration = _rest.substr(0, _rest.find('>'));
        if (declaration.find('[') != std::string_view::npos || !skipEnclosed("<!DOCTYPE", ">")) return false;
      } else {
        return true;
      }
    }
  }

  Result<void> openElement() {
    const size_t end = _rest.find('>');
    if (!_rest.starts_with('<') || end == std::string_view::npos) return malformed("an element is missing");
    std::string_view tag = _rest.substr(1, end - 1);
    _rest.remove_prefix(end + 1);
    const bool isEmpty = tag.ends_with('/');
    if (isEmpty) tag.remove_suffix(1);
    const std::string_view name = tag.substr(0, tag.find_first_of(kBlanks));
    if (!isContainer(name) && !isLeaf(name)) return malformed("an element is unknown");
    if (hasBadAttributes(name, tag.substr(name.size()))) return malformed("an element has attributes");
    if (const Result<void> counted = countIn(name); !counted) return counted;
    if (isLeaf(name)) return isEmpty ? Result<void>() : skipLeaf(name);
    _open.push_back({name});
    // The wrapper and the root take no level each: a scalar is 1 deep, as everywhere.
    if (_open.size() - 1 > _limits.maximumDepth) return tooDeep();
    return isEmpty ? close() : Result<void>();
  }

  // Only the wrapper has any (its version), and a slash or mark inside one would make readers disagree.
  static bool hasBadAttributes(std::string_view name, std::string_view attributes) {
    if (name == kWrapper) return attributes.find_first_of("</") != std::string_view::npos;
    return attributes.find_first_not_of(kBlanks) != std::string_view::npos;
  }

  // Counts the element as a child of the one it stands in, where it must have a place.
  Result<void> countIn(std::string_view name) {
    if (++_count > _limits.maximumNodes) return tooLarge();
    if (_open.empty()) return name == kWrapper ? Result<void>() : malformed("its root element is missing");
    if (name == kWrapper) return malformed("its root element stands twice");
    Element& parent = _open.back();
    const bool wantsKey = parent.name == kDictionary && parent.children % 2 == 0;
    if (wantsKey != (name == kKey)) return malformed(wantsKey ? "a key is missing" : "a key stands alone");
    if (parent.name == kWrapper && parent.children == 1) return malformed("it has two roots");
    if (isLeaf(name) && _open.size() > _limits.maximumDepth) return tooDeep();
    ++parent.children;
    return {};
  }

  Result<void> skipLeaf(std::string_view name) {
    for (;;) {
      const size_t mark = _rest.find('<');
      if (mark == std::string_view::npos) return malformed("it is cut short");
      _rest.remove_prefix(mark);
      if (_rest.starts_with("<![CDATA[")) {
        if (!skipEnclosed("<![CDATA[", "]]>")) return malformed("it is cut short");
      } else if (_rest.starts_with("<!--")) {
        if (!skipEnclosed("<!--", "-->")) return malformed("it is cut short");
      } else {
        return takeClosingTag(name) ? Result<void>() : malformed("an element does not end");
      }
    }
  }

  bool takeClosingTag(std::string_view name) {
    if (!_rest.starts_with("</") || !_rest.substr(2).starts_with(name)) return false;
    if (!_rest.substr(2 + name.size()).starts_with('>')) return false;
    _rest.remove_prefix(name.size() + 3);
    return true;
  }

  Result<void> closeElement() {
    if (_open.empty() || !takeClosingTag(_open.back().name)) return malformed("an element does not end");
    return close();
  }

  Result<void> close() {
    const Element closed = _open.back();
    _open.pop_back();
    if (closed.name == kWrapper && closed.children == 0) return malformed("it is empty");
    if (closed.name == kDictionary && closed.children % 2 != 0) return malformed("a key has no value");
    return {};
  }

  std::string_view _rest;
  const Limits& _limits;
  std::vector<Element> _open;
  size_t _count = 0;
};

}  // namespace

Result<void> scanXML(std::string_view text, const Limits& limits) { return XMLScan(text, limits).run(); }

}  // namespace telvane::propertylist
