#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace telvane {

// One mistake in a bag.
struct LintFinding {
  enum class Severity : uint8_t {
    Error,    // the bag does not do what it says
    Warning,  // it does, but that is probably not what was meant
  };
  Severity severity;
  std::string path;  // "release/splunk/clients[2]/filters[0]/action"; "/" is the whole bag
  std::string text;  // what is wrong and what to do, on one line
};

// What a look through a bag has found, in the order of the look. A bag may come from anybody, so the look is bounded:
// when there are too many findings or too much to look at, the report says so, and whoever looks is to stop.
//
// Made for one bag; used on one thread.
class LintReport {
 public:
  static constexpr size_t kMostFindings = 1000;
  static constexpr size_t kMostSteps = 4'000'000;

  // Notes on places whose value came from elsewhere, by path: added to every finding there and below.
  void setNotes(std::map<std::string, std::string, std::less<>> notes) { _notes = std::move(notes); }

  // path: empty for the whole bag.
  void error(std::string_view path, std::string text) { add(LintFinding::Severity::Error, path, std::move(text)); }
  void warning(std::string_view path, std::string text) { add(LintFinding::Severity::Warning, path, std::move(text)); }

  // Takes this many looks at a value. Returns whether there is room for more.
  bool mayGoOn(size_t steps = 1);

  const std::vector<LintFinding>& findings() const noexcept { return _findings; }
  size_t count(LintFinding::Severity severity) const noexcept;

 private:
  void add(LintFinding::Severity severity, std::string_view path, std::string text);
  void end(std::string text);
  std::string_view noteFor(std::string_view path) const;

  std::map<std::string, std::string, std::less<>> _notes;
  std::vector<LintFinding> _findings;
  size_t _steps = 0;
  bool _isOver = false;
};

}  // namespace telvane
