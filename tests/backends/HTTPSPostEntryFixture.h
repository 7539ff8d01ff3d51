#pragma once

#include <string>

#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {

constexpr uint32_t kUnknown = TelvaneBackendStateUnknown;
constexpr uint32_t kDisabled = TelvaneBackendStateDisabled;
constexpr uint32_t kEnabled = TelvaneBackendStateEnabled;
constexpr uint32_t kSampledOut = TelvaneBackendStateSampledOut;

// A sampling threshold for some countries.
inline Dictionary thresholdIn(Value countries, Value threshold) {
  Dictionary item;
  item.set(kPerCountryCountry, std::move(countries));
  item.set(kPerCountryThreshold, std::move(threshold));
  return item;
}

// What the tests of a client entry share: where the backend of an entry sends.
class HTTPSPostEntryFixture : public BackendFixture {
 protected:
  // Where an ordinary and a real-time event go; "" for nowhere.
  std::string postURL() {
    backend().setBatchEvents(false);
    const size_t before = posts().count();
    send({});
    return posts().count() > before ? posts().lastRequest().url : "";
  }
  std::string realtimePostURL() {
    const size_t before = posts().count();
    send({}, 7, 2, 1);
    return posts().count() > before ? posts().lastRequest().url : "";
  }
};

}  // namespace telvane::testing
