// How an HTTPS backend reads its storebag section: which client entry counts, and what it says.
#include <algorithm>

#include "backends/HTTPSPostBackend.h"
#include "backends/ListMatching.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

// Absent text shows as "(null)" in log lines.
Value valueOf(const std::optional<String>& text) { return text.has_value() ? Value(*text) : Value(); }

Value textOrNone(std::string_view text) { return text.data() != nullptr ? Value(text) : Value(); }

std::string_view viewOf(const std::optional<String>& text) {
  return text.has_value() ? text->view() : std::string_view();
}

// A number as it is, text read as a number; an absent value for anything else.
Value numberOf(const Value& value) {
  if (value.isNumber()) return value;
  return value.isString() ? Value(value.realValue()) : Value();
}

float singlePrecision(const Value& threshold) { return static_cast<float>(threshold.realValue()); }

bool isListed(const Value& countries, const String& country) {
  const Array* list = countries.array();
  return list != nullptr && std::any_of(list->begin(), list->end(), [&country](const Value& element) {
           return element.isString() && element.text() == country;
         });
}

}  // namespace

uint32_t HTTPSPostBackend::updateBackendState() {
  const Array* clients = _profile[kProfileClients].array();
  if (clients == nullptr || clients->empty()) return TelvaneBackendStateDisabled;
  const SessionNames names = sessionNames();
  overrideBatching(*clients, names);
  if (!_requireUserInfo) return stateWithoutUserInfo(*clients);
  if (!_userInfoDict.has_value() || _userInfoDict->empty()) return TelvaneBackendStateUnknown;
  for (const Value& entry : *clients) {
    const Dictionary* client = entry.dictionary();
    if (client == nullptr || !matchClientNameAndServiceID(*client, names)) continue;
    if (isFrameworkEnabledForClient(*client)) return stateForClient(*client, names);
  }
  return TelvaneBackendStateDisabled;
}

HTTPSPostBackend::SessionNames HTTPSPostBackend::sessionNames() const {
  if (!_userInfoDict.has_value()) return {};
  const String* client = (*_userInfoDict)[kTelvaneUserInfoClientName].string();
  const String* service = (*_userInfoDict)[kTelvaneUserInfoServiceName].string();
  return {.client = client != nullptr ? client->view() : std::string_view(),
          .service = service != nullptr ? service->view() : std::string_view()};
}

// Only the first entry that matches is looked at, whether or not it says anything.
void HTTPSPostBackend::overrideBatching(const Array& clients, const SessionNames& names) {
  const auto matches = [this, &names](const Value& entry) {
    return entry.isDictionary() && matchClientNameAndServiceID(*entry.dictionary(), names);
  };
  const Value* entry = std::find_if(clients.begin(), clients.end(), matches);
  if (entry == clients.end()) return;
  const Value& expedite = (*entry->dictionary())[kClientEntryExpedite];
  if (!expedite.isPresent()) return;
  _batchEvents = expedite.integerValue() == 0;
  log().message("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent={}",
                static_cast<int>(_batchEvents));
}

uint32_t HTTPSPostBackend::stateWithoutUserInfo(const Array& clients) {
  const Dictionary* linked = nullptr;
  for (const Value& entry : clients) {
    const Dictionary* client = entry.dictionary();
    if (client == nullptr || !updatePostLink(*client)) continue;
    linked = client;
    break;
  }
  resetBackendStateWithClient(linked);
  return TelvaneBackendStateEnabled;
}

uint32_t HTTPSPostBackend::stateForClient(const Dictionary& client, const SessionNames& names) {
  const std::optional<String> country = _context.platform().locale.countryCode();
  if (!isConsentEnough(client) || !isCountryListed(client, country) || !isDeviceAllowed(client) ||
      !createFilters(client)) {
    return TelvaneBackendStateDisabled;
  }
  takeSamplingThreshold(client, country);
  const uint32_t state = sampledState(client);
  resetBackendStateWithClient(&client);
  if (client.contains(kClientEntryCustomClientId)) {
    _uuidCustom = getPersistentIdentifierForCustomClientIDSuffix(_context.platform(), names.client, names.service);
  }
  log().message("HTTPSPostBackend(updateBackendState): {}: client found {}:{}, state={}, samplingFactor={:f}", _name,
                textOrNone(names.client), textOrNone(names.service), state, _samplingFactor);
  updatePostLink(client);
  takeListsAndSwitches(client);
  return state;
}

bool HTTPSPostBackend::matchClientNameAndServiceID(const Dictionary& client, const SessionNames& names) const {
  return matchExactStringWithList(namesSeparatedByCommas(client[kClientEntryClient]), names.client, true) &&
         matchStringWithList(namesSeparatedByCommas(client[kClientEntryService]), names.service, true);
}

bool HTTPSPostBackend::isFrameworkEnabledForClient(const Dictionary& client) const {
  const Value& enabledSince = client[kClientEntryEnabledSince];
  return !enabledSince.isString() ||
         versionComponents(enabledSince.text()) <= std::tuple(_selfVersionMajor, _selfVersionMiddle, _selfVersionMinor);
}

bool HTTPSPostBackend::isConsentEnough(const Dictionary& client) {
  const int32_t override = client[kClientEntryOverrideDNU].int32Value();
  if (override == 1) {
    _dnuType = _dnuEnabled ? DNUType::OverriddenWithConsent : DNUType::OverriddenWithoutConsent;
    return true;
  }
  _dnuType = DNUType::Respected;
  if (_dnuEnabled) return true;
  log().message("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: {}.", override);
  return false;
}

// The server must name the countries: without a list no country is in it.
bool HTTPSPostBackend::isCountryListed(const Dictionary& client, const std::optional<String>& country) const {
  const Value& list = client[kClientEntryLocaleWhitelist];
  if (matchStringWithList(namesOfArray(list), viewOf(country), false)) return true;
  log().message("HTTPSPostBackend(updateBackendState): ({}) isn't in country code list {}", valueOf(country), list);
  return false;
}

bool HTTPSPostBackend::isDeviceAllowed(const Dictionary& client) const {
  const Value& whitelist = client[kClientEntryDeviceWhitelist];
  if (!matchStringWithList(namesOfArray(whitelist), _productFamily, true)) {
    log().message("HTTPSPostBackend(updateBackendState): ({}) isn't in device whitelist {}", _productFamily, whitelist);
    return false;
  }
  const Value& blacklist = client[kClientEntryDeviceBlacklist];
  if (!matchStringWithList(namesOfArray(blacklist), viewOf(_hardwareType), false)) return true;
  log().message("HTTPSPostBackend(updateBackendState): ({}) is in device blacklist {}", valueOf(_hardwareType),
                blacklist);
  return false;
}

// An empty list changes nothing. What is no list counts as none, and with an entry that is no dictionary nobody knows
// what it was to keep back: better no report than an unfiltered one. An entry without a key matches nothing, which is
// what it says.
bool HTTPSPostBackend::createFilters(const Dictionary& client) {
  const Array* entries = client[kClientEntryFilters].array();
  if (entries == nullptr) {
    log().error("HTTPSPostBackend(updateBackendState): filters are required.");
    return false;
  }
  if (!std::all_of(entries->begin(), entries->end(), [](const Value& entry) { return entry.isDictionary(); })) {
    log().error("HTTPSPostBackend(updateBackendState): a filter is no dictionary.");
    return false;
  }
  if (!entries->empty()) _filters = EventFilter(*entries);
  return true;
}

void HTTPSPostBackend::takeSamplingThreshold(const Dictionary& client, const std::optional<String>& country) {
  setSamplingThreshold(numberOf(client[kClientEntrySamplingThreshold]));
  const Array* perCountry = client[kClientEntryPerCountrySamplingThresholds].array();
  if (perCountry == nullptr || !country.has_value()) return;
  for (const Value& element : *perCountry) {
    const Dictionary* item = element.dictionary();
    if (item == nullptr || !isListed((*item)[kPerCountryCountry], *country)) continue;
    Value threshold = numberOf((*item)[kPerCountryThreshold]);
    log().message("HTTPSPostBackend(updateBackendState): sampling threshold for {} changed from {:.2f} to {:.2f}",
                  *country, singlePrecision(samplingThreshold()), singlePrecision(threshold));
    setSamplingThreshold(std::move(threshold));
    return;
  }
}

uint32_t HTTPSPostBackend::sampledState(const Dictionary& client) {
  const Value threshold = samplingThreshold();
  if (!threshold.isPresent()) return TelvaneBackendStateDisabled;
  if (_samplingFactor < threshold.realValue()) return TelvaneBackendStateEnabled;
  _overrideSampling = numberOf(client[kClientEntryOverrideSampling]);
  const bool isOut = _overrideSampling.isPresent() && _samplingFactor >= _overrideSampling.realValue();
  return isOut ? TelvaneBackendStateDisabled : TelvaneBackendStateSampledOut;
}

void HTTPSPostBackend::resetBackendStateWithClient(const Dictionary* client) {
  const Value& threshold = client != nullptr ? (*client)[kClientEntryEventThreshold] : Value::none();
  _eventThreshold = threshold.isPresent() ? threshold.int32Value() : kDefaultEventThreshold;
  log().message("resetBackendStateWithClient: event_threshold set to {}", _eventThreshold);
  _extrasOnInternal = client != nullptr ? (*client)[kClientEntryExtrasOnInternal].int32Value() : 0;
  log().message("setBackendStateWithClient: extras on internal is set to {}", _extrasOnInternal);
}

bool HTTPSPostBackend::updatePostLink(const Dictionary& client) {
  bool isUpdated = false;
  if (!_useDefaultPostURL || !_postURL.has_value()) {
    _useDefaultPostURL = false;
    if (const String* url = client[kClientEntryPostURL].string()) {
      _postURL = *url;
      log().message("HTTPSPostBackend(updatePostLink): Storebag '{}' for postURL", *url);
      isUpdated = true;
    }
  }
  updateRealtimePostLink(client);
  return isUpdated;
}

void HTTPSPostBackend::updateRealtimePostLink(const Dictionary& client) {
  if (_useDefaultRealtimePostURL && _realtimePostURL.has_value()) return;
  _useDefaultRealtimePostURL = false;
  if (const String* url = client[kClientEntryRealtimePostURL].string()) {
    _realtimePostURL = *url;
    log().message("HTTPSPostBackend(updatePostLink): Storebag '{}' for realtimePostURL", *url);
    return;
  }
  _realtimePostURL = _postURL;
  log().message("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '{}'", valueOf(_postURL));
}

void HTTPSPostBackend::takeListsAndSwitches(const Dictionary& client) {
  if (const Value& whitelist = client[kClientEntryEventWhitelist]; whitelist.isArray()) {
    _eventWhitelist = whitelist;
    log().message("HTTPSPostBackend(updateBackendState): {}: eventWhitelist={}", _name, whitelist);
  }
  if (const Value& blacklist = client[kClientEntryEventBlacklist]; blacklist.isArray()) {
    _eventBlacklist = blacklist;
    log().message("HTTPSPostBackend(updateBackendState): {}: eventBlacklist={}", _name, blacklist);
  }
  _includeSessionIDInHeader = client[kClientEntryIncludeSessionID].integerValue() != 0;
  _shouldUseWiFiOnly = client[kClientEntryUseWiFiOnly].integerValue() != 0;
}

}  // namespace telvane
