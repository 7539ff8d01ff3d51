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
Value valueOf(std::string_view text) { return text.data() != nullptr ? Value(text) : Value(); }

template <class T>
Value valueOf(const T& value) {
  return Value(value);
}

std::string_view viewOf(const std::optional<String>& text) {
  return text.has_value() ? text->view() : std::string_view();
}

// A number as it is, text read as a number; an absent value for anything else.
Value numberOf(const Value& value) {
  if (value.isNumber()) return value;
  return value.isString() ? Value(value.realValue()) : Value();
}

// What is no list reads as an empty one, so a whitelist that is none admits nothing.
Value listOf(const Value& value) { return value.isArray() ? value : Value(Array()); }

GateOutcome givenIf(bool isGiven) { return isGiven ? GateOutcome::Taken : GateOutcome::NotGiven; }

float singlePrecision(const Value& threshold) { return static_cast<float>(threshold.realValue()); }

bool isListed(const Value& countries, const String& country) {
  const Array* list = countries.array();
  return list != nullptr && std::any_of(list->begin(), list->end(), [&country](const Value& element) {
           return element.isString() && element.text() == country;
         });
}

}  // namespace

void HTTPSPostBackend::willLookAtEntry(std::optional<size_t> index) const {
  if (_gateObserver != nullptr) _gateObserver->willLookAtEntry(index);
}

template <class Tested>
void HTTPSPostBackend::observe(Gate gate, GateOutcome outcome, const Tested& tested, const Value& against) const {
  if (_gateObserver != nullptr) _gateObserver->didAnswer({gate, outcome, valueOf(tested), against});
}

template <class Tested>
bool HTTPSPostBackend::passes(Gate gate, bool isPassed, const Tested& tested, const Value& against) const {
  observe(gate, isPassed ? GateOutcome::Passed : GateOutcome::Refused, tested, against);
  return isPassed;
}

uint32_t HTTPSPostBackend::updateBackendState() {
  const Array* clients = _profile[kProfileClients].array();
  const size_t count = clients != nullptr ? clients->size() : 0;
  if (!passes(Gate::ClientList, count != 0, count)) return TelvaneBackendStateDisabled;
  const SessionNames names = sessionNames();
  overrideBatching(*clients, names);
  observe(Gate::UserInfoRequired, GateOutcome::Taken, _requireUserInfo);
  if (!_requireUserInfo) return stateWithoutUserInfo(*clients);
  if (!hasUserInfo()) return TelvaneBackendStateUnknown;
  const Dictionary* client = matchingEntry(*clients, names);
  return client != nullptr ? stateForClient(*client, names) : TelvaneBackendStateDisabled;
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
  const auto matches = [&names](const Value& entry) {
    return entry.isDictionary() && matchClientNameAndServiceID(*entry.dictionary(), names);
  };
  const Value* entry = std::find_if(clients.begin(), clients.end(), matches);
  const bool isMatched = entry != clients.end();
  if (isMatched) willLookAtEntry(entry - clients.begin());
  const Value& expedite = isMatched ? (*entry->dictionary())[kClientEntryExpedite] : Value::none();
  if (expedite.isPresent()) {
    _batchEvents = expedite.integerValue() == 0;
    log().message("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent={}",
                  static_cast<int>(_batchEvents));
  }
  observe(Gate::Expedite, givenIf(expedite.isPresent()), _batchEvents, expedite);
  willLookAtEntry(std::nullopt);
}

uint32_t HTTPSPostBackend::stateWithoutUserInfo(const Array& clients) {
  const Dictionary* linked = nullptr;
  for (size_t index = 0; index < clients.size() && linked == nullptr; ++index) {
    const Dictionary* client = clients[index].dictionary();
    willLookAtEntry(index);
    if (client != nullptr && updatePostLink(*client)) linked = client;
  }
  resetBackendStateWithClient(linked);
  return TelvaneBackendStateEnabled;
}

bool HTTPSPostBackend::hasUserInfo() const {
  const bool isThere = _userInfoDict.has_value() && !_userInfoDict->empty();
  return passes(Gate::UserInfo, isThere, _userInfoDict);
}

const Dictionary* HTTPSPostBackend::matchingEntry(const Array& clients, const SessionNames& names) const {
  for (size_t index = 0; index < clients.size(); ++index) {
    willLookAtEntry(index);
    if (!isMatchingEntry(clients[index], names)) continue;
    observe(Gate::MatchingEntry, GateOutcome::Passed, index);
    return clients[index].dictionary();
  }
  willLookAtEntry(std::nullopt);
  observe(Gate::MatchingEntry, GateOutcome::Refused, Value::none());
  return nullptr;
}

bool HTTPSPostBackend::isMatchingEntry(const Value& entry, const SessionNames& names) const {
  const Dictionary* client = entry.dictionary();
  return passes(Gate::EntryKind, client != nullptr, Value::none(), client != nullptr ? Value::none() : entry) &&
         passes(Gate::ClientName, matchClientName(*client, names), names.client, (*client)[kClientEntryClient]) &&
         passes(Gate::ServiceName, matchServiceID(*client, names), names.service, (*client)[kClientEntryService]) &&
         passes(Gate::EnabledSince, isFrameworkEnabledForClient(*client), selfVersionText(),
                (*client)[kClientEntryEnabledSince]);
}

uint32_t HTTPSPostBackend::stateForClient(const Dictionary& client, const SessionNames& names) {
  const std::optional<String> country = _context.platform().locale.countryCode();
  if (!isConsentEnough(client) || !isCountryListed(client, country) || !isProductFamilyListed(client) ||
      isHardwareRefused(client) || !createFilters(client)) {
    return TelvaneBackendStateDisabled;
  }
  takeSamplingThreshold(client, country);
  const uint32_t state = sampledState(client);
  resetBackendStateWithClient(&client);
  takeCustomClientIdentifier(client, names);
  log().message("HTTPSPostBackend(updateBackendState): {}: client found {}:{}, state={}, samplingFactor={:f}", _name,
                valueOf(names.client), valueOf(names.service), state, _samplingFactor);
  updatePostLink(client);
  takeLists(client);
  takeSwitches(client);
  return state;
}

bool HTTPSPostBackend::matchClientName(const Dictionary& client, const SessionNames& names) {
  return matchExactStringWithList(namesSeparatedByCommas(client[kClientEntryClient]), names.client, true);
}

bool HTTPSPostBackend::matchServiceID(const Dictionary& client, const SessionNames& names) {
  return matchStringWithList(namesSeparatedByCommas(client[kClientEntryService]), names.service, true);
}

bool HTTPSPostBackend::matchClientNameAndServiceID(const Dictionary& client, const SessionNames& names) {
  return matchClientName(client, names) && matchServiceID(client, names);
}

bool HTTPSPostBackend::isFrameworkEnabledForClient(const Dictionary& client) const {
  const Value& enabledSince = client[kClientEntryEnabledSince];
  return !enabledSince.isString() ||
         versionComponents(enabledSince.text()) <= std::tuple(_selfVersionMajor, _selfVersionMiddle, _selfVersionMinor);
}

bool HTTPSPostBackend::isConsentEnough(const Dictionary& client) {
  // All of the number counts: one that only ends in the bits of 1 overrides nothing.
  const Value& overrideValue = client[kClientEntryOverrideDNU];
  const int64_t override = overrideValue.integerValue();
  if (override == 1) {
    _dnuType = _dnuEnabled ? DNUType::OverriddenWithConsent : DNUType::OverriddenWithoutConsent;
    return passes(Gate::Consent, true, _dnuEnabled, overrideValue);
  }
  _dnuType = DNUType::Respected;
  if (passes(Gate::Consent, _dnuEnabled, _dnuEnabled, overrideValue)) return true;
  log().message("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: {}.", override);
  return false;
}

// The server must name the countries: without a list no country is in it.
bool HTTPSPostBackend::isCountryListed(const Dictionary& client, const std::optional<String>& country) const {
  const Value& list = client[kClientEntryLocaleWhitelist];
  const bool isFound = matchStringWithList(namesOfArray(list), viewOf(country), false);
  if (passes(Gate::Country, isFound, country, list)) return true;
  log().message("HTTPSPostBackend(updateBackendState): ({}) isn't in country code list {}", valueOf(country), list);
  return false;
}

bool HTTPSPostBackend::isProductFamilyListed(const Dictionary& client) const {
  const Value& whitelist = client[kClientEntryDeviceWhitelist];
  const bool isFound = matchStringWithList(namesOfArray(whitelist), _productFamily, true);
  if (passes(Gate::DeviceWhitelist, isFound, _productFamily, whitelist)) return true;
  log().message("HTTPSPostBackend(updateBackendState): ({}) isn't in device whitelist {}", _productFamily, whitelist);
  return false;
}

bool HTTPSPostBackend::isHardwareRefused(const Dictionary& client) const {
  const Value& blacklist = client[kClientEntryDeviceBlacklist];
  const bool isFound = matchStringWithList(namesOfArray(blacklist), viewOf(_hardwareType), false);
  if (passes(Gate::DeviceBlacklist, !isFound, _hardwareType, blacklist)) return false;
  log().message("HTTPSPostBackend(updateBackendState): ({}) is in device blacklist {}", valueOf(_hardwareType),
                blacklist);
  return true;
}

// An empty list changes nothing. What is no list counts as none, and with an entry that is no dictionary nobody knows
// what it was to keep back: better no report than an unfiltered one. An entry without a key matches nothing, which is
// what it says.
bool HTTPSPostBackend::createFilters(const Dictionary& client) {
  const Value& filters = client[kClientEntryFilters];
  const Array* entries = filters.array();
  if (entries == nullptr) {
    observe(Gate::Filters, GateOutcome::Refused, Value::none(), filters);
    log().error("HTTPSPostBackend(updateBackendState): filters are required.");
    return false;
  }
  if (!std::all_of(entries->begin(), entries->end(), [](const Value& entry) { return entry.isDictionary(); })) {
    observe(Gate::Filters, GateOutcome::Refused, Value::none(), filters);
    log().error("HTTPSPostBackend(updateBackendState): a filter is no dictionary.");
    return false;
  }
  if (!entries->empty()) _filters = EventFilter(*entries);
  if (_gateObserver != nullptr) observe(Gate::Filters, GateOutcome::Passed, _filters.description(), filters);
  return true;
}

void HTTPSPostBackend::takeSamplingThreshold(const Dictionary& client, const std::optional<String>& country) {
  Value threshold = numberOf(client[kClientEntrySamplingThreshold]);
  observe(Gate::SamplingThreshold, givenIf(threshold.isPresent()), threshold, client[kClientEntrySamplingThreshold]);
  setSamplingThreshold(std::move(threshold));
  takeCountryThreshold(client, country);
}

void HTTPSPostBackend::takeCountryThreshold(const Dictionary& client, const std::optional<String>& country) {
  const Value& perCountry = client[kClientEntryPerCountrySamplingThresholds];
  const Array items = perCountry.isArray() && country.has_value() ? *perCountry.array() : Array();
  for (const Value& element : items) {
    const Dictionary* item = element.dictionary();
    if (item == nullptr || !isListed((*item)[kPerCountryCountry], *country)) continue;
    Value threshold = numberOf((*item)[kPerCountryThreshold]);
    log().message("HTTPSPostBackend(updateBackendState): sampling threshold for {} changed from {:.2f} to {:.2f}",
                  *country, singlePrecision(samplingThreshold()), singlePrecision(threshold));
    observe(Gate::PerCountryThreshold, GateOutcome::Taken, threshold, element);
    setSamplingThreshold(std::move(threshold));
    return;
  }
  observe(Gate::PerCountryThreshold, GateOutcome::NotGiven, Value::none(), perCountry);
}

uint32_t HTTPSPostBackend::sampledState(const Dictionary& client) {
  const Value threshold = samplingThreshold();
  const bool isSampled = threshold.isPresent() && _samplingFactor < threshold.realValue();
  if (passes(Gate::Sampling, isSampled, _samplingFactor, threshold)) return TelvaneBackendStateEnabled;
  return threshold.isPresent() ? overriddenSampledState(client) : TelvaneBackendStateDisabled;
}

uint32_t HTTPSPostBackend::overriddenSampledState(const Dictionary& client) {
  _overrideSampling = numberOf(client[kClientEntryOverrideSampling]);
  const bool isOut = _overrideSampling.isPresent() && _samplingFactor >= _overrideSampling.realValue();
  const bool isHeld = passes(Gate::OverrideSampling, !isOut, _samplingFactor, _overrideSampling);
  return isHeld ? TelvaneBackendStateSampledOut : TelvaneBackendStateDisabled;
}

void HTTPSPostBackend::resetBackendStateWithClient(const Dictionary* client) {
  const Value& threshold = client != nullptr ? (*client)[kClientEntryEventThreshold] : Value::none();
  _eventThreshold = threshold.isPresent() ? threshold.int32Value() : kDefaultEventThreshold;
  log().message("resetBackendStateWithClient: event_threshold set to {}", _eventThreshold);
  observe(Gate::EventThreshold, givenIf(threshold.isPresent()), _eventThreshold, threshold);
  const Value& extras = client != nullptr ? (*client)[kClientEntryExtrasOnInternal] : Value::none();
  _extrasOnInternal = extras.int32Value();
  log().message("setBackendStateWithClient: extras on internal is set to {}", _extrasOnInternal);
  observe(Gate::ExtrasOnInternal, givenIf(extras.isPresent()), _extrasOnInternal, extras);
}

void HTTPSPostBackend::takeCustomClientIdentifier(const Dictionary& client, const SessionNames& names) {
  const Value& custom = client[kClientEntryCustomClientId];
  if (custom.isPresent()) {
    _uuidCustom = getPersistentIdentifierForCustomClientIDSuffix(_context.platform(), names.client, names.service);
  }
  observe(Gate::CustomClientIdentifier, givenIf(custom.isPresent()), _uuidCustom.has_value(), custom);
}

bool HTTPSPostBackend::updatePostLink(const Dictionary& client) {
  const String* url = client[kClientEntryPostURL].string();
  const bool isKept = _useDefaultPostURL && _postURL.has_value();
  if (!isKept) {
    _useDefaultPostURL = false;
    if (url != nullptr) {
      _postURL = *url;
      log().message("HTTPSPostBackend(updatePostLink): Storebag '{}' for postURL", *url);
    }
  }
  observe(Gate::PostURL, isKept ? GateOutcome::Kept : givenIf(url != nullptr), _postURL, client[kClientEntryPostURL]);
  updateRealtimePostLink(client);
  return !isKept && url != nullptr;
}

void HTTPSPostBackend::updateRealtimePostLink(const Dictionary& client) {
  const Value& link = client[kClientEntryRealtimePostURL];
  if (_useDefaultRealtimePostURL && _realtimePostURL.has_value()) {
    observe(Gate::RealtimePostURL, GateOutcome::Kept, _realtimePostURL, link);
    return;
  }
  _useDefaultRealtimePostURL = false;
  if (const String* url = link.string()) {
    _realtimePostURL = *url;
    log().message("HTTPSPostBackend(updatePostLink): Storebag '{}' for realtimePostURL", *url);
  } else {
    _realtimePostURL = _postURL;
    log().message("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '{}'", valueOf(_postURL));
  }
  observe(Gate::RealtimePostURL, givenIf(link.isString()), _realtimePostURL, link);
}

void HTTPSPostBackend::takeLists(const Dictionary& client) {
  const Value& whitelist = client[kClientEntryEventWhitelist];
  if (whitelist.isPresent()) {
    _eventWhitelist = listOf(whitelist);
    log().message("HTTPSPostBackend(updateBackendState): {}: eventWhitelist={}", _name, _eventWhitelist);
  }
  observe(Gate::EventWhitelist, givenIf(whitelist.isPresent()), _eventWhitelist, whitelist);
  const Value& blacklist = client[kClientEntryEventBlacklist];
  if (blacklist.isPresent()) {
    _eventBlacklist = listOf(blacklist);
    log().message("HTTPSPostBackend(updateBackendState): {}: eventBlacklist={}", _name, _eventBlacklist);
  }
  observe(Gate::EventBlacklist, givenIf(blacklist.isPresent()), _eventBlacklist, blacklist);
}

void HTTPSPostBackend::takeSwitches(const Dictionary& client) {
  const Value& sessionID = client[kClientEntryIncludeSessionID];
  _includeSessionIDInHeader = sessionID.integerValue() != 0;
  observe(Gate::IncludeSessionID, givenIf(sessionID.isPresent()), _includeSessionIDInHeader, sessionID);
  const Value& wiFiOnly = client[kClientEntryUseWiFiOnly];
  _shouldUseWiFiOnly = wiFiOnly.integerValue() != 0;
  observe(Gate::UseWiFiOnly, givenIf(wiFiOnly.isPresent()), _shouldUseWiFiOnly, wiFiOnly);
}

}  // namespace telvane
