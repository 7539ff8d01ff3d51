#include "tools/StorebagExplainText.h"

#include <algorithm>
#include <set>

#include "foundation/Format.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/StorebagKeys.h"
#include "tools/StorebagEnvelope.h"
#include "tools/StorebagExplainGates.h"

namespace telvane {
namespace {

template <class Names>
std::string joined(const Names& names) {
  std::string list;
  for (const auto& name : names) list += (list.empty() ? "" : ", ") + std::string(name);
  return list.empty() ? "none" : list;
}

std::string textOrNone(const std::string& text) { return text.empty() ? "none" : text; }

std::string fact(std::string_view name, std::string_view text) { return fmt::format("{:<13}{}\n", name, text); }

std::string sessionText(const StorebagExplainCase& situation) {
  const ClientType* type = clientType(situation.clientType);
  return fmt::format("client type {} ({}, bag \"{}\"), client {}, service {}, user info {}required, events {}",
                     situation.clientType, type->senderName, type->storebagName, textOrNone(situation.clientName),
                     textOrNone(situation.serviceName), situation.requiresUserInfo ? "" : "not ",
                     situation.batchesEvents ? "to be batched" : "one by one");
}

std::string deviceText(const StorebagExplainReport& report) {
  const StorebagExplainCase& situation = report.situation;
  return fmt::format("country {}, product family {}, hardware {}, framework {}, {} build, sampling factor {}",
                     textOrNone(situation.country), textOrNone(situation.productFamily), textOrNone(situation.hardware),
                     report.explanation.frameworkVersion, report.explanation.isInternalBuild ? "internal" : "customer",
                     situation.samplingFactor);
}

std::string bagText(const StorebagExplainReport& report) {
  return fmt::format("{}, version {}, {}", report.file, shortText(report.explanation.version),
                     report.isSigned ? "in an envelope; its signature was not checked" : "not signed");
}

std::string sectionText(const StorebagExplanation& explanation) {
  const std::string_view environment = explanation.environment.empty() ? "none" : explanation.environment;
  if (explanation.section == explanation.environment && !explanation.section.empty()) return std::string(environment);
  const std::string sections = joined(explanation.sections);
  if (explanation.section.empty()) {
    return fmt::format("{}, which the bag has no section for (it has: {}): no backends, nothing is reported",
                       environment, sections);
  }
  return fmt::format("{}, which the bag has no section for (it has: {}): {} is taken instead", environment, sections,
                     explanation.section);
}

std::string moreText(size_t count) { return fact("", fmt::format("and {} more", count)); }

// The first macros of the bag; all of them are in the JSON.
std::string macrosText(const StorebagExplanation& explanation) {
  constexpr size_t kMostShown = 100;
  const std::set<std::string_view> used(explanation.usedMacros.begin(), explanation.usedMacros.end());
  std::string text;
  size_t shown = 0;
  for (const DictionaryEntry& macro : explanation.macros) {
    if (shown++ == kMostShown) break;
    text += fact(text.empty() ? "macros" : "", fmt::format("{} = {}{}", shortText(macro.key), shortText(macro.value),
                                                           used.contains(macro.key.view()) ? "" : " (not used here)"));
  }
  if (explanation.macros.size() > kMostShown) text += moreText(explanation.macros.size() - kMostShown);
  const auto& undefined = explanation.undefinedMacros;
  for (size_t i = 0; i < std::min(undefined.size(), kMostShown); ++i) {
    text += fact(text.empty() ? "macros" : "",
                 fmt::format("{} is not defined and stays as it is", shortText(undefined[i])));
  }
  if (undefined.size() > kMostShown) text += moreText(undefined.size() - kMostShown);
  return text;
}

// The session reads any value as a number.
std::string connectionText(const Value& releaseTimeout) {
  const uint32_t seconds = releaseTimeout.uint32Value();
  std::string text = fmt::format("kept {} s when nobody reports", seconds);
  if (seconds == 0) text = "kept until the daemon ends";
  if (!releaseTimeout.isNumber()) text += fmt::format(" (the bag says {})", shortText(releaseTimeout));
  return text;
}

std::string stepText(const GateStep& step) {
  std::string name;
  if (step.entry.has_value()) name = fmt::format("{}[{}] ", kProfileClients.view(), *step.entry);
  name += gateName(step.answer.gate);
  return fmt::format("  {:<8} {:<31} {}\n", outcomeWord(step), name, gateSentence(step));
}

// Of an entry's own gates only the one that skips it says something: who passes them all is the matching entry.
bool isWorthALine(const GateStep& step) {
  const Gate gate = step.answer.gate;
  if (gate < Gate::EntryKind || gate > Gate::EnabledSince) return true;
  return step.answer.outcome == GateOutcome::Refused;
}

std::string logText(const std::vector<KeptLog::Line>& lines) {
  std::string text;
  for (const KeptLog::Line& line : lines) {
    text += fmt::format("  log      {}{}\n", line.level == LogLevel::Error ? "<error> " : "", shortText(line.message));
  }
  return text;
}

std::string backendText(const BackendExplanation& backend, const StorebagExplainReport& report, ExplainedLog log) {
  std::string text =
      fmt::format("\n{}: {}\n", shortText(backend.name), backend.isMade ? stateName(backend.state) : "not made");
  if (const GateStep* step = decidingStep(backend)) {
    text += fmt::format("  because  {}: {}\n", gateName(step->answer.gate), gateSentence(*step));
  } else {
    text += fmt::format("  because  {}\n", ungatedSentence(backend, report.situation));
  }
  if (backend.isMade) text += fmt::format("  events   {}\n", eventsSentence(backend, report.situation));
  for (const GateStep& step : backend.steps) {
    if (isWorthALine(step)) text += stepText(step);
  }
  return log == ExplainedLog::Shown ? text + logText(backend.logLines) : text;
}

// Whether a backend's state hangs on a draw that nobody gave.
bool hangsOnAssumedDraw(const StorebagExplainReport& report) {
  const bool isAssumed = std::any_of(report.assumed.begin(), report.assumed.end(), [](const std::string& option) {
    return option.starts_with("--sampling-factor ");
  });
  const auto leavesSomeOut = [](const GateStep& step) {
    const Value& threshold = step.answer.against;
    return step.answer.gate == Gate::Sampling && threshold.isPresent() && threshold.realValue() < 1;
  };
  const auto& backends = report.explanation.backends;
  return isAssumed && std::any_of(backends.begin(), backends.end(), [&](const BackendExplanation& backend) {
           return std::any_of(backend.steps.begin(), backend.steps.end(), leavesSomeOut);
         });
}

// The client type whose bag has this file's name, when the session's type has another bag; null otherwise.
const ClientType* otherTypeOfFile(const StorebagExplainReport& report) {
  const std::string_view stem = storebagenvelope::bagNameOfFile(report.file);
  if (stem == clientType(report.situation.clientType)->storebagName) return nullptr;
  const auto& types = allClientTypes();
  const auto found =
      std::find_if(types.begin(), types.end(), [stem](const ClientType& type) { return type.storebagName == stem; });
  return found != types.end() ? &*found : nullptr;
}

// What a reader may overlook.
std::string notesText(const StorebagExplainReport& report) {
  std::string text;
  if (hangsOnAssumedDraw(report)) {
    text += fact("note", "the sampling factor is assumed; other devices draw another, see --sampling-factor");
  }
  if (const ClientType* other = otherTypeOfFile(report)) {
    text +=
        fact("note", fmt::format("the file is named as the bag of client type {}; see --client-type", other->number));
  }
  return text;
}

}  // namespace

std::string explanationText(const StorebagExplainReport& report, ExplainedLog log) {
  const StorebagExplanation& explanation = report.explanation;
  std::string text = fact("bag", bagText(report)) + fact("environment", sectionText(explanation)) +
                     fact("session", sessionText(report.situation)) + fact("device", deviceText(report)) +
                     fact("consent", report.situation.hasConsent ? "on" : "off") +
                     fact("assumed", joined(report.assumed)) + macrosText(explanation);
  if (explanation.releaseTimeout.isPresent()) {
    text += fact("connection", connectionText(explanation.releaseTimeout));
  }
  if (log == ExplainedLog::Shown) text += logText(explanation.logLines);
  if (explanation.backends.empty() && !explanation.section.empty()) text += "\nthe section names no backend\n";
  text += notesText(report);
  for (const BackendExplanation& backend : explanation.backends) text += backendText(backend, report, log);
  return text;
}

}  // namespace telvane
