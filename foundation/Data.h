#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "foundation/Export.h"

namespace telvane {

// An immutable, shared sequence of bytes. A value: copies share the bytes and are safe to read from any thread.
class TELVANE_EXPORT Data {
 public:
  Data() noexcept = default;
  // Takes the bytes over without copying them.
  explicit Data(std::vector<uint8_t> bytes);
  explicit Data(std::string bytes);
  static Data copyOf(std::string_view bytes);
  static Data copyOf(std::span<const uint8_t> bytes);

  // Never null, so that it may be given to functions that take a size of 0 with any pointer.
  const uint8_t* bytes() const noexcept { return reinterpret_cast<const uint8_t*>(view().data()); }
  size_t size() const noexcept { return view().size(); }
  bool empty() const noexcept { return size() == 0; }
  std::string_view view() const noexcept { return _bytes ? *_bytes : std::string_view(""); }

  // Describes the bytes as "<", lowercase hexadecimal pairs with a blank between groups of four bytes, ">".
  std::string description() const;

  friend bool operator==(const Data& a, const Data& b) noexcept { return a.view() == b.view(); }

 private:
  // The bytes' place; the object that owns them follows it in the same shared allocation.
  std::shared_ptr<const std::string_view> _bytes;
};

}  // namespace telvane
