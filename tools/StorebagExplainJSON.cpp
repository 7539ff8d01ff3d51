#include "tools/StorebagExplainJSON.h"

#include "foundation/Description.h"
#include "platform/JSON.h"
#include "tools/StorebagExplainGates.h"

namespace telvane {
namespace {

constexpr Key kClientType{"clientType"};
constexpr Key kClientName{"clientName"};
constexpr Key kServiceName{"serviceName"};
constexpr Key kRequiresUserInfo{"requiresUserInfo"};
constexpr Key kBatchesEvents{"batchesEvents"};
constexpr Key kCountry{"country"};
constexpr Key kProductFamily{"productFamily"};
constexpr Key kHardware{"hardware"};
constexpr Key kFrameworkVersion{"frameworkVersion"};
constexpr Key kIsInternalBuild{"isInternalBuild"};
constexpr Key kConsent{"consent"};
constexpr Key kSamplingFactor{"samplingFactor"};
constexpr Key kAssumed{"assumed"};
constexpr Key kGate{"gate"};
constexpr Key kOutcome{"outcome"};
constexpr Key kText{"text"};
constexpr Key kTested{"tested"};
constexpr Key kAgainst{"against"};
constexpr Key kName{"name"};
constexpr Key kIsMade{"isMade"};
constexpr Key kBag{"bag"};
constexpr Key kFile{"file"};
constexpr Key kVersion{"version"};
constexpr Key kIsSigned{"isSigned"};
constexpr Key kIsSignatureChecked{"isSignatureChecked"};
constexpr Key kCase{"case"};
constexpr Key kEnvironment{"environment"};
constexpr Key kSection{"section"};
constexpr Key kSections{"sections"};
constexpr Key kReleaseTimeout{"releaseTimeout"};
constexpr Key kMacros{"macros"};
constexpr Key kUsedMacros{"usedMacros"};
constexpr Key kUndefinedMacros{"undefinedMacros"};
constexpr Key kLog{"log"};
constexpr Key kBackends{"backends"};
constexpr Key kKey{"key"};
constexpr Key kEntry{"entry"};
constexpr Key kState{"state"};
constexpr Key kStateNumber{"stateNumber"};
constexpr Key kEvents{"events"};
constexpr Key kPostURL{"postURL"};
constexpr Key kRealtimePostURL{"realtimePostURL"};
constexpr Key kPostAddress{"postAddress"};
constexpr Key kRealtimePostAddress{"realtimePostAddress"};
constexpr Key kFilters{"filters"};
constexpr Key kGates{"gates"};
constexpr Key kBecause{"because"};

constexpr size_t kDeepest = 32;

// An absent value stays absent, so that its key is left out.
Value writable(const Value& value) {
  if (!value.isPresent()) return {};
  if (value.depth(kDeepest + 1) <= kDeepest && json::serialize(value).has_value()) return value;
  return Value(description(value));
}

template <class Names>
Array arrayOf(const Names& names) {
  Array array;
  for (const auto& name : names) array.append(Value(name));
  return array;
}

// As the session reads it.
Value secondsOrNone(const Value& value) { return value.isPresent() ? Value(value.uint32Value()) : Value(); }

Value addressOrNone(const std::optional<std::string>& address) {
  return address.has_value() ? Value(*address) : Value();
}

Value textOrNone(const std::string& text) { return text.empty() ? Value() : Value(text); }

Dictionary caseDictionary(const StorebagExplainReport& report) {
  const StorebagExplainCase& situation = report.situation;
  return {{kClientType, situation.clientType},
          {kClientName, textOrNone(situation.clientName)},
          {kServiceName, textOrNone(situation.serviceName)},
          {kRequiresUserInfo, situation.requiresUserInfo},
          {kBatchesEvents, situation.batchesEvents},
          {kCountry, textOrNone(situation.country)},
          {kProductFamily, textOrNone(situation.productFamily)},
          {kHardware, textOrNone(situation.hardware)},
          {kFrameworkVersion, report.explanation.frameworkVersion},
          {kIsInternalBuild, report.explanation.isInternalBuild},
          {kConsent, situation.hasConsent},
          {kSamplingFactor, situation.samplingFactor},
          {kAssumed, arrayOf(report.assumed)}};
}

Dictionary stepDictionary(const GateStep& step) {
  Dictionary fields{{kGate, gateName(step.answer.gate)},
                    {kOutcome, outcomeWord(step)},
                    {kText, gateSentence(step)},
                    {kTested, writable(step.answer.tested)},
                    {kAgainst, writable(step.answer.against)}};
  if (const std::string_view key = gateKey(step.answer.gate); !key.empty()) fields.set(kKey, key);
  if (step.entry.has_value()) fields.set(kEntry, *step.entry);
  return fields;
}

Array logArray(const std::vector<KeptLog::Line>& lines) {
  Array array;
  for (const KeptLog::Line& line : lines) array.append(Value(line.message));
  return array;
}

void addDecision(Dictionary& fields, const BackendExplanation& backend, const StorebagExplainReport& report) {
  fields.set(kState, stateName(backend.state));
  fields.set(kStateNumber, backend.state);
  fields.set(kEvents, eventsSentence(backend, report.situation));
  fields.set(kBatchesEvents, backend.batchesEvents);
  fields.set(kPostURL, writable(settingAfter(backend, Gate::PostURL)));
  fields.set(kRealtimePostURL, writable(settingAfter(backend, Gate::RealtimePostURL)));
  fields.set(kPostAddress, addressOrNone(backend.postAddress));
  fields.set(kRealtimePostAddress, addressOrNone(backend.realtimePostAddress));
  fields.set(kFilters, writable(settingAfter(backend, Gate::Filters)));
  Array gates;
  for (const GateStep& step : backend.steps) gates.append(stepDictionary(step));
  fields.set(kGates, std::move(gates));
}

Dictionary backendDictionary(const BackendExplanation& backend, const StorebagExplainReport& report) {
  Dictionary fields{{kName, backend.name}, {kIsMade, backend.isMade}};
  if (const GateStep* step = decidingStep(backend)) {
    fields.set(kBecause, stepDictionary(*step));
  } else {
    fields.set(kBecause, Dictionary{{kText, ungatedSentence(backend, report.situation)}});
  }
  if (backend.isMade) addDecision(fields, backend, report);
  fields.set(kLog, logArray(backend.logLines));
  return fields;
}

}  // namespace

Dictionary explanationDictionary(const StorebagExplainReport& report) {
  const StorebagExplanation& explanation = report.explanation;
  Array backends;
  for (const BackendExplanation& backend : explanation.backends) backends.append(backendDictionary(backend, report));
  Dictionary macros;
  for (const DictionaryEntry& macro : explanation.macros) macros.set(macro.key, writable(macro.value));
  return {{kBag, Dictionary{{kFile, report.file},
                            {kVersion, writable(explanation.version)},
                            {kIsSigned, report.isSigned},
                            {kIsSignatureChecked, false}}},
          {kCase, caseDictionary(report)},
          {kEnvironment, explanation.environment},
          {kSection, explanation.section.empty() ? Value() : Value(explanation.section)},
          {kSections, arrayOf(explanation.sections)},
          {kReleaseTimeout, secondsOrNone(explanation.releaseTimeout)},
          {kMacros, macros},
          {kUsedMacros, arrayOf(explanation.usedMacros)},
          {kUndefinedMacros, arrayOf(explanation.undefinedMacros)},
          {kLog, logArray(explanation.logLines)},
          {kBackends, backends}};
}

}  // namespace telvane
