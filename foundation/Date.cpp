#include "foundation/Date.h"

#include <fmt/format.h>

#include <cmath>

namespace telvane {
namespace {

constexpr double kMicrosecondsPerSecond = 1e6;
constexpr double kFirstUnrepresentable = 9223372036854775808.0;  // 2^63
constexpr int64_t kSecondsPerDay = 86400;

struct CivilDay {
  int64_t year;
  unsigned month;
  unsigned day;
};

int64_t floorDivide(int64_t number, int64_t divisor) { return number / divisor - (number % divisor < 0 ? 1 : 0); }

// Counts in eras of 400 years that begin on 1 March, so that a leap day is the last of its year. By hand, because the
// standard calendar stops at the year 32767 and a date from outside does not.
CivilDay civilDay(int64_t daysSince1970) {
  constexpr int64_t kDaysFromEraTo1970 = 719468;
  constexpr int64_t kDaysPerEra = 146097;
  const int64_t days = daysSince1970 + kDaysFromEraTo1970;
  const int64_t era = floorDivide(days, kDaysPerEra);
  const int64_t dayOfEra = days - era * kDaysPerEra;
  const int64_t yearOfEra = (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
  const int64_t dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
  const int64_t shiftedMonth = (5 * dayOfYear + 2) / 153;
  const auto day = static_cast<unsigned>(dayOfYear - (153 * shiftedMonth + 2) / 5 + 1);
  const auto month = static_cast<unsigned>(shiftedMonth < 10 ? shiftedMonth + 3 : shiftedMonth - 9);
  return {yearOfEra + era * 400 + (month <= 2 ? 1 : 0), month, day};
}

}  // namespace

Date Date::fromSecondsSince1970(double seconds) noexcept {
  const double microseconds = std::round(seconds * kMicrosecondsPerSecond);
  const bool representable = microseconds >= -kFirstUnrepresentable && microseconds < kFirstUnrepresentable;
  if (!representable) return Date();
  return Date(TimePoint(std::chrono::microseconds(static_cast<int64_t>(microseconds))));
}

double Date::secondsSince1970() const noexcept {
  return static_cast<double>(_time.time_since_epoch().count()) / kMicrosecondsPerSecond;
}

int64_t Date::wholeSeconds() const noexcept {
  return std::chrono::floor<std::chrono::seconds>(_time).time_since_epoch().count();
}

int32_t Date::microseconds() const noexcept {
  return static_cast<int32_t>((_time - std::chrono::floor<std::chrono::seconds>(_time)).count());
}

std::string Date::description() const {
  const int64_t seconds = wholeSeconds();
  const int64_t days = floorDivide(seconds, kSecondsPerDay);
  const int64_t secondOfDay = seconds - days * kSecondsPerDay;
  const CivilDay day = civilDay(days);
  return fmt::format("{:04}-{:02}-{:02} {:02}:{:02}:{:02} +0000", day.year, day.month, day.day, secondOfDay / 3600,
                     secondOfDay / 60 % 60, secondOfDay % 60);
}

}  // namespace telvane
