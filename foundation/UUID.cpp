#include "foundation/UUID.h"

namespace telvane {

UUID UUID::fromRandomBytes(Bytes bytes) noexcept {
  bytes[6] = static_cast<uint8_t>((bytes[6] & 0x0f) | 0x40);
  bytes[8] = static_cast<uint8_t>((bytes[8] & 0x3f) | 0x80);
  return UUID(bytes);
}

std::string UUID::string() const {
  constexpr char kDigits[] = "0123456789ABCDEF";
  std::string text;
  text.reserve(36);
  for (size_t i = 0; i < _bytes.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += kDigits[_bytes[i] >> 4];
    text += kDigits[_bytes[i] & 15];
  }
  return text;
}

}  // namespace telvane
