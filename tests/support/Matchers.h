#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <strings.h>

#include <ostream>
#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "foundation/UUID.h"
#include "foundation/Value.h"
#include "platform/URLSession.h"
#include "tests/support/RecordingLog.h"

// How GoogleTest shows our types. Values are shown with their kinds, since true, 1 and 1.0 are three things.
namespace telvane {

void PrintTo(const Value& value, std::ostream* stream);
void PrintTo(const Dictionary& dictionary, std::ostream* stream);
void PrintTo(const Array& array, std::ostream* stream);
void PrintTo(const String& text, std::ostream* stream);
void PrintTo(const Key& key, std::ostream* stream);
void PrintTo(const Data& data, std::ostream* stream);
void PrintTo(const Date& date, std::ostream* stream);
void PrintTo(const UUID& uuid, std::ostream* stream);
void PrintTo(const Error& error, std::ostream* stream);
void PrintTo(const URLRequest& request, std::ostream* stream);
void PrintTo(const URLResponse& response, std::ostream* stream);

template <class T>
void PrintTo(const Result<T>& result, std::ostream* stream) {
  if (!result) {
    *stream << "failed: " << ::testing::PrintToString(result.error());
  } else if constexpr (std::is_void_v<T>) {
    *stream << "ok";
  } else {
    *stream << "ok: " << ::testing::PrintToString(*result);
  }
}

}  // namespace telvane

namespace telvane::testing {

void PrintTo(const LogLine& line, std::ostream* stream);

// EXPECT_TRUE(isOk(files.write(path, data))): the failure shows the error.
template <class T>
::testing::AssertionResult isOk(const Result<T>& result) {
  if (result) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << ::testing::PrintToString(result);
}

// EXPECT_TRUE(isError(files.read(path, 10), EFBIG)): the failure shows what came instead.
template <class T>
::testing::AssertionResult isError(const Result<T>& result, int64_t code, std::string_view part = "") {
  if (result) return ::testing::AssertionFailure() << "no error but " << ::testing::PrintToString(result);
  const Error& error = result.error();
  if (error.code() != code) {
    return ::testing::AssertionFailure() << "not code " << code << " but " << ::testing::PrintToString(error);
  }
  if (error.description().find(part) == std::string::npos) {
    return ::testing::AssertionFailure() << "no \"" << part << "\" in " << ::testing::PrintToString(error);
  }
  return ::testing::AssertionSuccess();
}

// The same as matchers, for results inside other things.
MATCHER(IsOk, negation ? "is an error" : "is ok") { return static_cast<bool>(arg); }
MATCHER_P(IsErrorCode, code, "") { return !arg && arg.error().code() == static_cast<int64_t>(code); }

// An Error, or an optional one, of that code.
MATCHER_P(HasCode, code, "") {
  if constexpr (requires { arg.has_value(); }) {
    return arg.has_value() && arg->code() == static_cast<int64_t>(code);
  } else {
    return arg.code() == static_cast<int64_t>(code);
  }
}

// A dictionary, or a value that is one, that has the value under the key. The value is given as anything that a Value
// can be made of: HasEntry(kCategory, 7).
class EntryMatcher {
 public:
  using is_gtest_matcher = void;
  EntryMatcher(std::string_view key, Value value) : _key(key), _value(std::move(value)) {}
  bool MatchAndExplain(const Dictionary& dictionary, ::testing::MatchResultListener* listener) const;
  bool MatchAndExplain(const Value& value, ::testing::MatchResultListener* listener) const;
  void DescribeTo(std::ostream* stream) const;
  void DescribeNegationTo(std::ostream* stream) const;

 private:
  std::string _key;
  Value _value;
};
EntryMatcher HasEntry(std::string_view key, Value value);

// A URLRequest, or a response, with that header; the name is compared without regard to case, the value by byte.
MATCHER_P2(HasHeader, name, value, "has the header " + std::string(name) + ": " + std::string(value)) {
  for (const auto& header : arg.headers) {
    if (::strcasecmp(header.name.c_str(), std::string(name).c_str()) == 0) {
      *result_listener << "whose value is \"" << header.value << "\"";
      return header.value == value;
    }
  }
  *result_listener << "which has no such header";
  return false;
}

// A log with a line of any level, or of that level, that contains the text; the failure shows the whole log.
::testing::AssertionResult hasLine(const RecordingLog& log, std::string_view part);
::testing::AssertionResult hasLine(const RecordingLog& log, LogLevel level, std::string_view part);
::testing::AssertionResult hasNoLine(const RecordingLog& log, std::string_view part);
// With exactly that many lines that contain the text.
::testing::AssertionResult hasLines(const RecordingLog& log, size_t count, std::string_view part);

}  // namespace telvane::testing
