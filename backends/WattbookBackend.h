#pragma once

#include <memory>
#include <optional>

#include "backends/TelvaneBackend.h"

namespace telvane {

// Writes events into the system's power log, for a caller that asks for it by the form without a flag. A session does
// not: its messages have a flag, and that form is the base's, which does nothing. Clients that send to this backend are
// told that it is enabled all the same.
class WattbookBackend final : public TelvaneBackend {
 public:
  // profile: of any kind, since nothing in it is read.
  static std::shared_ptr<WattbookBackend> initWithName(const ProcessContext& context, const String& name,
                                                       const Value& profile,
                                                       const std::optional<String>& productFamily);

  using TelvaneBackend::sendMessage;
  // Writes the message, with method, response code and event number added; nothing when the method is 0 or the message
  // is empty. Not to be taken for the base's form of five arguments, which ends with a flag of 32 bits. Always nothing.
  std::optional<String> sendMessage(Dictionary message, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID);

 private:
  WattbookBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily);
};

}  // namespace telvane
