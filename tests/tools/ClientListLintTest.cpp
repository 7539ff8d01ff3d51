#include "tools/ClientListLint.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

#include "backends/ListMatching.h"
#include "backends/TelvaneBackend.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/SeededGenerator.h"
#include "tests/support/Seeds.h"
#include "tools/StorebagLint.h"

namespace telvane::testing {
namespace {

// Client names, service names and service parts are few, so that entries often fit the same sessions.
constexpr const char* kClients[] = {nullptr, "a", "B", "c"};
constexpr const char* kServices[] = {nullptr, "s", "t", "sT", "sst", "x"};
constexpr const char* kClientLists[] = {nullptr, "a", "b", "A,b", "a,b,c"};
constexpr const char* kServiceLists[] = {nullptr, "s", "St", "t,s", "sst,t"};
constexpr const char* kVersions[] = {nullptr, "1.0.0", "1.2.0", "2.0.0"};
constexpr std::tuple<uint8_t, uint8_t, uint8_t> kFrameworks[] = {{0, 0, 0}, {1, 0, 0}, {1, 2, 0}, {2, 0, 0}};

// Opens what backends read versions with.
struct Versions : TelvaneBackend {
  using TelvaneBackend::versionComponents;
};

std::string_view viewOf(const char* text) { return text != nullptr ? std::string_view(text) : std::string_view(); }

template <size_t N>
void setOneOf(SeededGenerator& generator, Dictionary& entry, const Key& key, const char* const (&values)[N]) {
  if (const char* value = values[generator.below(N)]) entry.set(key, value);
}

Array randomEntries(SeededGenerator& generator) {
  Array entries;
  for (uint64_t left = 1 + generator.below(5); left > 0; --left) {
    Dictionary entry;
    setOneOf(generator, entry, kClientEntryClient, kClientLists);
    setOneOf(generator, entry, kClientEntryService, kServiceLists);
    setOneOf(generator, entry, kClientEntryEnabledSince, kVersions);
    entries.append(entry);
  }
  return entries;
}

// The entry that decides over a session, by the daemon's own matching.
std::optional<size_t> matchedEntry(const Array& entries, const char* client, const char* service,
                                   const std::tuple<uint8_t, uint8_t, uint8_t>& framework) {
  for (size_t i = 0; i < entries.size(); ++i) {
    const Dictionary& entry = *entries[i].dictionary();
    const bool fits =
        matchExactStringWithList(namesSeparatedByCommas(entry[kClientEntryClient]), viewOf(client), true) &&
        matchStringWithList(namesSeparatedByCommas(entry[kClientEntryService]), viewOf(service), true) &&
        Versions::versionComponents(entry[kClientEntryEnabledSince].text()) <= framework;
    if (fits) return i;
  }
  return std::nullopt;
}

std::set<size_t> entriesThatSomeSessionGetsTo(const Array& entries) {
  std::set<size_t> reached;
  for (const char* client : kClients) {
    for (const char* service : kServices) {
      for (const auto& framework : kFrameworks) {
        if (const auto index = matchedEntry(entries, client, service, framework)) reached.insert(*index);
      }
    }
  }
  return reached;
}

// The sessions above meet every way in which these lists can fit, so "never reached" must be said of exactly the
// entries that none of them gets to.
TEST(ClientListLintTest, saysNeverReachedOfExactlyTheEntriesThatTheDaemonNeverGetsTo) {
  size_t unreached = 0;
  forEachSeed(3000, [&unreached](uint64_t seed) {
    SeededGenerator generator(seed);
    const Array entries = randomEntries(generator);
    LintReport report;
    ClientListLint(report).lint("clients", entries);
    std::set<std::string> said;
    for (const LintFinding& finding : report.findings()) {
      if (finding.severity == LintFinding::Severity::Error) said.insert(finding.path);
    }
    const std::set<size_t> reached = entriesThatSomeSessionGetsTo(entries);
    for (size_t i = 0; i < entries.size(); ++i) {
      EXPECT_EQ(said.contains("clients[" + std::to_string(i) + "]"), !reached.contains(i))
          << i << " of " << description(entries);
      unreached += reached.contains(i) ? 0 : 1;
    }
  });
  EXPECT_GT(unreached, 0u);  // else the comparison says nothing
}

}  // namespace
}  // namespace telvane::testing
