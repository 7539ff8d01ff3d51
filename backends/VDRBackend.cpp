#include "backends/VDRBackend.h"

#include <string_view>
#include <utility>

#include "backends/ClientMessage.h"
#include "interfaces/ClientTypes.h"

namespace telvane {
namespace {

constexpr char kClientBundlePath[] =
    "/System/Library/PrivateFrameworks/Confluxa.framework/Frameworks/ZPHPerformance.framework";
constexpr std::string_view kAdaptorClass = "VDRAdaptor";
constexpr std::string_view kForwardingSelector = "sendMessageWithMethod:respCode:dict:";
constexpr uint32_t kNoClientType = 0;

}  // namespace

std::shared_ptr<VDRBackend> VDRBackend::initWithName(const ProcessContext& context, const String& name,
                                                     const Value& profile, const std::optional<String>& productFamily,
                                                     uint32_t clientType) {
  const Dictionary* const section = profile.dictionary();
  std::shared_ptr<VDRBackend> backend(
      new VDRBackend(context, name, section != nullptr ? *section : Dictionary(), productFamily.value_or(String())));
  const auto number = static_cast<int32_t>(clientType);
  context.log().message("VDRBackend(initWithName): Loading VDR adaptor class for client type {}", number);
  if (!isClientTypeAllowed(clientType)) {
    context.log().error("VDRBackend(initWithName): No matching bundle found for client type {}", number);
    return nullptr;
  }
  backend->loadAdaptor();
  return backend;
}

std::shared_ptr<VDRBackend> VDRBackend::initWithName(const ProcessContext& context, const String& name,
                                                     const Value& profile, const std::optional<String>& productFamily) {
  return initWithName(context, name, profile, productFamily, kNoClientType);
}

VDRBackend::VDRBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily)
    : TelvaneBackend(context, std::move(name), std::move(profile), std::move(productFamily)) {}

bool VDRBackend::isClientTypeAllowed(uint32_t clientType) noexcept { return hasWirelessDiagnostics(clientType); }

void VDRBackend::loadAdaptor() {
  _clientBundle = _context.platform().wirelessDiagnostics.openBundleAtPath(kClientBundlePath);
  if (_clientBundle != nullptr) _vdrAdaptor = _clientBundle->newInstanceOfClass(kAdaptorClass);
}

bool VDRBackend::adaptorRespondsTo(std::string_view selector) const {
  return _vdrAdaptor != nullptr && _vdrAdaptor->respondsTo(selector);
}

std::optional<String> VDRBackend::sendMessage(Dictionary blob, Date, uint16_t method, uint16_t respCode, uint16_t,
                                              uint32_t) {
  if (adaptorRespondsTo(kForwardingSelector)) {
    _vdrAdaptor->sendMessageWithMethod(method, respCode, sentByClient(std::move(blob)));
  } else {
    log().error("VDRBackend(sendMessage): VDR adaptor {} does not respond to forwarding selector {}",
                _vdrAdaptor != nullptr ? _vdrAdaptor->description() : "(null)", kForwardingSelector);
  }
  return std::nullopt;
}

}  // namespace telvane
