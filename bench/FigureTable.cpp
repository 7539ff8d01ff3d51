#include "bench/FigureTable.h"

#include <fmt/format.h>

#include <algorithm>

namespace telvane::bench {
namespace {

std::string number(double value, int decimals) { return fmt::format("{:.{}f}", value, decimals); }

std::string verdict(std::optional<bool> isMet) {
  if (!isMet.has_value()) return {};
  return *isMet ? "met" : "missed";
}

std::string goalText(const Figure& figure) {
  if (!figure.goal.has_value()) return {};
  const char* words = figure.goal->kind == Goal::Kind::AtMost ? "at most" : "at least";
  return fmt::format("{} {}{}", words, number(figure.goal->limit, figure.decimals), figure.unit);
}

std::string rangeText(const Figure& figure) {
  if (figure.samples.count() < 2) return {};
  return fmt::format("{} to {}", number(figure.samples.least(), figure.decimals),
                     number(figure.samples.most(), figure.decimals));
}

}  // namespace

void FigureTable::add(const Figure& figure) {
  const double median = figure.samples.median();
  std::optional<bool> isMet;
  if (figure.goal.has_value()) isMet = figure.goal->isMetBy(median);
  _rows.push_back({figure.what, number(median, figure.decimals) + figure.unit, rangeText(figure), goalText(figure),
                   verdict(isMet)});
}

void FigureTable::add(const std::string& what, const std::string& value, const std::string& goal,
                      std::optional<bool> isMet) {
  _rows.push_back({what, value, {}, goal, verdict(isMet)});
}

std::string FigureTable::text() const {
  std::vector<size_t> widths(_rows.front().size(), 0);
  for (const Row& row : _rows) {
    for (size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], row[i].size());
  }
  std::string text;
  for (size_t line = 0; line < _rows.size(); ++line) {
    for (size_t i = 0; i < widths.size(); ++i) text += fmt::format("| {:<{}} ", _rows[line][i], widths[i]);
    text += "|\n";
    if (line > 0) continue;
    for (const size_t width : widths) text += "|" + std::string(width + 2, '-');
    text += "|\n";
  }
  for (const std::string& note : _notes) text += "\n" + note + "\n";
  return text;
}

}  // namespace telvane::bench
