#include "backends/WattbookBackend.h"

#include <string_view>

#include "platform/PowerLog.h"

namespace telvane {
namespace {

constexpr uint32_t kEventClass = 28;
constexpr std::string_view kEventName = "MediahostD-TVN";
constexpr Key kMethod{"method"};
constexpr Key kRespCode{"respCode"};
constexpr Key kEvent{"event"};

}  // namespace

std::shared_ptr<WattbookBackend> WattbookBackend::initWithName(const ProcessContext& context, const String& name,
                                                               const Value& profile,
                                                               const std::optional<String>& productFamily) {
  const Dictionary* const section = profile.dictionary();
  return std::shared_ptr<WattbookBackend>(new WattbookBackend(
      context, name, section != nullptr ? *section : Dictionary(), productFamily.value_or(String())));
}

WattbookBackend::WattbookBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily)
    : TelvaneBackend(context, std::move(name), std::move(profile), std::move(productFamily)) {}

std::optional<String> WattbookBackend::sendMessage(Dictionary message, Date, uint16_t method, uint16_t respCode,
                                                   uint16_t eventID) {
  if (method == 0 || message.empty()) return std::nullopt;
  message.set(kMethod, uint32_t{method});
  message.set(kRespCode, uint32_t{respCode});
  message.set(kEvent, uint32_t{eventID});
  _context.platform().powerLog.logRegisteredEvent(kEventClass, kEventName, message);
  return std::nullopt;
}

}  // namespace telvane
