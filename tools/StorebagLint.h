#pragma once

#include <string>

#include "foundation/Error.h"
#include "foundation/Value.h"
#include "tools/LintReport.h"
#include "tools/StorebagKeyLint.h"

namespace telvane {

// Names every mistake that the author of a bag can make: what devices would ignore, misread or never get to. Bags are
// looked at as devices use them, with their macros expanded; findings name places of the bag as it was written.
class StorebagLint {
 public:
  // Reads a bag as its author wrote it, or an envelope, and looks through it. The signature of an envelope is not
  // checked. Fails when the bytes are neither a property list nor JSON, or hold no dictionary.
  static Result<LintReport> lintFile(const Data& bytes);
  static LintReport lintBag(const Dictionary& bag);

 private:
  explicit StorebagLint(LintReport& report) : _report(report) {}

  void lintEnvelope(const Dictionary& envelope, bool isPropertyList);
  void lintInner(const Dictionary& bag);
  void lintForm(const Dictionary& bag);
  void lintMissingSections(const Dictionary& bag);
  void lintSection(const std::string& path, const Dictionary& section, StorebagKeyLint::Audience audience);
  void lintBackend(const std::string& path, std::string_view name, const Value& profile, StorebagKeyLint& keys);
  void lintName(const std::string& path, std::string_view name);
  void lintProfile(const std::string& path, const Dictionary& profile, StorebagLevel level, StorebagKeyLint& keys);

  LintReport& _report;
};

}  // namespace telvane
