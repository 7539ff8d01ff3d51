#pragma once

#include <string>
#include <string_view>

#include "storebag/StorebagExplanation.h"
#include "tools/StorebagExplainReport.h"

// What the steps and the outcome of a backend's decision mean, in words.
namespace telvane {

// The name of a step ("country"), and the storebag key that it reads; an empty view when it reads none.
std::string_view gateName(Gate gate) noexcept;
std::string_view gateKey(Gate gate) noexcept;
// One word for how a step came out: "pass", "fail", "skip", "hold", "set", "default" or "kept".
std::string_view outcomeWord(const GateStep& step) noexcept;
// What was compared with what, and what follows.
std::string gateSentence(const GateStep& step);
// The step that decided the state; null when the backend was not made, or is of a kind that has no steps.
const GateStep* decidingStep(const BackendExplanation& backend) noexcept;
// The state by name: "unknown", "disabled", "enabled", "sampled out".
std::string_view stateName(uint32_t state) noexcept;
// What becomes of the session's events.
std::string eventsSentence(const BackendExplanation& backend, const StorebagExplainCase& situation);
// Why there is no step that decided: why the factory makes no backend of this entry, or that its kind has no steps.
std::string ungatedSentence(const BackendExplanation& backend, const StorebagExplainCase& situation);
// Returns what the setting is after the decision; an absent value when the decision did not come so far.
const Value& settingAfter(const BackendExplanation& backend, Gate gate) noexcept;
// A value on one line, cut after 1000 bytes; "none" for an absent one.
std::string shortText(const Value& value);

}  // namespace telvane
