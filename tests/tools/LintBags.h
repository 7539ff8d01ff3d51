#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"
#include "tools/StorebagLint.h"

// Bags to be looked through for mistakes, and what is said of them.
namespace telvane::testing {

inline std::vector<std::string> linesOf(const LintReport& report) {
  std::vector<std::string> lines;
  for (const LintFinding& finding : report.findings()) {
    const bool isError = finding.severity == LintFinding::Severity::Error;
    lines.push_back((isError ? "error: " : "warning: ") + finding.path + ": " + finding.text);
  }
  return lines;
}

// One finding at this place whose text has this part.
inline auto finding(const char* severity, const std::string& path, const std::string& part) {
  return ::testing::AllOf(::testing::StartsWith(std::string(severity) + ": " + path + ": "),
                          ::testing::HasSubstr(part));
}
inline auto error(const std::string& path, const std::string& part) { return finding("error", path, part); }
inline auto warning(const std::string& path, const std::string& part) { return finding("warning", path, part); }

inline Value parsed(const std::string& json) {
  const Result<Value> value = json::parse(json);
  EXPECT_TRUE(value.has_value()) << json;
  return value.has_value() ? *value : Value();
}

// An entry in which there is nothing to complain about.
inline Dictionary cleanEntry() {
  return *parsed(R"({"post_url": "https://collector.example/events", "locale_whitelist": ["US", "DE"], "filters": [],
                     "sampling_threshold": 0.5})")
              .dictionary();
}
inline Dictionary entryWith(const char* key, Value value) {
  Dictionary entry = cleanEntry();
  entry.set(key, std::move(value));
  return entry;
}
inline Dictionary sectionOf(Array clients) {
  return {{Key("splunk"), Dictionary{{kProfileClients, std::move(clients)}}}};
}
// A bag whose section for customers has these client entries, and in which there is nothing else to complain about.
inline Dictionary bagOf(Array clients) {
  const Dictionary clean = sectionOf(Array{cleanEntry()});
  return {{kStorebagVersion, "7"},
          {kEnvironmentDevelopment, clean},
          {kEnvironmentInternal, clean},
          {kEnvironmentSeed, clean},
          {kEnvironmentRelease, sectionOf(std::move(clients))}};
}
inline Dictionary bagWith(const char* key, Value value) {
  Dictionary bag = bagOf(Array{cleanEntry()});
  bag.set(key, std::move(value));
  return bag;
}

inline std::vector<std::string> lintBag(const Dictionary& bag) { return linesOf(StorebagLint::lintBag(bag)); }

inline std::string plist(const Value& value) {
  return std::string(propertylist::serialize(value, propertylist::Format::XML).value().view());
}

}  // namespace telvane::testing
