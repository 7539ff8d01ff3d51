#pragma once

#include <gtest/gtest.h>

#include <string>

#include "foundation/Data.h"
#include "foundation/Description.h"
#include "foundation/Error.h"
#include "foundation/Value.h"

namespace telvane::testing {

// Whether the result is this value, kind by kind; the message shows both.
inline ::testing::AssertionResult holds(const Result<Value>& result, const Value& expected) {
  if (!result)
    return ::testing::AssertionFailure() << "expected " << description(expected) << ", got the error "
                                         << result.error().description();
  if (*result == expected) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << "expected " << description(expected) << " (kind "
                                       << static_cast<int>(expected.kind()) << "), got " << description(*result)
                                       << " (kind " << static_cast<int>(result->kind()) << ")";
}

// Whether the result is an error with this code.
template <class T>
::testing::AssertionResult failsWith(const Result<T>& result, int code) {
  if (result.has_value()) return ::testing::AssertionFailure() << "expected the error " << code << ", got a success";
  if (result.error().code() == code && !result.error().description().empty()) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << "expected the error " << code << ", got " << result.error().code() << ": "
                                       << result.error().description();
}

template <class T>
::testing::AssertionResult succeeds(const Result<T>& result) {
  if (result.has_value()) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << "expected a success, got the error " << result.error().description();
}

inline std::string textOf(const std::optional<String>& text) { return text ? text->str() : "(none)"; }

}  // namespace telvane::testing
