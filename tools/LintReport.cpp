#include "tools/LintReport.h"

#include <fmt/format.h>

#include <algorithm>

namespace telvane {

bool LintReport::mayGoOn(size_t steps) {
  _steps += std::min(steps, kMostSteps);
  if (!_isOver && _steps > kMostSteps) {
    end("is too large to be looked through to its end; split it, or use fewer macros with long values");
  }
  return !_isOver;
}

size_t LintReport::count(LintFinding::Severity severity) const noexcept {
  return static_cast<size_t>(std::count_if(_findings.begin(), _findings.end(), [severity](const LintFinding& finding) {
    return finding.severity == severity;
  }));
}

void LintReport::add(LintFinding::Severity severity, std::string_view path, std::string text) {
  if (_isOver) return;
  if (_findings.size() == kMostFindings) {
    end(fmt::format("has more than {} findings; mend these, then look again", kMostFindings));
    return;
  }
  if (const std::string_view note = noteFor(path); !note.empty()) text += fmt::format(" ({})", note);
  _findings.push_back({severity, path.empty() ? "/" : std::string(path), std::move(text)});
}

void LintReport::end(std::string text) {
  _isOver = true;
  _findings.push_back({LintFinding::Severity::Error, "/", std::move(text)});
}

// The innermost place that has one counts.
std::string_view LintReport::noteFor(std::string_view path) const {
  while (!_notes.empty()) {
    if (const auto note = _notes.find(path); note != _notes.end()) return note->second;
    const size_t end = path.find_last_of("/[");
    if (end == std::string_view::npos) break;
    path = path.substr(0, end);
  }
  return {};
}

}  // namespace telvane
