#pragma once

#include "foundation/Data.h"
#include "foundation/Error.h"
#include "foundation/Value.h"
#include "platform/PropertyList.h"

// A value as one file or request body that says of itself what it is: a binary property list with one dictionary,
//
//   "$version"  integer    1
//   "root"      any value  what was archived
//
// and nothing else. Whoever changes the layout raises the version; readers refuse a version that they do not know.
namespace telvane::keyedarchive {

inline constexpr int64_t kVersion = 1;

// An absent value is an error, and so is what a property list cannot hold: more than 63 levels, text with a null
// character. Errors are those of propertylist::serialize.
Result<Data> archive(const Value& root);
// Returns what was archived. Besides the errors of propertylist::parse: EINVAL for a list that is no archive, ENOTSUP
// for one of another version.
Result<Value> unarchive(const Data& archive, const propertylist::Limits& limits = {});

}  // namespace telvane::keyedarchive
