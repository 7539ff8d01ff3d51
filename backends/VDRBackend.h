#pragma once

#include <memory>
#include <optional>

#include "backends/TelvaneBackend.h"
#include "platform/WirelessDiagnostics.h"

namespace telvane {

// Hands each event, as the client sent it, to an adaptor that a bundle of the system provides for its
// wireless-diagnostics service. Reads nothing in its section, and asks for nobody's consent: what becomes of the events
// is the service's affair. On a system without the adaptor each event is lost, with an error line.
//
// The adaptor is used on the session's queue; a slow one holds up its session.
class VDRBackend final : public TelvaneBackend {
 public:
  // Makes the backend; null, with an error line, for a client type that the service does not take. profile: of any
  // kind, since nothing in it is read.
  static std::shared_ptr<VDRBackend> initWithName(const ProcessContext& context, const String& name,
                                                  const Value& profile, const std::optional<String>& productFamily,
                                                  uint32_t clientType);
  // The same with client type 0, which is none that is taken: always null.
  static std::shared_ptr<VDRBackend> initWithName(const ProcessContext& context, const String& name,
                                                  const Value& profile, const std::optional<String>& productFamily);
  static bool isClientTypeAllowed(uint32_t clientType) noexcept;

  using TelvaneBackend::sendMessage;
  // Always nothing.
  std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID, uint32_t flag) override;

 private:
  VDRBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily);
  void loadAdaptor();
  bool adaptorRespondsTo(std::string_view selector) const;

  // Constant after creation; both may be null.
  std::unique_ptr<WirelessDiagnosticsBundle> _clientBundle;
  std::unique_ptr<WirelessDiagnosticsAdaptor> _vdrAdaptor;
};

}  // namespace telvane
