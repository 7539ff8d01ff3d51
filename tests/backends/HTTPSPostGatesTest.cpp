// What the gates of a client entry decide, and what they say of it.
#include <vector>

#include "interfaces/StorebagKeys.h"
#include "tests/backends/HTTPSPostEntryFixture.h"

namespace telvane::testing {
namespace {

// One row of the gates: how a device and a client entry that report are changed, and what comes of it.
struct Gate {
  const char* rule;
  std::vector<std::pair<Key, Value>> entry;  // an absent value takes the key away
  uint32_t state;
  std::string line;  // why, in the log; nothing where a gate is passed or refuses without a word
  bool consents = true;
  std::optional<String> country = String("US");
  std::optional<String> hardwareType = String("Box2,1");
};

// What the gates say when they refuse; the filters' line is an error and stands in its row.
constexpr const char* kRefusals[] = {"reporting disabled by DNU", "isn't in country code list",
                                     "isn't in device whitelist", "is in device blacklist", "filters are required"};

// The draw is 0.5, the version 8.1, the user info player and StreamMediaPlayer, the family TelvaneBox.
std::vector<Gate> gates() {
  const auto here = [](Value threshold) { return Value(Array{Value(thresholdIn(Array{"DE", "US"}, threshold))}); };
  return {
      // Which entry.
      {"this client among several, in any case", {{kClientEntryClient, "A,PLAYER"}}, kEnabled, ""},
      {"only the whole name", {{kClientEntryClient, "play"}}, kDisabled, ""},
      {"blanks belong to the name", {{kClientEntryClient, "A, player"}}, kDisabled, ""},
      {"a part of the service's name, in any case", {{kClientEntryService, "video,media"}}, kEnabled, ""},
      {"another service", {{kClientEntryService, "video,music"}}, kDisabled, ""},
      {"both must match", {{kClientEntryClient, "player"}, {kClientEntryService, "video"}}, kDisabled, ""},
      {"the same version", {{kClientEntryEnabledSince, "8.1.0"}}, kEnabled, ""},
      {"an older version", {{kClientEntryEnabledSince, "7.200.9"}}, kEnabled, ""},
      {"a newer minor version", {{kClientEntryEnabledSince, "8.1.1"}}, kDisabled, ""},
      {"a newer middle version", {{kClientEntryEnabledSince, "8.2"}}, kDisabled, ""},
      {"a newer major version", {{kClientEntryEnabledSince, "9"}}, kDisabled, ""},
      // Consent.
      {"consent reports", {}, kEnabled, ""},
      {"no consent does not", {}, kDisabled, "reporting disabled by DNU: 0.", false},
      {"unless overridden", {{kClientEntryOverrideDNU, 1}}, kEnabled, "", false},
      {"0 overrides nothing", {{kClientEntryOverrideDNU, 0}}, kDisabled, "reporting disabled by DNU: 0.", false},
      {"nor does any other number", {{kClientEntryOverrideDNU, 2}}, kDisabled, "reporting disabled by DNU: 2.", false},
      {"with consent it does not matter", {{kClientEntryOverrideDNU, 2}}, kEnabled, ""},
      // Country.
      {"a listed country", {{kClientEntryLocaleWhitelist, Array{"FR", "US"}}}, kEnabled, ""},
      {"in any case", {{kClientEntryLocaleWhitelist, Array{"us"}}}, kEnabled, ""},
      {"another country",
       {{kClientEntryLocaleWhitelist, Array{"FR"}}},
       kDisabled,
       "(US) isn't in country code list (\n    FR\n)"},
      {"no list", {{kClientEntryLocaleWhitelist, {}}}, kDisabled, "(US) isn't in country code list (null)"},
      {"an empty list", {{kClientEntryLocaleWhitelist, Array()}}, kDisabled, "(US) isn't in country code list (\n)"},
      {"a device without a country passes a list", {}, kEnabled, "", true, std::nullopt},
      {"but not an empty one",
       {{kClientEntryLocaleWhitelist, Array()}},
       kDisabled,
       "((null)) isn't in country code list (\n)",
       true,
       std::nullopt},
      // Device.
      {"a part of the product family", {{kClientEntryDeviceWhitelist, Array{"vaneb"}}}, kEnabled, ""},
      {"another family",
       {{kClientEntryDeviceWhitelist, Array{"Phone"}}},
       kDisabled,
       "(TelvaneBox) isn't in device whitelist (\n    Phone\n)"},
      {"an empty whitelist allows all", {{kClientEntryDeviceWhitelist, Array()}}, kEnabled, ""},
      {"a refused hardware type",
       {{kClientEntryDeviceBlacklist, Array{"box2"}}},
       kDisabled,
       "(Box2,1) is in device blacklist (\n    box2\n)"},
      {"another hardware type", {{kClientEntryDeviceBlacklist, Array{"Box3"}}}, kEnabled, ""},
      {"an empty blacklist refuses none", {{kClientEntryDeviceBlacklist, Array()}}, kEnabled, ""},
      {"any blacklist refuses a device that does not say what it is",
       {{kClientEntryDeviceBlacklist, Array{"Box3"}}},
       kDisabled,
       "((null)) is in device blacklist (\n    Box3\n)",
       true,
       String("US"),
       std::nullopt},
      // Filters.
      {"no filters", {{kClientEntryFilters, {}}}, kDisabled, "filters are required."},
      {"an empty list of them", {{kClientEntryFilters, Array()}}, kEnabled, ""},
      // Sampling.
      {"a threshold above the draw", {{kClientEntrySamplingThreshold, 0.6}}, kEnabled, ""},
      {"one equal to it", {{kClientEntrySamplingThreshold, 0.5}}, kSampledOut, ""},
      {"one below it", {{kClientEntrySamplingThreshold, 0.4}}, kSampledOut, ""},
      {"none", {{kClientEntrySamplingThreshold, {}}}, kDisabled, ""},
      {"the country's replaces it", {{kClientEntryPerCountrySamplingThresholds, here(0.25)}}, kSampledOut, ""},
      {"also a missing one",
       {{kClientEntrySamplingThreshold, {}}, {kClientEntryPerCountrySamplingThresholds, here(0.6)}},
       kEnabled,
       ""},
      {"a country without a threshold has none",
       {{kClientEntryPerCountrySamplingThresholds, here(Value())}},
       kDisabled,
       ""},
      {"another country's counts there",
       {{kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{"FR"}, 0.1))}}},
       kEnabled,
       ""},
      {"who is out stays out above a second threshold",
       {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.4}},
       kDisabled,
       ""},
      {"and at it", {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.5}}, kDisabled, ""},
      {"and waits to be promoted below it",
       {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.7}},
       kSampledOut,
       ""},
      {"who is in does not look at it",
       {{kClientEntrySamplingThreshold, 0.6}, {kClientEntryOverrideSampling, 0.1}},
       kEnabled,
       ""},
      // Their order: what comes first speaks.
      {"consent before country",
       {{kClientEntryLocaleWhitelist, {}}},
       kDisabled,
       "reporting disabled by DNU: 0.",
       false},
      {"country before device",
       {{kClientEntryLocaleWhitelist, Array{"FR"}}, {kClientEntryDeviceWhitelist, Array{"Phone"}}},
       kDisabled,
       "(US) isn't in country code list (\n    FR\n)"},
      {"device whitelist before blacklist",
       {{kClientEntryDeviceWhitelist, Array{"Phone"}}, {kClientEntryDeviceBlacklist, Array{"Box2"}}},
       kDisabled,
       "(TelvaneBox) isn't in device whitelist (\n    Phone\n)"},
      {"device before filters",
       {{kClientEntryDeviceBlacklist, Array{"Box2"}}, {kClientEntryFilters, {}}},
       kDisabled,
       "(Box2,1) is in device blacklist (\n    Box2\n)"},
  };
}

class HTTPSPostGatesTest : public HTTPSPostEntryFixture {};

TEST_F(HTTPSPostGatesTest, eachGateDecidesAndSaysWhy) {
  log().expectError("HTTPSPostBackend(updateBackendState): filters are required.");
  givenSamplingFactor(0.5);
  const Dictionary permissive = _client;
  for (const Gate& gate : gates()) {
    SCOPED_TRACE(gate.rule);
    _client = permissive;
    for (const auto& [key, value] : gate.entry) _client.set(key, value);
    process().consent().set(gate.consents);
    process().locale().setCountryCode(gate.country);
    _hardwareType = gate.hardwareType;
    log().clear();
    EXPECT_EQ(makeUndecidedBackend().updateState(), gate.state);
    if (!gate.line.empty()) {
      EXPECT_TRUE(hasLines(log(), 1, "HTTPSPostBackend(updateBackendState): " + gate.line));
    }
    size_t refusals = 0;
    for (const char* refusal : kRefusals) refusals += log().count(refusal);
    EXPECT_EQ(refusals, gate.line.empty() ? 0u : 1u) << log().text();
  }
}

}  // namespace
}  // namespace telvane::testing
