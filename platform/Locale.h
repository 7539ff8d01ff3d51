#pragma once

#include <chrono>
#include <optional>

#include "foundation/Date.h"
#include "foundation/String.h"

namespace telvane {

// The place the device is set to. Safe from any thread.
class Locale {
 public:
  virtual ~Locale() = default;
  // The country code ("US"); nothing when none is set. Read anew at each call, since a setting can change.
  virtual std::optional<String> countryCode() const = 0;
  // Seconds east of Greenwich that the local time zone has at the given time.
  virtual std::chrono::seconds secondsFromGMT(Date date) const = 0;
};

}  // namespace telvane
