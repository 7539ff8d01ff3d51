#include "tests/support/Matchers.h"

#include <fmt/format.h>
#include <strings.h>

#include "foundation/Description.h"

namespace telvane {

namespace {

constexpr size_t kDeepest = 64;

void print(const Value& value, std::ostream& stream, size_t depth);

void print(const Dictionary& dictionary, std::ostream& stream, size_t depth) {
  if (depth > kDeepest) {
    stream << "{...}";
    return;
  }
  const char* separator = "{";
  for (const DictionaryEntry& entry : dictionary) {
    stream << separator << entry.key.view() << ": ";
    print(entry.value, stream, depth + 1);
    separator = ", ";
  }
  stream << (dictionary.empty() ? "{}" : "}");
}

void print(const Array& array, std::ostream& stream, size_t depth) {
  if (depth > kDeepest) {
    stream << "[...]";
    return;
  }
  const char* separator = "[";
  for (const Value& value : array) {
    stream << separator;
    print(value, stream, depth + 1);
    separator = ", ";
  }
  stream << (array.empty() ? "[]" : "]");
}

void print(const Value& value, std::ostream& stream, size_t depth) {
  switch (value.kind()) {
    case Value::Kind::None:
      stream << "(absent)";
      return;
    case Value::Kind::Boolean:
      stream << (*value.boolean() ? "true" : "false");
      return;
    case Value::Kind::Integer:
      stream << *value.integer();
      return;
    case Value::Kind::UnsignedInteger:
      stream << *value.unsignedInteger() << "u";
      return;
    case Value::Kind::Real:
      stream << fmt::format("{:#}", *value.real());
      return;
    case Value::Kind::String:
      stream << '"' << value.text() << '"';
      return;
    case Value::Kind::Data:
      stream << value.data()->description();
      return;
    case Value::Kind::Date:
      stream << value.date()->description();
      return;
    case Value::Kind::Array:
      return print(*value.array(), stream, depth);
    case Value::Kind::Dictionary:
      return print(*value.dictionary(), stream, depth);
  }
}

void print(const std::vector<URLRequest::Header>& headers, std::ostream& stream) {
  for (const auto& header : headers) stream << "\n  " << header.name << ": " << header.value;
}

}  // namespace

void PrintTo(const Value& value, std::ostream* stream) { print(value, *stream, 1); }
void PrintTo(const Dictionary& dictionary, std::ostream* stream) { print(dictionary, *stream, 1); }
void PrintTo(const Array& array, std::ostream* stream) { print(array, *stream, 1); }
void PrintTo(const String& text, std::ostream* stream) { *stream << '"' << text.view() << '"'; }
void PrintTo(const Key& key, std::ostream* stream) { *stream << '"' << key.view() << '"'; }
void PrintTo(const Data& data, std::ostream* stream) { *stream << data.description(); }
void PrintTo(const Date& date, std::ostream* stream) {
  *stream << date.description() << fmt::format(" (.{:06})", date.microseconds());
}
void PrintTo(const UUID& uuid, std::ostream* stream) { *stream << uuid.string(); }

void PrintTo(const Error& error, std::ostream* stream) {
  *stream << error.domain().view() << " " << error.code() << " \"" << error.description() << "\"";
}

void PrintTo(const URLRequest& request, std::ostream* stream) {
  *stream << request.method << " " << request.url;
  print(request.headers, *stream);
  *stream << "\n  and " << request.body.size() << " bytes";
}

void PrintTo(const URLResponse& response, std::ostream* stream) {
  *stream << response.statusCode << " from " << response.url;
  print(response.headers, *stream);
}

}  // namespace telvane

namespace telvane::testing {

void PrintTo(const LogLine& line, std::ostream* stream) { *stream << line.text(); }

bool EntryMatcher::MatchAndExplain(const Dictionary& dictionary, ::testing::MatchResultListener* listener) const {
  const Value& present = dictionary[std::string_view(_key)];
  *listener << "which has " << ::testing::PrintToString(present) << " there";
  return present == _value;
}

bool EntryMatcher::MatchAndExplain(const Value& value, ::testing::MatchResultListener* listener) const {
  if (value.dictionary() != nullptr) return MatchAndExplain(*value.dictionary(), listener);
  *listener << "which is no dictionary";
  return false;
}

void EntryMatcher::DescribeTo(std::ostream* stream) const {
  *stream << "has under \"" << _key << "\" " << ::testing::PrintToString(_value);
}

void EntryMatcher::DescribeNegationTo(std::ostream* stream) const {
  *stream << "does not have under \"" << _key << "\" " << ::testing::PrintToString(_value);
}

EntryMatcher HasEntry(std::string_view key, Value value) { return EntryMatcher(key, std::move(value)); }

namespace {

::testing::AssertionResult judge(bool isRight, const RecordingLog& log, const std::string& complaint) {
  if (isRight) return ::testing::AssertionSuccess();
  const std::string text = log.text();
  return ::testing::AssertionFailure() << complaint << ":\n" << (text.empty() ? "(the log is empty)\n" : text);
}

}  // namespace

::testing::AssertionResult hasLine(const RecordingLog& log, std::string_view part) {
  return judge(log.contains(part), log, fmt::format("no line contains \"{}\"", part));
}

::testing::AssertionResult hasLine(const RecordingLog& log, LogLevel level, std::string_view part) {
  return judge(log.count(level, part) != 0, log, fmt::format("no line of that level contains \"{}\"", part));
}

::testing::AssertionResult hasNoLine(const RecordingLog& log, std::string_view part) {
  return judge(!log.contains(part), log, fmt::format("a line contains \"{}\"", part));
}

::testing::AssertionResult hasLines(const RecordingLog& log, size_t count, std::string_view part) {
  const size_t found = log.count(part);
  return judge(found == count, log, fmt::format("{} lines, not {}, contain \"{}\"", found, count, part));
}

}  // namespace telvane::testing
