#pragma once

#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "tools/LintReport.h"

namespace telvane {

// Finds keys that an author wrote twice in one dictionary, which parsers pass over in silence: the last one counts.
// Reads the text itself, JSON or an XML property list; a binary one has lost what its author wrote.
//
// Made for one text, which a parser has taken before: what is malformed is read somehow, and ends.
class RepeatedKeys {
 public:
  // report, text: outlive this.
  RepeatedKeys(LintReport& report, std::string_view text) : _report(report), _rest(text) {}

  void lint();

 private:
  // A dictionary or array that is open.
  struct Container {
    bool isDictionary;
    std::string path;
    std::set<std::string> keys = {};  // of a dictionary, so far
    std::string key = {};             // the last of them
    size_t index = 0;                 // of an array, the next element's
  };

  void lintJSON();
  void lintJSONText();
  void lintXML();
  void lintTag(std::string_view name, bool isEmpty);
  // Takes the text up to this mark, and the mark, off the rest; all of it when there is no such mark.
  std::string_view takeUntil(std::string_view mark);

  void open(bool isDictionary);
  void close();
  // Counts the value that has just ended, in an array.
  void takeValue();
  void takeKey(std::string key);
  // The place of the value that comes next.
  std::string nextPath() const;
  bool isInDictionary() const noexcept { return !_open.empty() && _open.back().isDictionary; }

  LintReport& _report;
  std::string_view _rest;
  std::vector<Container> _open;
  bool _isKeyNext = false;  // in JSON: a text that comes now is a key
};

}  // namespace telvane
