#pragma once

#include "foundation/Value.h"

namespace telvane {

// What the client sent with a message. A session wraps it and lays beside it what the hierarchy shares, which other
// clients may have put there; a message without a payload is then one of shared data alone, and the client sent
// nothing. Returns any other dictionary, such as a one-shot message, as it is: it was not wrapped.
Dictionary sentByClient(Dictionary blob);

}  // namespace telvane
