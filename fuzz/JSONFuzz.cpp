#include "fuzz/FuzzInput.h"
#include "platform/JSON.h"

// A text that is taken can be written again unless it holds what JSON has no form for, and what is written is taken and
// written in the same words.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  const auto value = json::parse(fuzz::text(data, size));
  if (!value) return 0;
  const auto written = json::serialize(*value);
  if (!written) return 0;
  const auto again = json::parse(*written);
  fuzz::require(again.has_value());
  const auto rewritten = json::serialize(*again);
  fuzz::require(rewritten && *rewritten == *written);
  return 0;
}
