#include "fuzz/FuzzInput.h"
#include "platform/Compression.h"

// The bytes as a compressed body never give more than the bound; the bytes as plain text survive the round trip.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  constexpr uint64_t kBound = 1u << 20;
  const std::string_view input = fuzz::text(data, size);
  if (const auto inflated = compression::inflate(input, kBound)) fuzz::require(inflated->size() <= kBound);
  if (input.empty()) return 0;
  const auto deflated = compression::deflate(compression::Framing::Gzip, input);
  fuzz::require(deflated.has_value());
  const auto restored = compression::inflate(deflated->view(), kBound);
  fuzz::require(restored && restored->view() == input);
  return 0;
}
