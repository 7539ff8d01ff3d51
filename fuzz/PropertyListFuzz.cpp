#include "fuzz/FuzzInput.h"
#include "platform/PropertyList.h"

// A list that is taken can be written in the binary form, and that is taken again.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  const auto value = propertylist::parse(Data::copyOf(fuzz::text(data, size)));
  if (!value) return 0;
  const auto written = propertylist::serialize(*value, propertylist::Format::Binary);
  if (!written) return 0;
  fuzz::require(propertylist::parse(*written).has_value());
  return 0;
}
