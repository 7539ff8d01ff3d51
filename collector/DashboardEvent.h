#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "foundation/Date.h"
#include "foundation/Error.h"
#include "foundation/Value.h"

namespace telvane {

// One event as a dashboard's datagram carries it. A value.
struct DashboardEvent {
  uint8_t majorVersion = 0;
  uint8_t clientType = 0;
  Date time;  // with a resolution of 4 ms
  uint32_t sessionID = 0;
  uint16_t clientVersion = 0;
  uint16_t method = 0;
  uint16_t status = 0;
  std::string deviceIdentifier;
  uint16_t eventID = 0;
  bool isReliable = false;        // the sender waits for an acknowledgement
  bool isAddressedByBag = false;  // a storebag named this dashboard
  std::string text;               // the fields as they came: " key=value key=value"

  // Reads a datagram; an error that says what is wrong with it.
  static Result<DashboardEvent> decode(std::span<const uint8_t> datagram);

  // The event as the collector writes it, with the names that posted events have for the same things. What the text
  // holds stands under "fields", each value as text.
  Dictionary dictionary() const;
  // The same as one line for people: no control characters.
  std::string line() const;
};

// The fields of a text. An "=" that no backslash stands before ends a key, and the blank before the key ends the value
// before it; so keys with blanks do not come back whole. Of equal keys the last one counts.
Dictionary dashboardFields(std::string_view text);

}  // namespace telvane
