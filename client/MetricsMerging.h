#pragma once

#include "foundation/Value.h"

namespace telvane {

// Adds what one module reports to the payload, key by key: the entries of a dictionary to a dictionary that is there
// (equal keys are replaced), the elements of an array behind those of an array that is there. In every other case the
// module's value stands under the key, instead of what was there.
void mergeMetrics(Dictionary& payload, const Dictionary& metrics);

}  // namespace telvane
