#include "tools/StatusText.h"

#include "foundation/Format.h"
#include "interfaces/AgentKeys.h"

namespace telvane {
namespace {

constexpr double kBytesPerMegabyte = 1e6;

std::string countsText(const Value& counts) {
  const Dictionary* dictionary = counts.dictionary();
  std::string text;
  if (dictionary == nullptr) return text;
  for (const DictionaryEntry& entry : *dictionary) {
    text += fmt::format("\n  {:<28}{}", entry.key.view(), entry.value.integerValue());
  }
  return text;
}

std::string storebagsText(const Value& storebags) {
  const Dictionary* dictionary = storebags.dictionary();
  if (dictionary == nullptr || dictionary->empty()) return " none";
  std::string text;
  for (const DictionaryEntry& entry : *dictionary) {
    const Dictionary* bag = entry.value.dictionary();
    if (bag == nullptr) continue;
    const std::string_view version = (*bag)[kStatusStorebagVersion].text();
    text += fmt::format("\n  {:<28}version {}, {} s old, fresh for {} s, {}", entry.key.view(),
                        version.empty() ? "unknown" : version, (*bag)[kStatusStorebagAgeSeconds].integerValue(),
                        (*bag)[kStatusStorebagMaxAgeSeconds].integerValue(), (*bag)[kStatusStorebagState].text());
  }
  return text;
}

}  // namespace

std::string statusText(const Dictionary& status) {
  const auto number = [&status](const Key& key) { return status[key].integerValue(); };
  std::string text =
      fmt::format("telvaned {}, pid {}, up {} s, {:.1f} MB", status[kStatusVersion].text(), number(kStatusProcessID),
                  number(kStatusUptimeSeconds), static_cast<double>(number(kStatusMemoryBytes)) / kBytesPerMegabyte);
  text += fmt::format("\nsessions: {}{}", number(kStatusSessions), countsText(status[kStatusClientTypes]));
  text += fmt::format("\nhierarchies: {}", number(kStatusHierarchies));
  text += fmt::format("\ntransactions: {}", number(kStatusTransactions));
  text += fmt::format("\nconnectivity helpers: {}", number(kStatusConnectivityHelpers));
  text += fmt::format("\nstorebags:{}", storebagsText(status[kStatusStorebags]));
  return text;
}

}  // namespace telvane
