#include "collector/DashboardEvent.h"
#include "fuzz/FuzzInput.h"
#include "platform/JSON.h"

// A datagram that is taken has the length that it says, can be written as JSON, and shows as one line.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace telvane;
  const auto event = DashboardEvent::decode({data, size});
  if (!event) return 0;
  fuzz::require(size >= 64 && event->text.size() == size - 64);
  fuzz::require(json::serialize(event->dictionary()).has_value());
  const std::string line = event->line();
  fuzz::require(line.find('\n') == std::string::npos && line.find('\x1b') == std::string::npos);
  return 0;
}
