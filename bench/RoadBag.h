#pragma once

#include <string>

#include "foundation/Value.h"

namespace telvane::bench {

// The category of all events that are measured.
inline constexpr int kEventCategory = 11;

// What a bag of the measurements does with an event on its way.
enum class BagRules {
  None,
  // 10 filters and a white list of 50 categories. The filters use every action; two change events (one all of them, one
  // every third), some look at every event in vain, some are for what these events do not have. What is left of an
  // event is about as large as without them, so that its cost can be compared with that of one without.
  FiltersAndWhitelist,
  // The same, but one of the filters replaces a field of every event by its digest: 64 characters that nothing
  // compresses.
  FiltersWithDigest,
};

// A bag with one HTTPS backend that posts to the URL. Consent is overridden, as in a bag for a fleet that has agreed by
// contract; with it no event text is kept on the device. A session's own messages stand in the white list, too.
Dictionary roadBag(BagRules rules, const std::string& postURL);

}  // namespace telvane::bench
