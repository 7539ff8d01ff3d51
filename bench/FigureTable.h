#pragma once

#include <optional>
#include <string>
#include <vector>

#include "bench/Samples.h"

namespace telvane::bench {

// What a figure is to be.
struct Goal {
  enum class Kind { AtMost, AtLeast };
  Kind kind = Kind::AtMost;
  double limit = 0;

  bool isMetBy(double value) const noexcept { return kind == Kind::AtMost ? value <= limit : value >= limit; }
};

// One row: a figure that was measured once or several times.
struct Figure {
  std::string what;
  Samples samples;
  std::string unit = {};  // with its blank: " us"
  int decimals = 2;
  std::optional<Goal> goal = {};
};

// The figures of a measurement beside their goals, as a Markdown table that can be copied into a note.
class FigureTable {
 public:
  // Its median, with the range when there are several samples, and whether the median meets the goal.
  void add(const Figure& figure);
  // A row in words; isMet: absent when there is nothing to be met.
  void add(const std::string& what, const std::string& value, const std::string& goal = {},
           std::optional<bool> isMet = {});
  // A line under the table.
  void addNote(const std::string& note) { _notes.push_back(note); }
  std::string text() const;

 private:
  using Row = std::vector<std::string>;

  std::vector<Row> _rows = {{"what", "median", "range", "goal", ""}};
  std::vector<std::string> _notes;
};

}  // namespace telvane::bench
