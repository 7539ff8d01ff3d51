#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "foundation/Value.h"
#include "tools/LintReport.h"
#include "tools/StorebagKeyTable.h"

namespace telvane {

// Holds the dictionaries of a bag against the table of keys: unknown and missing keys, values of a wrong type, numbers
// out of range, texts that mean nothing. What concerns several keys at once is looked at elsewhere.
//
// A value that devices read as what it was meant to be (a number written as text) is a warning, any other an error.
class StorebagKeyLint {
 public:
  // Whose devices read this part of the bag: only internal builds post to a plain http URL.
  enum class Audience : uint8_t { Everybody, InternalBuilds };

  // report: outlives this.
  StorebagKeyLint(LintReport& report, Audience audience) : _report(report), _audience(audience) {}

  // path: of the dictionary, empty for the bag.
  void lint(const std::string& path, StorebagLevel level, const Dictionary& dictionary);

  // A finding that a value is of a kind which the key does not take. consequence: what devices do with it.
  void reportKind(const std::string& path, std::string_view wanted, const Value& value, std::string_view consequence);

 private:
  using Row = StorebagKey;

  void lintUnknownKey(const std::string& path, StorebagLevel level, std::string_view key);
  void lintValue(const std::string& path, const Row& row, const Value& value);

  void lintText(const std::string& path, const Row& row, const Value& value);
  void lintNames(const std::string& path, const Row& row, const Value& value);
  void lintVersion(const std::string& path, const Row& row, const Value& value);
  void lintURL(const std::string& path, const Row& row, const Value& value);
  void lintPlainHTTP(const std::string& path, const Row& row);
  void lintIPv4Address(const std::string& path, const Row& row, const Value& value);
  void lintAction(const std::string& path, const Row& row, const Value& value);
  void lintPresence(const std::string& path, const Value& value);

  void lintWholeNumber(const std::string& path, const Row& row, const Value& value);
  void lintRange(const std::string& path, const Row& row, int64_t number);
  void reportOutOfRange(const std::string& path, const Row& row, const Value& value);
  void lintShare(const std::string& path, const Row& row, const Value& value);
  // Returns the number that the value stands for, when it is finite; findings on its form are made on the way.
  // consequence: what devices do with what is no number.
  std::optional<double> numberOf(const std::string& path, const Row& row, const Value& value,
                                 std::string_view consequence);

  // Returns the elements; null, with a finding, when the value is no array.
  const Array* elementsOf(const std::string& path, const Row& row, const Value& value, std::string_view consequence);
  void lintTexts(const std::string& path, const Row& row, const Value& value);
  void lintCountries(const std::string& path, const Row& row, const Value& value);
  void lintCountry(const std::string& path, const Row& row, std::string_view code);
  void lintCategories(const std::string& path, const Row& row, const Value& value);
  void lintCategory(const std::string& path, const Row& row, const Value& value);
  void lintEntries(const std::string& path, const Row& row, const Value& value);
  void lintDictionary(const std::string& path, const Row& row, const Value& value);

  LintReport& _report;
  const Audience _audience;
};

}  // namespace telvane
