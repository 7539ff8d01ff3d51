#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

// What every fuzz target begins with: libFuzzer calls it with the bytes of one attempt.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace telvane::fuzz {

inline std::string_view text(const uint8_t* data, size_t size) { return {reinterpret_cast<const char*>(data), size}; }

// Ends the attempt as a finding. Not an assertion, so that it works in every build.
inline void require(bool holds) {
  if (!holds) std::abort();
}

}  // namespace telvane::fuzz
