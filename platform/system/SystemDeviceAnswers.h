#pragma once

#include <array>
#include <string>

#include "foundation/Value.h"
#include "platform/DeviceAnswers.h"
#include "platform/Log.h"
#include "platform/system/Paths.h"

namespace telvane {

// What this machine tells of itself, read once at construction, and what /etc/telvane/device.plist says instead. An
// entry there that is no text counts as absent, with one error line.
//
//   UniqueDeviceID  40 hexadecimal digits made from /etc/machine-id, which itself never leaves the machine
//   ProductVersion  VERSION_ID of os-release, else the kernel's release
//   BuildVersion    BUILD_ID of os-release, else the kernel's release
//   HWModelStr      the board's name (DMI or device tree), else the machine's kind ("x86_64")
//   ProductType     the product's name (DMI or device tree), else "Linux"
//   DeviceName      the product's family (DMI), else as ProductType; not the host name, which people name themselves in
//   SerialNumber    the product's (DMI, which only root may read, or device tree), else "unknown"
//   ReleaseType     none
class SystemDeviceAnswers final : public DeviceAnswers {
 public:
  // systemRoot: in front of /etc, /usr, /sys and /proc when the machine is asked; empty but in tests.
  SystemDeviceAnswers(const Paths& paths, Log& log, const std::string& systemRoot = "");

  std::optional<String> answer(const Key& key) const override;

 private:
  Dictionary _answers;  // constant after construction
};

}  // namespace telvane
