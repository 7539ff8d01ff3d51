#include "platform/system/FileTimes.h"

#include <algorithm>

namespace telvane {
namespace {

Date dateOf(const statx_timestamp& time) {
  const auto sinceEpoch = std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
  return Date(Date::TimePoint(std::chrono::floor<std::chrono::microseconds>(sinceEpoch)));
}

}  // namespace

std::optional<Date> creationDateOf(const struct statx& status) {
  constexpr unsigned kReadAndWritten = STATX_ATIME | STATX_MTIME;
  if ((status.stx_mask & STATX_BTIME) != 0) return dateOf(status.stx_btime);
  if ((status.stx_mask & kReadAndWritten) != kReadAndWritten) return std::nullopt;
  return std::min(dateOf(status.stx_atime), dateOf(status.stx_mtime));
}

}  // namespace telvane
