#include "storebag/StorebagExplanation.h"

#include <algorithm>

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

void addOnce(std::vector<String>& names, const Value& name) {
  const String& text = *name.string();
  if (std::find(names.begin(), names.end(), text) == names.end()) names.push_back(text);
}

// Recursion is bounded by the depth that the parsers admit.
void sortMacroNames(const Value& value, StorebagExplanation& explanation) {
  if (isMacroName(value)) {
    const bool isDefined = macroNamedBy(value, explanation.macros) != nullptr;
    addOnce(isDefined ? explanation.usedMacros : explanation.undefinedMacros, value);
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    for (const DictionaryEntry& entry : *dictionary) sortMacroNames(entry.value, explanation);
  }
  if (const Array* array = value.array()) {
    for (const Value& element : *array) sortMacroNames(element, explanation);
  }
}

BackendExplanation explainBackend(const ProcessContext& context, KeptLog& log, const DictionaryEntry& entry,
                                  const Dictionary& sessionInfo, const Value& userInfo) {
  BackendExplanation explanation{.name = entry.key};
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
  sortMacroNames(bag[section.name], explanation);
  for (const DictionaryEntry& entry : *section.content) {
    // The session reads it, no backend.
    if (entry.key == kStorebagReleaseTimeout.view()) continue;
    explanation.backends.push_back(explainBackend(context, log, entry, sessionInfo, userInfo));
  }
  return explanation;
}

}  // namespace telvane
