#include "foundation/Base64.h"
#include "fuzz/FuzzInput.h"

// What was decoded, encoded again, decodes to the same bytes.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  const auto decoded = base64DecodeIgnoringUnknownCharacters(fuzz::text(data, size));
  if (!decoded) return 0;
  const auto again = base64DecodeIgnoringUnknownCharacters(base64Encode({decoded->bytes(), decoded->size()}));
  fuzz::require(again && *again == *decoded);
  return 0;
}
