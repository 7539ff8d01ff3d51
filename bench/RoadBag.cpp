#include "bench/RoadBag.h"

#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"

namespace telvane::bench {
namespace {

constexpr int kSessionCategory = 0;
constexpr size_t kListedCategories = 50;

Dictionary filter(const char* action, const char* key, const Array& values = {}) {
  Dictionary entry{{kFilterAction, action}, {kFilterKey, key}};
  if (values.size() > 0) entry.set(kFilterValue, values);
  return entry;
}

Dictionary filterForStatus(int status, const char* action, const char* key) {
  Dictionary entry = filter(action, key);
  entry.set(kFilterStatus, Value(status));
  return entry;
}

Array filters(BagRules rules) {
  return {
      // These change events: all, and every third.
      filter("remove", "isEncrypted"),
      filter("whitelistValues", "network", {"wifi", "ethernet"}),
      // These look at every event and let it be.
      filter("whitelistValues", "codec", {"opus", "aac", "amr", "pcm", "evs"}),
      filter("blacklistValues", "reason", {"password", "secret", "token"}),
      filterForStatus(2, "remove", "packetsLost"),
      filterForStatus(2, "sha256", "sequence"),
      // These are for what these events do not have, but for the digest where it is asked for.
      filter("sha256", rules == BagRules::FiltersWithDigest ? "callID" : "userID"),
      filter("remove", "location"),
      filter("remove", "contactName"),
      filter("blacklistValues", "networkName", {"guest", "private"}),
  };
}

Array whitelist() {
  Array categories{kSessionCategory};
  for (int category = 100; categories.size() + 1 < kListedCategories; ++category) categories.append(Value(category));
  // Last, so that a search from the front looks at all of them.
  categories.append(Value(kEventCategory));
  return categories;
}

}  // namespace

Dictionary roadBag(BagRules rules, const std::string& postURL) {
  Dictionary client{{kClientEntryPostURL, postURL},
                    {kClientEntryOverrideDNU, 1},
                    {kClientEntryLocaleWhitelist, Array{"US"}},
                    {kClientEntryFilters, Array{}},
                    {kClientEntrySamplingThreshold, 1.0}};
  if (rules != BagRules::None) {
    client.set(kClientEntryFilters, filters(rules));
    client.set(kClientEntryEventWhitelist, whitelist());
  }
  const Dictionary section{{kTelvaneBackendHTTPPost, Dictionary{{kProfileClients, Array{client}}}}};
  return {{kEnvironmentRelease, section}, {kStorebagVersion, "bench-1"}, {kStorebagRefreshCycle, 3600}};
}

}  // namespace telvane::bench
