#pragma once

#include <cstdint>

#include "foundation/Value.h"

namespace telvane::bench {

// The payload of event number i: ten fields of the kinds that clients send (names, counts, durations, identifiers),
// different from event to event.
Dictionary makePayload(uint64_t i);

}  // namespace telvane::bench
