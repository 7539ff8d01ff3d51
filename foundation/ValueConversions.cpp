// The lenient conversions of Value.
#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <string_view>
#include <system_error>

#include "foundation/Value.h"

namespace telvane {
namespace {

constexpr double kFirstAboveInteger = 9223372036854775808.0;  // 2^63

bool isDigit(char c) { return c >= '0' && c <= '9'; }

std::string_view withoutLeadingBlanks(std::string_view text) {
  const size_t start = text.find_first_not_of(" \t\n\v\f\r");
  return start == std::string_view::npos ? std::string_view() : text.substr(start);
}

struct SignedText {
  bool isNegative = false;
  std::string_view magnitude;  // what follows blanks and at most one sign
};

SignedText splitSign(std::string_view text) {
  text = withoutLeadingBlanks(text);
  if (text.empty() || (text[0] != '-' && text[0] != '+')) return {false, text};
  return {text[0] == '-', text.substr(1)};
}

int64_t integerFromReal(double real) {
  if (std::isnan(real)) return 0;
  if (real >= kFirstAboveInteger) return std::numeric_limits<int64_t>::max();
  if (real < -kFirstAboveInteger) return std::numeric_limits<int64_t>::min();
  return static_cast<int64_t>(real);
}

int64_t integerFromText(std::string_view text) {
  const SignedText number = splitSign(text);
  uint64_t magnitude = 0;
  const char* end = number.magnitude.data() + number.magnitude.size();
  const auto result = std::from_chars(number.magnitude.data(), end, magnitude);
  if (result.ec == std::errc::result_out_of_range) magnitude = std::numeric_limits<uint64_t>::max();
  constexpr auto kLargest = static_cast<uint64_t>(std::numeric_limits<int64_t>::max());
  if (!number.isNegative) return static_cast<int64_t>(std::min(magnitude, kLargest));
  return magnitude > kLargest ? std::numeric_limits<int64_t>::min() : -static_cast<int64_t>(magnitude);
}

// Tells for a number out of range whether it is too large rather than too near to 0.
bool isTooLarge(std::string_view number) {
  const size_t exponent = number.find_first_of("eE");
  if (exponent != std::string_view::npos) return number.substr(exponent + 1, 1) != "-";
  return number[0] != '0' && number[0] != '.';
}

double realFromText(std::string_view text) {
  const SignedText number = splitSign(text);
  const std::string_view magnitude = number.magnitude;
  const bool beginsWithDigit = !magnitude.empty() && (isDigit(magnitude[0]) || magnitude[0] == '.');
  if (!beginsWithDigit) return 0;  // from_chars would read "inf" and "nan", too
  double real = 0;
  const auto [end, error] = std::from_chars(magnitude.data(), magnitude.data() + magnitude.size(), real);
  if (error == std::errc::result_out_of_range) {
    const std::string_view read(magnitude.data(), static_cast<size_t>(end - magnitude.data()));
    real = isTooLarge(read) ? std::numeric_limits<double>::infinity() : 0;
  }
  return number.isNegative ? -real : real;
}

bool booleanFromText(std::string_view text) {
  std::string_view rest = splitSign(text).magnitude;
  const size_t start = rest.find_first_not_of('0');
  if (start == std::string_view::npos) return false;
  const char c = rest[start];
  return c == 'Y' || c == 'y' || c == 'T' || c == 't' || isDigit(c);
}

}  // namespace

int64_t Value::integerValue() const noexcept {
  switch (_kind) {
    case Kind::Boolean:
    case Kind::Integer:
    case Kind::UnsignedInteger:
      return integerBits();
    case Kind::Real:
      return integerFromReal(realBits());
    case Kind::String:
      return integerFromText(_string);
    default:
      return 0;
  }
}

double Value::realValue() const noexcept {
  switch (_kind) {
    case Kind::Boolean:
    case Kind::Integer:
      return static_cast<double>(integerBits());
    case Kind::UnsignedInteger:
      return static_cast<double>(_raw.first);
    case Kind::Real:
      return realBits();
    case Kind::String:
      return realFromText(_string);
    default:
      return 0;
  }
}

bool Value::booleanValue() const noexcept {
  switch (_kind) {
    case Kind::Boolean:
    case Kind::Integer:
    case Kind::UnsignedInteger:
      return _raw.first != 0;
    case Kind::Real:
      return realBits() != 0 && !std::isnan(realBits());
    case Kind::String:
      return booleanFromText(_string);
    default:
      return false;
  }
}

}  // namespace telvane
