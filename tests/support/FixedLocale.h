#pragma once

#include <atomic>
#include <utility>

#include "platform/Locale.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// A place that the test sets. Safe from any thread.
class FixedLocale final : public Locale {
 public:
  explicit FixedLocale(std::optional<String> countryCode = String("US"),
                       std::chrono::seconds offset = std::chrono::seconds(0))
      : _countryCode(std::move(countryCode)), _offset(offset) {}

  void setCountryCode(std::optional<String> countryCode) {
    MutexLock lock(_mutex);
    _countryCode = std::move(countryCode);
  }
  void setSecondsFromGMT(std::chrono::seconds offset) { _offset = offset; }

  std::optional<String> countryCode() const override {
    MutexLock lock(_mutex);
    return _countryCode;
  }
  std::chrono::seconds secondsFromGMT(Date) const override { return _offset; }

 private:
  mutable Mutex _mutex;
  std::optional<String> _countryCode GUARDED_BY(_mutex);
  std::atomic<std::chrono::seconds> _offset;
};

}  // namespace telvane::testing
