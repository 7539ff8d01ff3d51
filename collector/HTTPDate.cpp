#include "collector/HTTPDate.h"

#include <fmt/format.h>

#include <array>
#include <chrono>

namespace telvane {

std::string httpDate(Date date) {
  static constexpr std::array<const char*, 7> kDays = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
  static constexpr std::array<const char*, 12> kMonths = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                                          "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
  const auto seconds = std::chrono::floor<std::chrono::seconds>(date.time());
  const auto day = std::chrono::floor<std::chrono::days>(seconds);
  const std::chrono::year_month_day calendar(day);
  const std::chrono::hh_mm_ss time(seconds - day);
  return fmt::format("{}, {:02} {} {:04} {:02}:{:02}:{:02} GMT", kDays[std::chrono::weekday(day).c_encoding()],
                     static_cast<unsigned>(calendar.day()), kMonths[static_cast<unsigned>(calendar.month()) - 1],
                     static_cast<int>(calendar.year()), time.hours().count(), time.minutes().count(),
                     time.seconds().count());
}

}  // namespace telvane
