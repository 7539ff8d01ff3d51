#include "platform/PropertyList.h"

#include <cerrno>

#include "platform/system/PlatformError.h"
#include "platform/system/PropertyListNode.h"
#include "platform/system/PropertyListScan.h"

namespace telvane::propertylist {
namespace {

constexpr size_t kMaximumDepth = 64;
constexpr std::string_view kBinaryMagic = "bplist";
constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
constexpr std::string_view kBlanks = " \t\r\n";

using ReadFunction = void (*)(const char* bytes, uint32_t size, plist_t* node);
using WriteFunction = void (*)(plist_t node, char** bytes, uint32_t* size);

Result<Value> read(ReadFunction function, std::string_view bytes, const Limits& limits) {
  const PlainNumbers plainNumbers;
  plist_t node = nullptr;
  function(bytes.data(), static_cast<uint32_t>(bytes.size()), &node);
  const OwnedNode owned(node);
  if (!owned) return malformed("its content is wrong");
  return fromNode(owned.get(), limits);
}

// Returns what the forms cannot hold in the value, or null.
const char* problemOf(const Value& value, size_t level) {
  if (level > kMaximumDepth) return "is nested deeper than 64 levels";
  if (!value.isPresent()) return "holds an absent value";
  if (value.text().find('\0') != std::string_view::npos) return "holds text with a null character";
  if (const Array* array = value.array()) {
    for (const Value& element : *array) {
      if (const char* problem = problemOf(element, level + 1)) return problem;
    }
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    for (const DictionaryEntry& entry : *dictionary) {
      if (entry.key.view().find('\0') != std::string_view::npos) return "holds a key with a null character";
      if (const char* problem = problemOf(entry.value, level + 1)) return problem;
    }
  }
  return nullptr;
}

struct BytesFree {
  void operator()(char* bytes) const noexcept { plist_to_bin_free(bytes); }
};

}  // namespace

Error malformed(const std::string& reason) { return platformError(EINVAL, "The data is no property list: " + reason); }

Error tooLarge() { return platformError(EFBIG, "The property list is too large"); }

Error tooDeep() { return platformError(ELOOP, "The property list is nested too deep"); }

Result<Value> parse(const Data& data, const Limits& limits) {
  std::string_view bytes = data.view();
  if (bytes.size() > limits.maximumBytes || bytes.size() > UINT32_MAX) return tooLarge();
  if (bytes.starts_with(kBinaryMagic)) {
    if (const Result<void> scanned = scanBinary(bytes, limits); !scanned) return scanned.error();
    return read(plist_from_bin, bytes, limits);
  }
  if (bytes.starts_with(kByteOrderMark)) bytes.remove_prefix(kByteOrderMark.size());
  const size_t start = bytes.find_first_not_of(kBlanks);
  if (start == std::string_view::npos || bytes[start] != '<') return malformed("it is neither binary nor XML");
  bytes.remove_prefix(start);
  if (bytes.find('\0') != std::string_view::npos) return malformed("it has a null character");
  if (const Result<void> scanned = scanXML(bytes, limits); !scanned) return scanned.error();
  return read(plist_from_xml, bytes, limits);
}

Result<Data> serialize(const Value& value, Format format) {
  if (const char* problem = problemOf(value, 1)) {
    return platformError(EINVAL, std::string("Cannot write a property list that ") + problem);
  }
  const PlainNumbers plainNumbers;
  const OwnedNode node(newNode(value));
  const WriteFunction function = format == Format::XML ? plist_to_xml : plist_to_bin;
  char* bytes = nullptr;
  uint32_t size = 0;
  function(node.get(), &bytes, &size);
  const std::unique_ptr<char, BytesFree> owned(bytes);
  if (!owned) return platformError(ENOMEM, "Cannot write the property list");
  return Data::copyOf(std::string_view(bytes, size));
}

}  // namespace telvane::propertylist
