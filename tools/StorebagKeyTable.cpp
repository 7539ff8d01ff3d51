#include "tools/StorebagKeyTable.h"

#include <algorithm>
#include <numeric>
#include <vector>

#include "interfaces/StorebagKeys.h"

namespace telvane {
namespace {

using Shape = StorebagShape;
using enum StorebagPresence;

constexpr StorebagKey kEnvelopeKeys[] = {
    {kEnvelopeBag, Shape::Base64, Required, "the bag is refused", "The bag itself, a property list.",
     "It is unpacked once the signature has proved good. Characters that are no base64 are passed over, so lines may "
     "be "
     "wrapped."},
    {kEnvelopeSignature, Shape::Base64, Required, "the bag is refused",
     "The RSA signature (PKCS#1 v1.5 with SHA-1) of the bytes under `bag`.",
     "It is checked at every load, from the network and from the cache, against the key of the client bundle."},
};

constexpr StorebagKey kBagKeys[] = {
    {kStorebagVersion, Shape::Text, Required, "sessions report no version", "The name of this edition of the bag.",
     "Sessions report it when they end (`StorebagVersion`). Give every bag that you publish a new one."},
    {kStorebagRefreshCycle, Shape::RefreshSeconds, Optional, "the `max-age` of the server's answer, else 86400",
     "How long the daemon uses the section in memory before it looks for a newer bag.",
     "It stands above the server's `max-age`. More than 86400 counts as 86400."},
    {kStorebagReleaseTimeout, Shape::TimeoutSeconds, Optional, "30",
     "How long the connection to the collector is kept when the last session of a client and service has gone.",
     "0 keeps it until the daemon ends."},
    {kStorebagSharedValues, Shape::Macros, Optional, "no macros",
     "The macros: from a name that begins with `==` to a value.",
     "Texts in the environment sections that name a macro are replaced by its value; see [Macros](#macros)."},
    {kEnvironmentDevelopment, Shape::Section, Optional, "devices of this environment get no bag",
     "The section of devices in the environment 1, for development.", "From a backend's name to its profile."},
    {kEnvironmentInternal, Shape::Section, Optional, "devices of this environment get no bag",
     "The section of devices in the environment 2, the house's own; internal builds unless they are set otherwise.",
     "From a backend's name to its profile."},
    {kEnvironmentSeed, Shape::Section, Optional, "devices of this environment get `release`, with an error line",
     "The section of devices in the environment 3, for a release before the release.",
     "From a backend's name to its profile."},
    {kEnvironmentRelease, Shape::Section, Required, "customers' devices get no bag",
     "The section of devices in the environment 4: everybody's, unless they are set otherwise.",
     "From a backend's name to its profile."},
};

constexpr StorebagKey kHTTPSProfileKeys[] = {
    {kProfileClients, Shape::ClientEntries, Required, "no backend is made", "Who reports, what, how and where to.",
     "The first entry that fits the session decides alone; see [The gates](#the-gates). An empty array makes no "
     "backend."},
    {kProfileDisplayURL, Shape::DisplayURL, Optional, "none", "Where a person can look at what is reported.",
     "Handed to a client that asks for it. Nothing is sent there."},
};

constexpr StorebagKey kClientEntryKeys[] = {
    {kClientEntryClient, Shape::Names, Optional, "all clients", "The clients that the entry is for.",
     "The session's client name must be one of these, whole, without regard to case; a blank beside a comma belongs to "
     "the name. A session without a client name fits only entries without this key."},
    {kClientEntryService, Shape::Names, Optional, "all services", "The services that the entry is for.",
     "The session's service name must contain one of these, without regard to case: `media` fits "
     "`StreamMediaPlayer`. A session without a service name fits only entries without this key."},
    {kClientEntryEnabledSince, Shape::Version, Optional, "all versions",
     "The lowest version of the client framework that the entry is for.",
     "Older devices pass the entry over and look at the next. Each part is 0 to 255, a missing one is 0."},
    {kClientEntryExpedite, Shape::Switch, Optional, "what the client asked for",
     "Whether events go one by one (1) or in batches (0).",
     "Only the first entry that fits client and service is asked, whatever its `enabledSince` says."},
    {kClientEntryPostURL, Shape::PostURL, Required, "the events have nowhere to go", "Where events are posted.",
     "A session whose client needs no user info takes the first entry that has this key, whatever its gates say. All "
     "but internal builds post to `https` whatever the URL says. The user default `httpsPostURL` of a device stands "
     "above it."},
    {kClientEntryRealtimePostURL, Shape::PostURL, Optional, "`post_url`", "Where real-time events are posted.",
     "For events sent with the flag 1 or 3. The user default `httpsRealtimePostURL` of a device stands above it."},
    {kClientEntryOverrideDNU, Shape::Consent, Optional, "0",
     "1: report without the user's consent to diagnostics, too.",
     "Events then carry another client identifier than with consent. Any other number: without consent nothing is "
     "reported."},
    {kClientEntryLocaleWhitelist, Shape::Countries, Required, "no device reports", "The countries in which to report.",
     "The device's country code must contain one of these, without regard to case. A device that is set to no country "
     "passes. An empty array lets no device report."},
    {kClientEntryDeviceWhitelist, Shape::Texts, Optional, "all devices", "The product families that report.",
     "The device's product family (`DeviceName`) must contain one of these, without regard to case. An empty array "
     "admits all."},
    {kClientEntryDeviceBlacklist, Shape::Texts, Optional, "none", "The hardware types that do not report.",
     "A device whose hardware type (`ProductType`) contains one of these, without regard to case, does not report."},
    {kClientEntryFilters, Shape::Filters, Required, "the backend is disabled",
     "What is taken out of events, or made unreadable, before they leave.",
     "The first filter that fits a field decides over it; see [Filters](#keys-of-a-filter). An empty array takes "
     "nothing out; an entry that is no dictionary disables the backend."},
    {kClientEntrySamplingThreshold, Shape::Share, Optional, "none: only countries with a threshold of their own report",
     "The share of devices that report: 0 is none, 1 all of them.",
     "Each backend draws a number from 0 to 0.9999 when it is made, and is enabled when that is below the threshold."},
    {kClientEntryPerCountrySamplingThresholds, Shape::CountryThresholds, Optional, "none",
     "Thresholds of single countries.",
     "The first item that lists the device's country replaces `sampling_threshold`."},
    {kClientEntryOverrideSampling, Shape::Share, Optional, "none: all of them may",
     "Which of the devices that sampling left out may still be promoted.",
     "A device whose number is below it keeps its events, and sends them after a promoting message (flag 2 or 3); the "
     "others are disabled. Looked at only when the number is not below the sampling threshold."},
    {kClientEntryCustomClientId, Shape::Any, Optional, "an identifier of the user on the device",
     "Report under an identifier of the client and service alone.",
     "It is enough that the key is there; its value is not looked at."},
    {kClientEntryEventThreshold, Shape::EventThreshold, Optional, "49",
     "How many events of one category may wait before all that waits is posted.",
     "With 49, the 51st event of a category posts the 50 before it, and what waits of other categories, and begins the "
     "next batch. With a negative number, every event does."},
    {kClientEntryExtrasOnInternal, Shape::Switch, Optional, "0",
     "1: report under the device's identifier, on internal builds only.", "Stands above `custom_clientId`."},
    {kClientEntryEventWhitelist, Shape::Categories, Optional, "all categories",
     "The categories that may leave the device.",
     "Events of all others are dropped, also of category 0, with which sessions start and end. An empty array admits "
     "none. Clients are told, and do not send what would be dropped."},
    {kClientEntryEventBlacklist, Shape::Categories, Optional, "no category",
     "The categories that never leave the device.", "Counts for whatever `event_whitelist` admits."},
    {kClientEntryIncludeSessionID, Shape::Switch, Optional, "0",
     "1: name the session in the header `X-TVN-Session-ID`.", "Its first 40 characters."},
    {kClientEntryUseWiFiOnly, Shape::Switch, Optional, "0", "1: do not post over a cellular network.",
     "Posts are marked so. Linux does not tell networks apart, so they go out all the same."},
};

constexpr StorebagKey kFilterKeys[] = {
    {kFilterKey, Shape::Text, Required, "the filter fits nothing", "The field that the filter is for.",
     "Compared whole, without regard to case, with every key of the event, of the user info and of the posted body."},
    {kFilterAction, Shape::FilterAction, Optional, "none: the field stays, and later filters do not see it",
     "What is done: `remove`, `sha256`, `blacklistValues` or `whitelistValues`.",
     "`remove` takes the field out; `sha256` puts the digest in place of the value; `blacklistValues` takes out a text "
     "that contains one of `value`, `whitelistValues` one that contains none of them."},
    {kFilterValue, Shape::Texts, Optional, "no texts", "The texts that the two last actions look for.",
     "Without regard to case, anywhere in the field's text. A field that is no text stays."},
    {kFilterMethod, Shape::EventNumber, Optional, "every category", "Only events of this category.",
     "A negative number means every category."},
    {kFilterStatus, Shape::EventNumber, Optional, "every type", "Only events of this type.",
     "A negative number means every type."},
};

constexpr StorebagKey kCountryThresholdKeys[] = {
    {kPerCountryCountry, Shape::Countries, Required, "the item is for no country",
     "The countries that the item is for.", "Compared with the device's country code exactly."},
    {kPerCountryThreshold, Shape::Share, Required, "devices of these countries do not report",
     "The share of devices that report there.", "As `sampling_threshold`."},
};

constexpr StorebagKey kDashboardProfileKeys[] = {
    {kProfileIP, Shape::IPv4Address, Required, "no backend is made",
     "The dashboard's address; names are not looked up.",
     "Every event is sent there as one UDP datagram, in clear, as the client sent it, and whatever the user says to "
     "diagnostics."},
    {kProfilePort, Shape::Port, Required, "no backend is made", "The dashboard's UDP port.",
     "Of a number that is too large, the low 16 bits count."},
    {kProfileReliable, Shape::Period, Optional, "each datagram is sent once",
     "Send each datagram until the dashboard acknowledges it, and see to that every so many milliseconds.",
     "One that is not acknowledged is sent again after 2, 5, 10 and 19 of these periods, and given up after 20; at "
     "most "
     "50 wait, then the oldest goes. 0 and less count as 500, less than 10 as 10, more than 60000 as 60000."},
    {kProfilePostURL, Shape::UploadURL, Optional, "log data is refused, with an error line",
     "Where log data is posted.",
     "For clients that upload log data: the array goes there as one archive, and the answer, the data's location, goes "
     "to the dashboard as an event."},
    {kProfileDisplayURL, Shape::DisplayURL, Optional, "none", "Where a person can look at what is reported.",
     "Handed to a client that asks for it. Nothing is sent there."},
};

constexpr StorebagKey kUploadProfileKeys[] = {
    {kProfilePostURL, Shape::UploadURL, Required, "no backend is made", "Where files are uploaded.",
     "A file that a client hands over is posted there, compressed, whatever the user says to diagnostics. What tells "
     "of it is added as a query that begins with a question mark. An answer that contains `success` has the file "
     "deleted on the device."},
    {kProfileDisplayURL, Shape::DisplayURL, Optional, "none", "Where a person can look at what is uploaded.",
     "Handed to a client that asks for it. Nothing is sent there."},
};

constexpr StorebagKey kPlainProfileKeys[] = {
    {kProfileActive, Shape::Switch, Optional, "none", "Says to the reader that the backend is meant to be there.",
     "None: that the backend is named is enough. To switch it off, take it out of the section."},
};

// The number of letters to insert, remove or change to make one text of the other.
size_t editDistance(std::string_view a, std::string_view b) {
  std::vector<size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), size_t{0});
  for (size_t i = 0; i < a.size(); ++i) {
    size_t diagonal = std::exchange(row[0], i + 1);
    for (size_t j = 0; j < b.size(); ++j) {
      const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
      const size_t changed = diagonal + (lower(a[i]) == lower(b[j]) ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({changed, diagonal + 1, row[j] + 1});
    }
  }
  return row.back();
}

}  // namespace

std::span<const StorebagKey> storebagKeys(StorebagLevel level) noexcept {
  switch (level) {
    case StorebagLevel::Envelope:
      return kEnvelopeKeys;
    case StorebagLevel::Bag:
      return kBagKeys;
    case StorebagLevel::HTTPSProfile:
      return kHTTPSProfileKeys;
    case StorebagLevel::ClientEntry:
      return kClientEntryKeys;
    case StorebagLevel::CountryThreshold:
      return kCountryThresholdKeys;
    case StorebagLevel::Filter:
      return kFilterKeys;
    case StorebagLevel::UploadProfile:
      return kUploadProfileKeys;
    case StorebagLevel::DashboardProfile:
      return kDashboardProfileKeys;
    case StorebagLevel::PlainProfile:
      return kPlainProfileKeys;
  }
  return {};
}

std::string_view storebagLevelName(StorebagLevel level) noexcept {
  switch (level) {
    case StorebagLevel::Envelope:
      return "an envelope";
    case StorebagLevel::Bag:
      return "a bag";
    case StorebagLevel::HTTPSProfile:
      return "an HTTPS backend's profile";
    case StorebagLevel::ClientEntry:
      return "a client entry";
    case StorebagLevel::CountryThreshold:
      return "a per-country threshold";
    case StorebagLevel::Filter:
      return "a filter";
    case StorebagLevel::UploadProfile:
      return "an upload backend's profile";
    case StorebagLevel::DashboardProfile:
      return "a dashboard backend's profile";
    case StorebagLevel::PlainProfile:
      return "a profile of power or vdr";
  }
  return {};
}

std::string_view storebagShapeName(StorebagShape shape) noexcept {
  switch (shape) {
    case Shape::Any:
      return "any value";
    case Shape::Text:
      return "text";
    case Shape::Base64:
      return "text, base64";
    case Shape::Names:
      return "text, names separated by commas";
    case Shape::Version:
      return "text, major.middle.minor";
    case Shape::PostURL:
      return "text, an https URL";
    case Shape::UploadURL:
      return "text, an http or https URL";
    case Shape::DisplayURL:
      return "text, a URL";
    case Shape::Switch:
    case Shape::Consent:
      return "number, 0 or 1";
    case Shape::RefreshSeconds:
      return "whole number of seconds, 0 to 86400";
    case Shape::TimeoutSeconds:
      return "whole number of seconds";
    case Shape::EventThreshold:
      return "whole number";
    case Shape::EventNumber:
      return "whole number, 0 to 65535 or negative";
    case Shape::IPv4Address:
      return "text, an IPv4 address";
    case Shape::Port:
      return "whole number, 1 to 65535";
    case Shape::Period:
      return "whole number of milliseconds, 10 to 60000";
    case Shape::Share:
      return "number from 0 to 1";
    case Shape::FilterAction:
      return "text, one of four";
    case Shape::Texts:
      return "array of texts";
    case Shape::Countries:
      return "array of country codes";
    case Shape::Categories:
      return "array of whole numbers, 0 to 65535";
    case Shape::ClientEntries:
      return "array of client entries";
    case Shape::Filters:
      return "array of filters";
    case Shape::CountryThresholds:
      return "array of per-country thresholds";
    case Shape::Macros:
      return "dictionary of values";
    case Shape::Section:
      return "dictionary of profiles";
  }
  return {};
}

const StorebagKey* findStorebagKey(StorebagLevel level, std::string_view key) noexcept {
  const auto keys = storebagKeys(level);
  const auto found = std::find_if(keys.begin(), keys.end(), [key](const StorebagKey& row) { return row.key == key; });
  return found != keys.end() ? &*found : nullptr;
}

std::optional<StorebagLevel> storebagLevelWithKey(std::string_view key) noexcept {
  for (const StorebagLevel level : kStorebagLevels) {
    if (findStorebagKey(level, key) != nullptr) return level;
  }
  return std::nullopt;
}

std::optional<std::string_view> nearestName(std::string_view text, std::span<const std::string_view> candidates) {
  constexpr size_t kLongestName = 64;  // nobody misspells more than that
  if (text.size() > kLongestName) return std::nullopt;
  std::optional<std::string_view> nearest;
  size_t least = kLongestName;
  for (const std::string_view candidate : candidates) {
    const size_t distance = editDistance(text, candidate);
    if (distance >= least || distance * 3 > std::max(text.size(), candidate.size())) continue;
    least = distance;
    nearest = candidate;
  }
  return nearest;
}

std::optional<std::string_view> nearestStorebagKey(StorebagLevel level, std::string_view text) {
  std::vector<std::string_view> names;
  for (const StorebagKey& row : storebagKeys(level)) names.push_back(row.key);
  return nearestName(text, names);
}

}  // namespace telvane
