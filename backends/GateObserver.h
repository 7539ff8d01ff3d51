#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

#include "foundation/Value.h"

namespace telvane {

// The steps of an HTTPS backend's decision, in their order: gates that a session passes or not, and settings that are
// taken from the storebag on the way.
enum class Gate : uint8_t {
  ClientList,              // gate; tested: the number of entries
  Expedite,                // setting; tested: whether events are batched
  UserInfoRequired,        // setting; tested: yes or no. Without it every session is let through
  UserInfo,                // gate; tested: the user info
  EntryKind,               // gate of each entry, as the next three; against: what stands there instead
  ClientName,              // tested: the client's name
  ServiceName,             // tested: the service's name
  EnabledSince,            // tested: the framework's version
  MatchingEntry,           // gate; passed by the entry that decides, refused when there is none
  Consent,                 // gate; tested: whether the user consents, against: what overrides that
  Country,                 // gate; tested: the country code
  DeviceWhitelist,         // gate; tested: the product family
  DeviceBlacklist,         // gate; tested: the hardware type
  Filters,                 // gate; tested: the filters in force, as EventFilter::description() has them
  SamplingThreshold,       // setting; tested: the threshold
  PerCountryThreshold,     // setting; tested: the threshold, against: the item or the whole list
  Sampling,                // gate; tested: the sampling factor, against: the threshold
  OverrideSampling,        // gate of who did not pass the one before: sampled out if passed, disabled if refused
  EventThreshold,          // setting, as all that follow; tested: what is now in force
  ExtrasOnInternal,        // tested: a number
  CustomClientIdentifier,  // tested: yes or no
  PostURL,                 // tested: the address
  RealtimePostURL,         // tested: the address
  EventWhitelist,          // tested: the categories
  EventBlacklist,          // tested: the categories
  IncludeSessionID,        // tested: yes or no
  UseWiFiOnly,             // tested: yes or no
};

enum class GateOutcome : uint8_t {
  Passed,
  Refused,
  Taken,     // a setting that the section gives
  NotGiven,  // a setting that it does not give: what was in force stays, or its default
  Kept,      // a setting that this user's defaults override, so that the section is not asked
};

// How one step came out. Values are those of the decision itself, absent where there is none.
struct GateAnswer {
  Gate gate;
  GateOutcome outcome;
  Value tested;   // of the session and the device; of a setting what holds from now on
  Value against;  // what the section says
};

// Hears how a backend comes to its state, step by step, on the thread that has it decide. What it hears changes
// nothing.
class GateObserver {
 public:
  virtual ~GateObserver() = default;
  // Says which client entry the next steps are about, by its index; none for steps about the session as a whole.
  virtual void willLookAtEntry(std::optional<size_t> index) = 0;
  virtual void didAnswer(GateAnswer answer) = 0;
};

}  // namespace telvane
