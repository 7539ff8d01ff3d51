#pragma once

#include <string>
#include <string_view>

#include "foundation/Error.h"
#include "foundation/Value.h"
#include "interfaces/BackendKind.h"
#include "tools/LintReport.h"
#include "tools/StorebagKeyLint.h"

namespace telvane {

// Names every mistake that the author of a bag can make: what devices would ignore, misread or never get to. Bags are
// looked at as devices use them, with their macros expanded; findings name places of the bag as it was written.
class StorebagLint {
 public:
  // Reads a bag as its author wrote it, or an envelope, and looks through it. The signature of an envelope is not
  // checked. Fails when the bytes are neither a property list nor JSON, or hold no dictionary.
  // bagName: under which devices will ask for the bag; any other text, or none, where that is not known.
  static Result<LintReport> lintFile(const Data& bytes, std::string_view bagName = {});
  static LintReport lintBag(const Dictionary& bag, std::string_view bagName = {});

 private:
  StorebagLint(LintReport& report, std::string_view bagName) : _report(report), _bagName(bagName) {}

  void lintEnvelope(const Dictionary& envelope, bool isPropertyList);
  void lintInner(const Dictionary& bag);
  void lintForm(const Dictionary& bag);
  void lintMissingSections(const Dictionary& bag);
  void lintSection(const std::string& path, const Dictionary& section, StorebagKeyLint::Audience audience);
  void lintBackend(const std::string& path, std::string_view name, const Value& profile, StorebagKeyLint& keys);
  void lintName(const std::string& path, std::string_view name);
  // What is to be said of a backend whatever its profile holds.
  void lintKind(const std::string& path, BackendKind kind);
  void lintClientTypes(const std::string& path);
  void lintProfile(const std::string& path, const Dictionary& profile, StorebagLevel level, StorebagKeyLint& keys);

  LintReport& _report;
  const std::string_view _bagName;
};

}  // namespace telvane
