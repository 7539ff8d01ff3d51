#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "foundation/Value.h"

// JSON text (RFC 8259).
namespace telvane::json {

enum class Style { Compact, Pretty };

// Writes the value straight from its own storage, dictionaries in their order. Fails on what JSON has no form for:
// data, dates, absent values, non-finite numbers, nesting deeper than 64 levels. Invalid UTF-8 in text is replaced by
// U+FFFD, so the output is always valid. A boolean is true or false; a real keeps its point or exponent.
Result<std::string> serialize(const Value& value, Style style = Style::Compact);
// The same, appended to the buffer; what was appended before a failure is taken off again.
Result<void> append(const Value& value, Style style, std::string& buffer);

struct Limits {
  size_t maximumBytes = 16u << 20;
  size_t maximumDepth = 64;
};
// Parses one JSON text. null becomes an absent value inside arrays and drops the key inside objects; whole numbers
// become integers, others reals.
Result<Value> parse(std::string_view text, const Limits& limits = {});

}  // namespace telvane::json
