#include "backends/EventFilter.h"

#include <gtest/gtest.h>

#include "backends/TelvaneBackend.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/support/Matchers.h"

namespace telvane::testing {
namespace {

Dictionary entry(const char* key, const char* action) { return {{kFilterKey, key}, {kFilterAction, action}}; }

Dictionary with(Dictionary dictionary, const Key& key, Value value) {
  dictionary.set(key, std::move(value));
  return dictionary;
}

Dictionary filtered(const Array& entries, Dictionary event) {
  EventFilter(entries).filterEvent(event);
  return event;
}

Dictionary event(Dictionary fields) {
  fields.set(kEventMethod, 7);
  fields.set(kEventStatus, 2);
  return fields;
}

TEST(EventFilterTest, changesNothingWithoutFilters) {
  const Dictionary before = event({{Key("name"), "x"}});
  EXPECT_EQ(filtered({}, before), before);
  EXPECT_TRUE(EventFilter(Array()).empty());
}

TEST(EventFilterTest, removesAKeyWhateverItsCase) {
  EXPECT_EQ(filtered(Array{Value(entry("NAME", "remove"))}, event({{Key("naMe"), 1}, {Key("names"), 2}})),
            event({{Key("names"), 2}}));
}

TEST(EventFilterTest, digestsTextInPlace) {
  const Dictionary result = filtered(Array{Value(entry("name", "sha256"))}, event({{Key("name"), "abc"}}));
  EXPECT_EQ(result["name"].text(), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
}

TEST(EventFilterTest, digestsAnythingElseAsItsDescription) {
  const Dictionary result = filtered(Array{Value(entry("name", "sha256"))}, event({{Key("name"), 12}}));
  EXPECT_EQ(result["name"], Value(TelvaneBackend::convertIntoSHA256("12")));
}

TEST(EventFilterTest, removesTextThatHoldsABlacklistedPart) {
  const Array entries{Value(with(entry("name", "blacklistValues"), kFilterValue, Value(Array{"secret", "PRIVATE"})))};
  EXPECT_EQ(filtered(entries, event({{Key("name"), "a Private thing"}})), event({}));
  EXPECT_EQ(filtered(entries, event({{Key("name"), "open"}})), event({{Key("name"), "open"}}));
  EXPECT_EQ(filtered(entries, event({{Key("name"), 5}})), event({{Key("name"), 5}})) << "numbers stay";
}

TEST(EventFilterTest, removesTextThatHoldsNoWhitelistedPart) {
  const Array entries{Value(with(entry("name", "whitelistValues"), kFilterValue, Value(Array{"OPEN"})))};
  EXPECT_EQ(filtered(entries, event({{Key("name"), "an open thing"}})), event({{Key("name"), "an open thing"}}));
  EXPECT_EQ(filtered(entries, event({{Key("name"), "secret"}})), event({}));
  EXPECT_EQ(filtered(entries, event({{Key("name"), 5}})), event({{Key("name"), 5}})) << "numbers stay";
}

TEST(EventFilterTest, anEmptyListOfPartsRefusesNoneAndAdmitsNone) {
  EXPECT_EQ(filtered(Array{Value(entry("name", "blacklistValues"))}, event({{Key("name"), "x"}})),
            event({{Key("name"), "x"}}));
  EXPECT_EQ(filtered(Array{Value(entry("name", "whitelistValues"))}, event({{Key("name"), "x"}})), event({}));
}

TEST(EventFilterTest, appliesOnlyToItsMethodAndStatus) {
  const Dictionary fields = event({{Key("name"), 1}});
  const auto remains = [&fields](const Key& key, int number) {
    return filtered(Array{Value(with(entry("name", "remove"), key, number))}, fields).contains("name");
  };
  EXPECT_FALSE(remains(kFilterMethod, 7));
  EXPECT_TRUE(remains(kFilterMethod, 8));
  EXPECT_FALSE(remains(kFilterMethod, -5)) << "negative numbers are any method";
  EXPECT_FALSE(remains(kFilterStatus, 2));
  EXPECT_TRUE(remains(kFilterStatus, 3));
  EXPECT_FALSE(remains(kFilterStatus, -1));
}

TEST(EventFilterTest, readsMissingMethodAndStatusOfADictionaryAsZero) {
  const Dictionary zero = with(with(entry("name", "remove"), kFilterMethod, 0), kFilterStatus, 0);
  EXPECT_EQ(filtered(Array{Value(zero)}, {{Key("name"), 1}}), Dictionary());
}

TEST(EventFilterTest, onlyTheFirstRecordThatFitsApplies) {
  const Array noneFirst{Value(entry("name", "whatever")), Value(entry("name", "remove"))};
  EXPECT_TRUE(filtered(noneFirst, event({{Key("name"), 1}})).contains("name"));
  const Array otherMethodFirst{Value(with(entry("name", "whatever"), kFilterMethod, 9)),
                               Value(entry("name", "remove"))};
  EXPECT_FALSE(filtered(otherMethodFirst, event({{Key("name"), 1}})).contains("name"));
}

TEST(EventFilterTest, judgesByTheMethodThatWasThereAtTheStart) {
  const Array entries{Value(entry("_method", "remove")), Value(with(entry("name", "remove"), kFilterMethod, 7))};
  EXPECT_EQ(filtered(entries, event({{Key("name"), 1}})), (Dictionary{{kEventStatus, 2}}));
}

TEST(EventFilterTest, matchesKeysOfAnyLength) {
  const std::string longKey(100, 'k');
  Dictionary fields;
  fields.set(String(longKey), 1);
  fields.set(String(longKey + "k"), 2);
  const Dictionary result = filtered(Array{Value(entry(longKey.c_str(), "remove"))}, fields);
  EXPECT_EQ(result.size(), 1u);
  EXPECT_TRUE(result.contains(longKey + "k"));
}

// A key of n letters can be spelt in 2^n ways, each of which a filter takes out.
TEST(EventFilterTest, takesOutAnyNumberOfSpellingsInOnePass) {
  const std::string letters = "abcdefghijklmnopq";
  constexpr uint32_t kSpellings = 100'000;
  Dictionary fields = event({{Key("kept"), 1}});
  for (uint32_t spelling = 0; spelling < kSpellings; ++spelling) {
    std::string key = letters;
    for (size_t index = 0; index < key.size(); ++index) {
      if ((spelling >> index) % 2 == 1) key[index] = static_cast<char>(key[index] - 'a' + 'A');
    }
    fields.set(String(key), 1);
  }
  ASSERT_EQ(fields.size(), kSpellings + 3);
  const Dictionary digested = filtered(Array{Value(entry(letters.c_str(), "sha256"))}, fields);
  EXPECT_EQ(digested.size(), kSpellings + 3);
  EXPECT_EQ(digested["ABCDefghijklmnopq"], Value(TelvaneBackend::convertIntoSHA256("1")));
  EXPECT_EQ(filtered(Array{Value(entry(letters.c_str(), "remove"))}, std::move(fields)), event({{Key("kept"), 1}}));
}

TEST(EventFilterTest, takesOutAndDigestsFieldsOfOneEvent) {
  const Array entries{Value(entry("a", "remove")), Value(entry("b", "sha256")), Value(entry("d", "remove"))};
  EXPECT_EQ(filtered(entries, event({{Key("a"), 1}, {Key("b"), 2}, {Key("c"), 3}, {Key("d"), 4}, {Key("B"), 5}})),
            event({{Key("b"), TelvaneBackend::convertIntoSHA256("2")},
                   {Key("c"), 3},
                   {Key("B"), TelvaneBackend::convertIntoSHA256("5")}}));
}

TEST(EventFilterTest, takesEntriesOfWrongTypesForEntriesThatSayNothing) {
  const Array entries{5, "text", Value(Array{1}), Value(Dictionary{{kFilterKey, 5}, {kFilterAction, "remove"}}),
                      Value(Dictionary{{kFilterKey, "name"}, {kFilterAction, 2}})};
  const Dictionary before = event({{Key("name"), 1}, {Key("5"), 2}, {Key(""), 3}});
  EXPECT_EQ(filtered(entries, before), before);
  const Array badList{Value(Dictionary{{kFilterKey, "name"}, {kFilterAction, "blacklistValues"}, {kFilterValue, "x"}})};
  EXPECT_EQ(filtered(badList, event({{Key("name"), "x"}})), event({{Key("name"), "x"}}));
}

}  // namespace
}  // namespace telvane::testing
