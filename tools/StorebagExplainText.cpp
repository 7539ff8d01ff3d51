#include "tools/StorebagExplainText.h"

#include <algorithm>

#include "foundation/Format.h"
#include "interfaces/ClientTypes.h"
#include "interfaces/StorebagKeys.h"
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

std::string macrosText(const StorebagExplanation& explanation) {
  std::string text;
  for (const DictionaryEntry& macro : explanation.macros) {
    const auto& used = explanation.usedMacros;
    const bool isUsed = std::find(used.begin(), used.end(), macro.key) != used.end();
    text += fact(text.empty() ? "macros" : "", fmt::format("{} = {}{}", shortText(macro.key), shortText(macro.value),
                                                           isUsed ? "" : " (not used here)"));
  }
  for (const String& name : explanation.undefinedMacros) {
    text += fact(text.empty() ? "macros" : "", fmt::format("{} is not defined and stays as it is", shortText(name)));
  }
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
    std::string message = line.message;
    for (size_t at = message.find('\n'); at != std::string::npos; at = message.find('\n', at)) {
      message.replace(at, 1, "\\n");
    }
    text += fmt::format("  log      {}{}\n", line.level == LogLevel::Error ? "<error> " : "", shortText(message));
  }
  return text;
}

std::string backendText(const BackendExplanation& backend, const StorebagExplainReport& report, ExplainedLog log) {
  std::string text =
      fmt::format("\n{}: {}\n", shortText(backend.name), backend.isMade ? stateName(backend.state) : "not made");
  if (const GateStep* step = decidingStep(backend)) {
    text += fmt::format("  because  {}: {}\n", gateName(step->answer.gate), gateSentence(*step));
    text += fmt::format("  events   {}\n", eventsSentence(backend, report.situation));
  } else {
    text += fmt::format("  because  {}\n", notMadeSentence(backend, report.situation));
  }
  for (const GateStep& step : backend.steps) {
    if (isWorthALine(step)) text += stepText(step);
  }
  return log == ExplainedLog::Shown ? text + logText(backend.logLines) : text;
}

}  // namespace

std::string explanationText(const StorebagExplainReport& report, ExplainedLog log) {
  const StorebagExplanation& explanation = report.explanation;
  std::string text = fact("bag", bagText(report)) + fact("environment", sectionText(explanation)) +
                     fact("session", sessionText(report.situation)) + fact("device", deviceText(report)) +
                     fact("consent", report.situation.hasConsent ? "on" : "off") +
                     fact("assumed", joined(report.assumed)) + macrosText(explanation);
  if (explanation.releaseTimeout.isPresent()) {
    text += fact("connection", fmt::format("kept {} s when nobody reports", shortText(explanation.releaseTimeout)));
  }
  if (log == ExplainedLog::Shown) text += logText(explanation.logLines);
  if (explanation.backends.empty() && !explanation.section.empty()) text += "\nthe section names no backend\n";
  for (const BackendExplanation& backend : explanation.backends) text += backendText(backend, report, log);
  return text;
}

}  // namespace telvane
