#pragma once

#include <cstdint>
#include <string>

#include "foundation/Value.h"
#include "tools/LintReport.h"
#include "tools/StorebagKeyLint.h"

namespace telvane {

// Looks at the filters of one client entry: each for itself, and in the order in which devices try them.
class EventFilterLint {
 public:
  // report, keys: outlive this.
  EventFilterLint(LintReport& report, StorebagKeyLint& keys) : _report(report), _keys(keys) {}

  void lint(const std::string& path, const Array& filters);

 private:
  // Which events of a field a filter is for; negative numbers mean all.
  struct Reach {
    int32_t method;
    int32_t status;
    size_t index;

    bool covers(const Reach& other) const noexcept;
  };

  static Reach reachOf(const Dictionary& filter, size_t index);
  void lintAction(const std::string& path, const Dictionary& filter);
  void lintValues(const std::string& path, const Dictionary& filter, std::string_view action);
  void lintBodyField(const std::string& path, const Dictionary& filter, const Reach& reach);

  LintReport& _report;
  StorebagKeyLint& _keys;
};

}  // namespace telvane
