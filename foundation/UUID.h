#pragma once

#include <array>
#include <cstdint>
#include <string>

#include "foundation/Export.h"

namespace telvane {

// A 128-bit identifier (RFC 9562). A value; random ones come from Random::newUUID of the platform.
class TELVANE_EXPORT UUID {
 public:
  using Bytes = std::array<uint8_t, 16>;
  constexpr UUID() noexcept = default;
  constexpr explicit UUID(const Bytes& bytes) noexcept : _bytes(bytes) {}
  // Sets the version (4) and variant bits of random bytes.
  static UUID fromRandomBytes(Bytes bytes) noexcept;
  const Bytes& bytes() const noexcept { return _bytes; }
  // 36 characters, upper-case hexadecimal, groups of 8-4-4-4-12.
  std::string string() const;
  friend bool operator==(const UUID&, const UUID&) = default;

 private:
  Bytes _bytes{};
};

}  // namespace telvane
