// Bags from anybody: whatever they hold, lint ends, in bounded time, with findings that a terminal can show.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>

#include "foundation/Description.h"
#include "tests/tools/LintBags.h"
#include "tools/StorebagLint.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;

constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

std::vector<std::string> lintEntries(Array clients) { return lintBag(bagOf(std::move(clients))); }

std::vector<Value> valuesOfEveryKind() {
  const Dictionary nested{{Key("a"), Array{Dictionary{{Key("b"), Array{Array{1}}}}}}};
  Array withNull;
  withNull.append(Value());
  withNull.append("x");
  return {true,
          false,
          0,
          1,
          -1,
          65536,
          std::numeric_limits<int64_t>::max(),
          std::numeric_limits<int64_t>::min(),
          std::numeric_limits<uint64_t>::max(),
          0.5,
          -0.0,
          1e308,
          kNaN,
          kInfinity,
          -kInfinity,
          "",
          "x",
          "1",
          "-1e999",
          "==",
          "==MACRO",
          "==NONE",
          ",",
          ",,a, b",
          std::string(100000, 'x'),
          std::string("a\nb\x1b[31m\x7f\xff\xc2\x9b"),
          std::string(100, ','),
          Data(std::string("\0\1\2", 3)),
          Data(),
          Date(),
          Array(),
          Array{""},
          Array{1, "a", 1.5},
          Array{Array{}},
          Array{Dictionary()},
          withNull,
          Dictionary(),
          nested};
}

// A finding must be one line that a terminal can show, whatever the bag is called or holds.
void expectReadable(const Dictionary& bag, const std::string& what) {
  for (const std::string& line : lintBag(bag)) {
    EXPECT_LT(line.size(), 1200u) << what;
    for (const char c : line) {
      if (static_cast<unsigned char>(c) >= 0x20 && c != 0x7f) continue;
      ADD_FAILURE() << what << ": " << ::testing::PrintToString(line);
      break;
    }
    EXPECT_EQ(line.find("\xc2\x9b"), std::string::npos) << what;
  }
}

// The bag with one value put at one key of one kind of dictionary.
Dictionary bagWithValueAt(StorebagLevel level, std::string_view key, const Value& value) {
  Dictionary changed;
  const auto put = [&changed, key, &value](Dictionary dictionary) {
    dictionary.set(String(key), value);
    return changed = std::move(dictionary);
  };
  const auto section = [](const char* name, const Dictionary& profile) {
    Dictionary result;
    result.set(name, profile);
    return bagWith("release", result);
  };
  switch (level) {
    case StorebagLevel::Envelope:
    case StorebagLevel::Bag:
      return put(bagOf(Array{cleanEntry()}));
    case StorebagLevel::HTTPSProfile:
      return section("splunk", put({{kProfileClients, Array{cleanEntry()}}}));
    case StorebagLevel::ClientEntry:
      return bagOf(Array{put(cleanEntry())});
    case StorebagLevel::Filter:
      return bagOf(Array{entryWith("filters", Array{put({{kFilterKey, "k"}, {kFilterAction, "remove"}})})});
    case StorebagLevel::CountryThreshold:
      return bagOf(Array{entryWith("per_country_sampling_thresholds",
                                   Array{put({{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 1}})})});
    case StorebagLevel::UploadProfile:
      return section("upload_server", put({{kProfilePostURL, "https://a.example/"}}));
    case StorebagLevel::DashboardProfile:
      return section("dashboard", put({{kProfileIP, "192.0.2.1"}, {kProfilePort, 9}}));
    case StorebagLevel::PlainProfile:
      return section("vdr", put({}));
  }
  return {};
}

TEST(StorebagLintHostileTest, takesAnyValueAtAnyKey) {
  for (const StorebagLevel level : kStorebagLevels) {
    for (const StorebagKey& row : storebagKeys(level)) {
      for (const Value& value : valuesOfEveryKind()) {
        Dictionary bag = bagWithValueAt(level, row.key, value);
        if (row.key != kStorebagSharedValues) bag.set(kStorebagSharedValues, Dictionary{{Key("==MACRO"), value}});
        expectReadable(bag, std::string(row.key.view()) + " = " + description(value).substr(0, 100));
      }
    }
  }
}

TEST(StorebagLintHostileTest, neverTakesADateOrDataForWhatAKeyNeeds) {
  for (const StorebagLevel level : kStorebagLevels) {
    for (const StorebagKey& row : storebagKeys(level)) {
      const bool isOfEnvelope = level == StorebagLevel::Envelope;
      if (row.shape == StorebagShape::Any || isOfEnvelope) continue;
      for (const Value& value : {Value(Date()), Value(Data(std::string("x")))}) {
        const LintReport report = StorebagLint::lintBag(bagWithValueAt(level, row.key, value));
        EXPECT_EQ(report.count(LintFinding::Severity::Error), 1u) << row.key.view();
      }
    }
  }
}

TEST(StorebagLintHostileTest, takesAnyNameForAKeyOrBackend) {
  for (const std::string& name :
       {std::string(""), std::string(" "), std::string("a/b[3]"), std::string(100000, 'k'), std::string("a\nb\x1b[0m"),
        std::string("\xff\xfe"), std::string("==X"), std::string("clients"), std::string("\0x", 2)}) {
    Dictionary entry = cleanEntry();
    entry.set(String(name), 1);
    Dictionary section = sectionOf(Array{entry});
    section.set(String(name), Dictionary());
    Dictionary bag = bagWith("release", section);
    bag.set(String(name), 1);
    Dictionary macros;
    macros.set(String(name), "x");
    bag.set(kStorebagSharedValues, macros);
    expectReadable(bag, name.substr(0, 20));
    EXPECT_GE(StorebagLint::lintBag(bag).count(LintFinding::Severity::Error), 3u) << name.substr(0, 20);
  }
}

TEST(StorebagLintHostileTest, refusesABagThatIsTooDeep) {
  Value deep = 1;
  for (int i = 0; i < 200; ++i) deep = Array{std::move(deep)};
  EXPECT_THAT(lintBag(bagWith("release", Dictionary{{Key("splunk"), deep}})),
              ElementsAre(error("/", "is nested deeper than 64 levels")));
}

TEST(StorebagLintHostileTest, namesWhatNoPropertyListCanHold) {
  Dictionary bag = bagWith("release", parsed(R"({"splunk": {"clients": [null]}})"));
  EXPECT_THAT(lintBag(bag), ElementsAre(error("/", "cannot be made a property list"),
                                        error("release/splunk/clients[0]", "is null, and it is passed over")));
  bag = bagWith("version", Value(std::string_view("a\0b", 3)));
  EXPECT_THAT(lintBag(bag), ElementsAre(error("/", "holds text with a null character")));
}

TEST(StorebagLintHostileTest, namesABagThatIsTooLargeForDevices) {
  Array categories;
  for (int i = 0; i < (1 << 20); ++i) categories.append(i % 100);
  EXPECT_THAT(lintEntries(Array{entryWith("event_blacklist", categories)}),
              ElementsAre(error("/", "is refused by devices")));
}

TEST(StorebagLintHostileTest, stopsAtAThousandFindings) {
  Dictionary entry = cleanEntry();
  for (int i = 0; i < 5000; ++i) entry.set(String("unknown" + std::to_string(i)), i);
  const std::vector<std::string> lines = lintEntries(Array{entry});
  ASSERT_EQ(lines.size(), LintReport::kMostFindings + 1);
  EXPECT_THAT(lines.back(), error("/", "has more than 1000 findings"));
}

// A macro is stored once and looked at wherever it is used, so a small bag can stand for a huge one.
TEST(StorebagLintHostileTest, stopsWhenMacrosMakeTheBagHuge) {
  Array filters;
  for (int i = 0; i < 3000; ++i) {
    filters.append(Dictionary{{kFilterKey, "k" + std::to_string(i)}, {kFilterAction, "remove"}});
  }
  Array clients;
  for (int i = 0; i < 3000; ++i) {
    Dictionary entry = entryWith("filters", "==FILTERS");
    entry.set(kClientEntryClient, "c" + std::to_string(i));
    clients.append(entry);
  }
  Dictionary bag = bagOf(clients);
  bag.set(kStorebagSharedValues, Dictionary{{Key("==FILTERS"), filters}});
  EXPECT_THAT(lintBag(bag), ElementsAre(error("/", "is too large to be looked through")));
}

// Each entry must be compared with all before it, which is not to take time in proportion to the square.
TEST(StorebagLintHostileTest, comparesManyEntriesInBoundedSteps) {
  Array clients;
  for (int i = 0; i < 5000; ++i) clients.append(entryWith("service", "s" + std::to_string(i) + "x"));
  const std::vector<std::string> lines = lintEntries(clients);
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_THAT(lines.front(), error("/", "is too large"));
}

}  // namespace
}  // namespace telvane::testing
