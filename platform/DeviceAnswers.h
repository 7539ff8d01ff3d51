#pragma once

#include <optional>

#include "foundation/Key.h"
#include "foundation/String.h"

namespace telvane {

// What the device says of itself, one text per key. Safe from any thread; an answer does not change while the process
// lives.
class DeviceAnswers {
 public:
  virtual ~DeviceAnswers() = default;
  // Returns the answer, or nothing when the device has none.
  virtual std::optional<String> answer(const Key& key) const = 0;

  static constexpr Key kUniqueDeviceID{"UniqueDeviceID"};
  static constexpr Key kProductVersion{"ProductVersion"};
  static constexpr Key kBuildVersion{"BuildVersion"};
  static constexpr Key kHWModelStr{"HWModelStr"};
  static constexpr Key kSerialNumber{"SerialNumber"};
  static constexpr Key kProductType{"ProductType"};
  static constexpr Key kDeviceName{"DeviceName"};
  static constexpr Key kReleaseType{"ReleaseType"};
};

}  // namespace telvane
