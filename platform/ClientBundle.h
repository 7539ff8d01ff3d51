#pragma once

#include <optional>

#include "foundation/Data.h"
#include "foundation/String.h"

namespace telvane {

// The resources installed with the client library. Safe from any thread.
class ClientBundle {
 public:
  virtual ~ClientBundle() = default;
  // "CFBundleVersion" of the bundle's Info.plist; nothing when it is absent or no text.
  virtual std::optional<String> version() const = 0;
  // The bytes of the resource "publicKey.der"; nothing when it cannot be read. Read anew at each call.
  virtual std::optional<Data> publicKey() const = 0;
};

}  // namespace telvane
