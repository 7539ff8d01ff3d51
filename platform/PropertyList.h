#pragma once

#include <cstddef>

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "foundation/Value.h"

// Property lists in the XML and binary (bplist00) forms.
namespace telvane::propertylist {

enum class Format { XML, Binary };

struct Limits {
  size_t maximumBytes = 16u << 20;
  size_t maximumDepth = 64;
  // Values in all, counting one that a binary list refers to several times as often as it is referred to.
  size_t maximumNodes = 1u << 20;
};

// Parses either form. Anything else, anything over the limits, and trailing garbage is an error of
// kPlatformErrorDomain with a text that says what is wrong.
Result<Value> parse(const Data& data, const Limits& limits = {});
// An absent value, or one nested deeper than 64 levels, is an error, and so is text with a null character, which the
// forms have no way to write. Invalid UTF-8 in text is replaced by U+FFFD.
Result<Data> serialize(const Value& value, Format format);

// Conversion from and to a node of the property-list library (plist_t), for interfaces that speak it. The node given
// is borrowed; the node returned is the caller's (plist_free), null for an absent value. What a node cannot hold is
// left out of the new one (absent values in arrays, containers below the 64th level), text ends at a null character.
Result<Value> fromNode(void* node, const Limits& limits = {});
void* newNode(const Value& value);

}  // namespace telvane::propertylist
