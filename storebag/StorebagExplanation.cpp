#include "storebag/StorebagExplanation.h"

#include <algorithm>
#include <unordered_set>

#include "backends/SecuredURL.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "storebag/BackendCreation.h"
#include "storebag/StorebagMacros.h"
#include "storebag/StorebagSection.h"

namespace telvane {
namespace {

// Writes the steps of one decision down.
class GateRecorder final : public GateObserver {
 public:
  explicit GateRecorder(std::vector<GateStep>& steps) : _steps(steps) {}

  void willLookAtEntry(std::optional<size_t> index) override { _entry = index; }
  void didAnswer(GateAnswer answer) override { _steps.push_back({_entry, std::move(answer)}); }

 private:
  std::vector<GateStep>& _steps;
  std::optional<size_t> _entry;
};

// Sorts the names of macros in a section into those that are defined and those that are not, each once, in their order.
// A bag may hold as many names as fit into its size.
class MacroNames {
 public:
  explicit MacroNames(StorebagExplanation& explanation) : _explanation(explanation) {}

  // Recursion is bounded by the depth that the parsers admit. REQUIRES: the value outlives this object.
  void sort(const Value& value) {
    if (isMacroName(value) && _seen.insert(value.text()).second) {
      const bool isDefined = macroNamedBy(value, _explanation.macros) != nullptr;
      (isDefined ? _explanation.usedMacros : _explanation.undefinedMacros).push_back(*value.string());
    }
    if (const Dictionary* dictionary = value.dictionary()) {
      for (const DictionaryEntry& entry : *dictionary) sort(entry.value);
    }
    if (const Array* array = value.array()) {
      for (const Value& element : *array) sort(element);
    }
  }

 private:
  StorebagExplanation& _explanation;
  std::unordered_set<std::string_view> _seen;
};

// The address that the last setting of the URL leads to.
std::optional<std::string> addressAfter(const std::vector<GateStep>& steps, Gate gate, bool isInternalBuild) {
  const auto last =
      std::find_if(steps.rbegin(), steps.rend(), [gate](const GateStep& step) { return step.answer.gate == gate; });
  if (last == steps.rend() || !last->answer.tested.isString()) return std::nullopt;
  return securedURL(last->answer.tested.text(), isInternalBuild);
}

BackendExplanation explainBackend(const ProcessContext& context, KeptLog& log, const DictionaryEntry& entry,
                                  const Dictionary& sessionInfo, const Value& userInfo) {
  BackendExplanation explanation{.name = entry.key, .profile = entry.value};
  Dictionary alone;
  alone.set(entry.key, entry.value);
  const std::optional<BackendTable> made = createBackends(context, alone, sessionInfo, userInfo, String());
  if (made.has_value() && !made->empty()) {
    TelvaneBackend& backend = *made->front().second;
    GateRecorder recorder(explanation.steps);
    backend.setGateObserver(&recorder);
    explanation.state = backend.updateState();
    backend.setGateObserver(nullptr);
    explanation.isMade = true;
    explanation.batchesEvents = backend.batchEvents();
    const bool isInternalBuild = context.isInternalBuild();
    explanation.postAddress = addressAfter(explanation.steps, Gate::PostURL, isInternalBuild);
    explanation.realtimePostAddress = addressAfter(explanation.steps, Gate::RealtimePostURL, isInternalBuild);
    backend.cleanup();
  }
  explanation.logLines = log.take();
  return explanation;
}

}  // namespace

StorebagExplanation explainStorebag(Platform& platform, KeptLog& log, const Dictionary& bag,
                                    const Dictionary& sessionInfo, const Value& userInfo) {
  const ProcessContext context(platform);
  StorebagExplanation explanation{.frameworkVersion = context.clientFrameworkVersion(),
                                  .isInternalBuild = context.isInternalBuild(),
                                  .version = bag[kStorebagVersion],
                                  .releaseTimeout = bag[kStorebagReleaseTimeout]};
  for (const Key& name : {kEnvironmentDevelopment, kEnvironmentInternal, kEnvironmentSeed, kEnvironmentRelease}) {
    if (bag[name].isDictionary()) explanation.sections.push_back(name.view());
  }
  if (const Dictionary* macros = bag[kStorebagSharedValues].dictionary())
    explanation.macros = splitMacroValues(*macros);
  const int32_t clientType = sessionInfo[kTelvaneSessionInfoClientType].int32Value();
  const StorebagSection section = storebagSectionForEnvironment(context, expandStorebag(log, bag), clientType);
  explanation.environment = section.environment;
  explanation.section = section.name;
  explanation.logLines = log.take();
  if (!section.content.has_value()) return explanation;
  MacroNames(explanation).sort(bag[section.name]);
  for (const DictionaryEntry& entry : *section.content) {
    // The session reads it, no backend.
    if (entry.key == kStorebagReleaseTimeout.view()) continue;
    explanation.backends.push_back(explainBackend(context, log, entry, sessionInfo, userInfo));
  }
  return explanation;
}

}  // namespace telvane
