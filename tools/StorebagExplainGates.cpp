#include "tools/StorebagExplainGates.h"

#include <algorithm>
#include <array>

#include "foundation/Format.h"
#include "interfaces/BackendKind.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tools/URLText.h"
#include "tools/VisibleText.h"

namespace telvane {
namespace {

constexpr double kPercent = 100;

struct GateWords {
  Gate gate;
  std::string_view name;
  std::string_view key;
};

constexpr std::array kGateWords = {
    GateWords{Gate::ClientList, "client list", kProfileClients.view()},
    GateWords{Gate::Expedite, "expedite", kClientEntryExpedite.view()},
    GateWords{Gate::UserInfoRequired, "user info required", {}},
    GateWords{Gate::UserInfo, "user info", {}},
    GateWords{Gate::EntryKind, "entry", {}},
    GateWords{Gate::ClientName, "client name", kClientEntryClient.view()},
    GateWords{Gate::ServiceName, "service name", kClientEntryService.view()},
    GateWords{Gate::EnabledSince, "enabled since", kClientEntryEnabledSince.view()},
    GateWords{Gate::MatchingEntry, "matching entry", {}},
    GateWords{Gate::Consent, "consent", kClientEntryOverrideDNU.view()},
    GateWords{Gate::Country, "country", kClientEntryLocaleWhitelist.view()},
    GateWords{Gate::DeviceWhitelist, "device whitelist", kClientEntryDeviceWhitelist.view()},
    GateWords{Gate::DeviceBlacklist, "device blacklist", kClientEntryDeviceBlacklist.view()},
    GateWords{Gate::Filters, "filters", kClientEntryFilters.view()},
    GateWords{Gate::SamplingThreshold, "sampling threshold", kClientEntrySamplingThreshold.view()},
    GateWords{Gate::PerCountryThreshold, "country threshold", kClientEntryPerCountrySamplingThresholds.view()},
    GateWords{Gate::Sampling, "sampling", {}},
    GateWords{Gate::OverrideSampling, "override sampling", kClientEntryOverrideSampling.view()},
    GateWords{Gate::EventThreshold, "event threshold", kClientEntryEventThreshold.view()},
    GateWords{Gate::ExtrasOnInternal, "extras on internal", kClientEntryExtrasOnInternal.view()},
    GateWords{Gate::CustomClientIdentifier, "custom client id", kClientEntryCustomClientId.view()},
    GateWords{Gate::PostURL, "post url", kClientEntryPostURL.view()},
    GateWords{Gate::RealtimePostURL, "realtime post url", kClientEntryRealtimePostURL.view()},
    GateWords{Gate::EventWhitelist, "event whitelist", kClientEntryEventWhitelist.view()},
    GateWords{Gate::EventBlacklist, "event blacklist", kClientEntryEventBlacklist.view()},
    GateWords{Gate::IncludeSessionID, "include session id", kClientEntryIncludeSessionID.view()},
    GateWords{Gate::UseWiFiOnly, "use wifi only", kClientEntryUseWiFiOnly.view()},
};

static_assert(kGateWords.size() == static_cast<size_t>(Gate::UseWiFiOnly) + 1, "one row for each gate, in their order");

const GateWords& wordsOf(Gate gate) noexcept { return kGateWords[static_cast<size_t>(gate)]; }

bool isPassed(const GateStep& step) noexcept { return step.answer.outcome == GateOutcome::Passed; }

bool isTaken(const GateStep& step) noexcept { return step.answer.outcome == GateOutcome::Taken; }

bool isEmptyList(const Value& list) noexcept { return !list.isArray() || list.array()->empty(); }

std::string_view batchingWords(bool batchesEvents) noexcept {
  return batchesEvents ? "are batched" : "are sent one by one";
}

std::string listOf(const Array& array) {
  std::string list;
  for (const Value& element : array) list += (list.empty() ? "" : ", ") + shortText(element);
  return "[" + list + "]";
}

std::string wholeText(const Value& value) {
  if (!value.isPresent()) return "none";
  if (const Array* array = value.array()) return listOf(*array);
  if (value.isString()) return std::string(value.text());
  const Result<std::string> text = json::serialize(value);
  if (text.has_value()) return *text;
  return description(value);
}

// What is wrong with an address, as the end of a sentence; empty when posts can reach one. Without a scheme, http is
// taken, which only internal builds come to.
std::string addressFault(const std::string& address) {
  const bool hasScheme = address.find("://") != std::string::npos;
  const std::string whole = (hasScheme ? "" : "http://") + address;
  const URLText::Parsed parsed = URLText::parse(whole);
  if (!parsed.url.has_value()) return parsed.fault;
  if (parsed.url->isPlaceholder) return "has a mark in place of the host";
  return parsed.url->hasScheme("https") || parsed.url->hasScheme("http") ? "" : "is neither https nor http";
}

std::string enabledSentence(const BackendExplanation& backend) {
  if (!backend.postAddress.has_value()) return "lost: there is no address to post to";
  const std::string& address = *backend.postAddress;
  if (const std::string fault = addressFault(address); !fault.empty()) {
    return fmt::format("lost: they would be posted to {}, which {}", shortText(address), fault);
  }
  std::string text = backend.batchesEvents ? "batched, and sent with a flush" : "sent at once, one by one";
  if (settingAfter(backend, Gate::PostURL).text() != address) text += fmt::format(", to {}", shortText(address));
  const std::string realtime = backend.realtimePostAddress.value_or(address);
  if (const std::string fault = addressFault(realtime); !fault.empty()) {
    return text +
           fmt::format("; real-time ones are lost: they would be posted to {}, which {}", shortText(realtime), fault);
  }
  if (backend.batchesEvents) text += "; real-time ones at once";
  if (realtime != address && settingAfter(backend, Gate::RealtimePostURL).text() != realtime) {
    text += fmt::format("{} to {}", backend.batchesEvents ? "," : "; real-time ones", shortText(realtime));
  }
  return text;
}

// Devices bound the period between two looks at what is not acknowledged.
std::string dashboardSentence(const Value& profile) {
  const Dictionary& fields = *profile.dictionary();
  const std::string address = fmt::format("{}:{}", shortText(fields[kProfileIP]), fields[kProfilePort].low16Bits());
  const std::string sending = fmt::format("sent at once, one by one, as datagrams in clear to {}", address);
  if (!fields.contains(kProfileReliable)) return sending + ", once each";
  return sending + ", again until the dashboard acknowledges them";
}

std::string dashboardFault(const Value& profile) {
  const Dictionary* const fields = profile.dictionary();
  if (fields == nullptr) return "its profile is no dictionary";
  if (!(*fields)[kProfileIP].isString()) return "its profile has no text \"ip\"";
  if (!fields->contains(kProfilePort)) return "its profile has no \"port\"";
  return fmt::format("{} is no IPv4 address", shortText((*fields)[kProfileIP]));
}

std::string uploadSentence(const Value& profile, bool hasConnection) {
  const Value& postURL = (*profile.dictionary())[kProfilePostURL];
  const std::string url = shortText(postURL);
  // Nothing is made of an address without a scheme here.
  const bool hasScheme = postURL.text().find("://") != std::string_view::npos;
  const std::string fault = hasScheme ? addressFault(std::string(postURL.text())) : "does not begin with https://";
  if (!fault.empty()) return fmt::format("not taken; files cannot be posted to {}, which {}", url, fault);
  if (!hasConnection) return "not taken; a session without client name and service name cannot post files either";
  return fmt::format("not taken; files that the client hands over are posted to {}", url);
}

std::string vdrFault(const StorebagExplainCase& situation) {
  if (situation.hardware == kDesktopProductType) return "a desktop computer has no wireless diagnostics";
  return fmt::format("sessions of the client type {} get none, only those of 7, 11 and 13", situation.clientType);
}

std::string expediteSentence(const GateStep& step) {
  const std::string_view words = batchingWords(step.answer.tested.booleanValue());
  if (isTaken(step)) return fmt::format("{}, so events {}", shortText(step.answer.against), words);
  if (!step.entry.has_value()) return fmt::format("no entry has the session's names, so events {}", words);
  return fmt::format("the first entry with the session's names has none, so events {}", words);
}

std::string nameSentence(const GateStep& step, std::string_view yes, std::string_view no) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (isPassed(step) && !against.isString()) return "the entry is for all";
  if (!tested.isPresent()) return fmt::format("the session has none, the entry wants {}", shortText(against));
  return fmt::format("{} {} {}", shortText(tested), isPassed(step) ? yes : no, shortText(against));
}

std::string enabledSinceSentence(const GateStep& step) {
  if (!step.answer.against.isString()) return "any framework version";
  return fmt::format("framework {} is {} {}", step.answer.tested.text(), isPassed(step) ? "not below" : "below",
                     shortText(step.answer.against));
}

std::string consentSentence(const GateStep& step) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (tested.booleanValue()) return "the user consents";
  if (isPassed(step)) return fmt::format("the user does not consent, {} overrides that", shortText(against));
  return fmt::format("the user does not consent, and nothing overrides that ({})", shortText(against));
}

std::string countrySentence(const GateStep& step) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (isEmptyList(against)) return "the list names no country, so nobody reports";
  if (!tested.isPresent()) return "the device has no country, which any list lets through";
  return fmt::format("{} is {}in {}", shortText(tested), isPassed(step) ? "" : "not ", shortText(against));
}

std::string deviceSentence(const GateStep& step, bool isRefusedWhenFound) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (isEmptyList(against)) return "no list, every device passes";
  if (!tested.isPresent()) return fmt::format("the device does not tell, which {} refuses", shortText(against));
  const bool isFound = isPassed(step) != isRefusedWhenFound;
  return fmt::format("{} has {} of {} in it", shortText(tested), isFound ? "one" : "none", shortText(against));
}

std::string filtersSentence(const GateStep& step) {
  if (!isPassed(step)) {
    return step.answer.against.isArray() ? "a filter is no dictionary" : "no list; an empty one lets every field leave";
  }
  const Array* filters = step.answer.tested.array();
  if (filters == nullptr || filters->empty()) return "none, every field leaves";
  std::string list;
  for (const Value& filter : *filters) {
    const Dictionary& fields = *filter.dictionary();
    list += fmt::format("{}{} {}", list.empty() ? "" : ", ", fields[kFilterKey].text(), fields[kFilterAction].text());
  }
  return fmt::format("{}: {}", filters->size(), shortText(list));
}

std::string countryThresholdSentence(const GateStep& step) {
  if (isTaken(step)) return fmt::format("{} in its place for this country", shortText(step.answer.tested));
  return step.answer.against.isPresent() ? "no item lists the country" : "none";
}

// A share beyond its ends is none, or all of them.
double shareOfDevices(const Value& threshold) {
  const double share = threshold.realValue();
  return share > 0 ? std::min(share, 1.0) : 0;
}

std::string samplingSentence(const GateStep& step) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (!against.isPresent()) return "without a threshold nobody reports";
  return fmt::format("factor {} is {}below {} ({:g} % of devices)", tested.realValue(), isPassed(step) ? "" : "not ",
                     shortText(against), shareOfDevices(against) * kPercent);
}

std::string overrideSamplingSentence(const GateStep& step) {
  const auto& [gate, outcome, tested, against] = step.answer;
  if (!against.isPresent()) {
    return fmt::format("factor {} is not below the threshold, and no second one disables the device",
                       tested.realValue());
  }
  return fmt::format("factor {} is {}below {}, so the device is {}", tested.realValue(), isPassed(step) ? "" : "not ",
                     shortText(against), isPassed(step) ? "sampled out" : "disabled");
}

std::string eventThresholdSentence(const GateStep& step) {
  if (step.answer.tested.integerValue() < 0) {
    return fmt::format("{}, so every event posts what waits", step.answer.tested.integerValue());
  }
  return fmt::format("{}, so at most {} events of a category wait", step.answer.tested.integerValue(),
                     step.answer.tested.integerValue() + 1);
}

std::string urlSentence(const GateStep& step, std::string_view whenNotGiven) {
  const std::string url = shortText(step.answer.tested);
  if (step.answer.outcome == GateOutcome::Kept) return url + ", of the user defaults";
  return isTaken(step) ? url : fmt::format("{}, {}", url, whenNotGiven);
}

std::string categoriesSentence(const GateStep& step, std::string_view whenNotGiven) {
  return step.answer.tested.isPresent() ? shortText(step.answer.tested) : std::string(whenNotGiven);
}

std::string yesOrNo(const Value& value) { return value.booleanValue() ? "yes" : "no"; }

// Steps about what the matched entry takes over, none of which can stop a report.
std::string settingSentence(const GateStep& step) {
  switch (step.answer.gate) {
    case Gate::EventThreshold:
      return eventThresholdSentence(step);
    case Gate::ExtrasOnInternal:
      return shortText(step.answer.tested);
    case Gate::CustomClientIdentifier:
      return isTaken(step) ? "an identifier of this client and service is sent" : "the device's identifier is sent";
    case Gate::PostURL:
      return urlSentence(step, "so nothing can be posted");
    case Gate::RealtimePostURL:
      return urlSentence(step, "as the post url");
    case Gate::EventWhitelist:
      return categoriesSentence(step, "every category");
    case Gate::EventBlacklist:
      return categoriesSentence(step, "no category");
    default:
      return yesOrNo(step.answer.tested);
  }
}

// Steps before the entry that decides is known.
std::string searchSentence(const GateStep& step) {
  switch (step.answer.gate) {
    case Gate::ClientList:
      return isPassed(step) ? fmt::format("{} in the list", step.answer.tested.integerValue()) : "the list is empty";
    case Gate::Expedite:
      return expediteSentence(step);
    case Gate::UserInfoRequired:
      return step.answer.tested.booleanValue() ? "yes, the entry that is for the session decides"
                                               : "no, so the backend is always enabled";
    case Gate::UserInfo:
      return isPassed(step) ? "the session has it" : "the session has none yet, nothing can be decided";
    case Gate::EntryKind:
      return isPassed(step) ? "a dictionary" : "no dictionary";
    case Gate::ClientName:
      return nameSentence(step, "is one of", "is none of");
    case Gate::ServiceName:
      return nameSentence(step, "has one in it of", "has none in it of");
    case Gate::EnabledSince:
      return enabledSinceSentence(step);
    default:
      return isPassed(step) ? "this entry decides alone" : "no entry is for this session";
  }
}

}  // namespace

std::string_view gateName(Gate gate) noexcept { return wordsOf(gate).name; }

std::string_view gateKey(Gate gate) noexcept { return wordsOf(gate).key; }

std::string_view outcomeWord(const GateStep& step) noexcept {
  const Gate gate = step.answer.gate;
  switch (step.answer.outcome) {
    case GateOutcome::Passed:
      return gate == Gate::OverrideSampling ? "hold" : "pass";
    case GateOutcome::Refused:
      return gate >= Gate::EntryKind && gate <= Gate::EnabledSince ? "skip" : "fail";
    case GateOutcome::Taken:
      return "set";
    case GateOutcome::NotGiven:
      return "default";
    case GateOutcome::Kept:
      return "kept";
  }
  return {};
}

std::string gateSentence(const GateStep& step) {
  switch (step.answer.gate) {
    case Gate::Consent:
      return consentSentence(step);
    case Gate::Country:
      return countrySentence(step);
    case Gate::DeviceWhitelist:
      return deviceSentence(step, false);
    case Gate::DeviceBlacklist:
      return deviceSentence(step, true);
    case Gate::Filters:
      return filtersSentence(step);
    case Gate::SamplingThreshold:
      return shortText(step.answer.tested);
    case Gate::PerCountryThreshold:
      return countryThresholdSentence(step);
    case Gate::Sampling:
      return samplingSentence(step);
    case Gate::OverrideSampling:
      return overrideSamplingSentence(step);
    default:
      return step.answer.gate <= Gate::MatchingEntry ? searchSentence(step) : settingSentence(step);
  }
}

// Every step but the settings can decide, and the last of those that were taken did.
const GateStep* decidingStep(const BackendExplanation& backend) noexcept {
  const auto decides = [](const GateStep& step) {
    return step.answer.outcome == GateOutcome::Passed || step.answer.outcome == GateOutcome::Refused ||
           step.answer.gate == Gate::UserInfoRequired;
  };
  const auto last = std::find_if(backend.steps.rbegin(), backend.steps.rend(), decides);
  return last != backend.steps.rend() ? &*last : nullptr;
}

std::string_view stateName(uint32_t state) noexcept {
  switch (state) {
    case TelvaneBackendStateDisabled:
      return "disabled";
    case TelvaneBackendStateEnabled:
      return "enabled";
    case TelvaneBackendStateSampledOut:
      return "sampled out";
    default:
      return "unknown";
  }
}

std::string eventsSentence(const BackendExplanation& backend, const StorebagExplainCase& situation) {
  switch (backend.state) {
    case TelvaneBackendStateDisabled:
      return "dropped";
    case TelvaneBackendStateSampledOut:
      return "batched until a promoting message comes; a flush before that discards them";
    case TelvaneBackendStateEnabled:
      break;
    default:
      return "batched until the session has user info; a flush before that discards them";
  }
  const bool hasConnection = !situation.clientName.empty() || !situation.serviceName.empty();
  switch (backendKindForName(backend.name)) {
    case BackendKind::Dashboard:
      return dashboardSentence(backend.profile);
    case BackendKind::UploadServer:
      return uploadSentence(backend.profile, hasConnection);
    case BackendKind::Wattbook:
      return "lost: what sessions send does not reach the power log";
    case BackendKind::VDR:
      return "handed to the device's wireless-diagnostics adaptor, as the client sent them; lost where there is none";
    case BackendKind::HTTPSPost:
    case BackendKind::Unknown:
      break;
  }
  return hasConnection ? enabledSentence(backend)
                       : "lost: a session without client name and service name has no connection to post through";
}

std::string ungatedSentence(const BackendExplanation& backend, const StorebagExplainCase& situation) {
  const BackendKind kind = backendKindForName(backend.name);
  if (backend.isMade) return "this kind asks for nothing: it is enabled for every session, also without consent";
  switch (kind) {
    case BackendKind::HTTPSPost:
      return situation.productFamily.empty() ? "a device without product family gets none"
                                             : "its profile has no list \"clients\" with an entry";
    case BackendKind::Dashboard:
      return dashboardFault(backend.profile);
    case BackendKind::UploadServer:
      return "its profile has no text \"post_url\"";
    case BackendKind::VDR:
      return vdrFault(situation);
    case BackendKind::Wattbook:
    case BackendKind::Unknown:
      break;
  }
  return "no kind of backend has this name";
}

const Value& settingAfter(const BackendExplanation& backend, Gate gate) noexcept {
  const auto last = std::find_if(backend.steps.rbegin(), backend.steps.rend(),
                                 [gate](const GateStep& step) { return step.answer.gate == gate; });
  return last != backend.steps.rend() ? last->answer.tested : Value::none();
}

std::string shortText(const Value& value) {
  constexpr size_t kLongest = 1000;
  const std::string text = visibleText(wholeText(value));
  if (text.size() <= kLongest) return text;
  size_t end = kLongest;
  while ((static_cast<unsigned char>(text[end]) & 0xC0) == 0x80) --end;  // not in the middle of a character
  return text.substr(0, end) + "...";
}

}  // namespace telvane
