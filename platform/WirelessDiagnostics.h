#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "foundation/Value.h"

namespace telvane {

// An object of a class that a bundle of the system provides, which takes events to the wireless-diagnostics service.
// Owned by who made it; used by one thread at a time. What goes wrong in it is a line in the log, nothing more.
class WirelessDiagnosticsAdaptor {
 public:
  virtual ~WirelessDiagnosticsAdaptor() = default;
  // Names the object in log lines.
  virtual std::string description() const = 0;
  virtual bool respondsTo(std::string_view selector) const = 0;
  // Hands the message over. REQUIRES: respondsTo("sendMessageWithMethod:respCode:dict:").
  virtual void sendMessageWithMethod(uint16_t method, uint16_t respCode, const Dictionary& dict) = 0;
};

// A bundle that has been opened and loaded; owned by who opened it, outlives the adaptors that it made.
class WirelessDiagnosticsBundle {
 public:
  virtual ~WirelessDiagnosticsBundle() = default;
  // Makes one instance of the named class; null when the bundle has no such class or makes none.
  virtual std::unique_ptr<WirelessDiagnosticsAdaptor> newInstanceOfClass(std::string_view className) = 0;
};

// Opens bundles by path. Safe from any thread.
class WirelessDiagnostics {
 public:
  virtual ~WirelessDiagnostics() = default;
  // Opens the bundle and loads its code, unless that is loaded already. path: absolute, looked up below the instance's
  // root. Null when there is no such bundle (a line in the log) or its code is of no use (an error line).
  virtual std::unique_ptr<WirelessDiagnosticsBundle> openBundleAtPath(const std::string& path) = 0;
};

}  // namespace telvane
