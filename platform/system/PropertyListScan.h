#pragma once

#include <string_view>

#include "foundation/Error.h"
#include "platform/PropertyList.h"

// Checks of a property list's structure before the property-list library reads it. The library recurses as deep as the
// list is nested and copies what is referred to twice, so lists from outside must be measured first; and it passes over
// much that is malformed.
namespace telvane::propertylist {

// Checks an XML property list: one root inside <plist>, only the known elements, properly nested, keys and values in
// turn, nothing behind the end, within the limits of depth and number.
Result<void> scanXML(std::string_view text, const Limits& limits);
// Checks a binary property list: every reference inside the file, no cycle, no kind that a Value cannot hold, within
// the limits of depth, number, and of four times the bytes once shared objects are written out.
Result<void> scanBinary(std::string_view bytes, const Limits& limits);

// What is wrong with a property list. code: EINVAL malformed, EFBIG too large, ELOOP too deep.
Error malformed(const std::string& reason);
Error tooLarge();
Error tooDeep();

}  // namespace telvane::propertylist
