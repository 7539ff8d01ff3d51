#include <fmt/format.h>
#include <gtest/gtest.h>

#include <array>
#include <ctime>
#include <functional>
#include <unordered_map>

#include "foundation/Value.h"
#include "tests/foundation/AllocationCounter.h"

namespace telvane::testing {
namespace {

constexpr Key kName{"_clientName"};
constexpr Key kType{"_clientType"};

String numberedKey(int number) { return String(fmt::format("key{}", number)); }

Dictionary numbered(int count) {
  Dictionary dictionary;
  for (int i = 0; i < count; ++i) dictionary.set(numberedKey(i), i);
  return dictionary;
}

std::string keysOf(const Dictionary& dictionary) {
  std::string keys;
  for (const DictionaryEntry& entry : dictionary) keys += std::string(entry.key.view()) + " ";
  return keys;
}

TEST(DictionaryTest, isEmptyByDefaultWithoutAllocating) {
  const size_t allocations = allocationsDuring([] {
    const Dictionary dictionary;
    EXPECT_TRUE(dictionary.empty());
    EXPECT_EQ(dictionary.begin(), dictionary.end());
    EXPECT_FALSE(dictionary[kName].isPresent());
    EXPECT_FALSE(dictionary.contains("anything"));
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(DictionaryTest, findsByKeyAndByText) {
  const Dictionary dictionary{{kName, "calls"}, {"other", 7}};
  EXPECT_EQ(dictionary[kName], "calls");
  EXPECT_EQ(dictionary["_clientName"], "calls");
  EXPECT_EQ(dictionary[String("other")], 7);
  EXPECT_EQ(dictionary[std::string("other")], 7);
  EXPECT_TRUE(dictionary.contains(kName));
  EXPECT_FALSE(dictionary.contains(kType));
  EXPECT_FALSE(dictionary["Other"].isPresent());
}

TEST(DictionaryTest, enumeratesInTheOrderOfTheFirstSetting) {
  Dictionary dictionary;
  for (const char* key : {"z", "a", "m"}) dictionary.set(key, 1);
  dictionary.set("z", 2);
  EXPECT_EQ(keysOf(dictionary), "z a m ");
  EXPECT_EQ(dictionary["z"], 2);
  EXPECT_EQ(dictionary.size(), 3u);
}

TEST(DictionaryTest, takesTheLastOfEqualKeysAndLeavesOutAbsentValues) {
  const Dictionary dictionary{{"a", 1}, {"b", Value()}, {"a", 2}};
  EXPECT_EQ(dictionary.size(), 1u);
  EXPECT_EQ(dictionary["a"], 2);
}

TEST(DictionaryTest, removesAKeyThatIsSetToAnAbsentValue) {
  Dictionary dictionary{{kName, "x"}, {kType, 1}, {"text", 2}};
  dictionary.set(kName, Value());
  dictionary.set("text", Value());
  dictionary.set("unknown", Value());
  EXPECT_EQ(keysOf(dictionary), "_clientType ");
}

TEST(DictionaryTest, removesAndKeepsTheOrderOfTheOthers) {
  Dictionary dictionary{{"a", 1}, {"b", 2}, {"c", 3}, {"d", 4}};
  EXPECT_TRUE(dictionary.remove("b"));
  EXPECT_FALSE(dictionary.remove("b"));
  EXPECT_EQ(keysOf(dictionary), "a c d ");
  EXPECT_EQ(dictionary["d"], 4);
  EXPECT_FALSE(dictionary["b"].isPresent());
}

TEST(DictionaryTest, allocatesNothingForAKnownKey) {
  Dictionary dictionary;
  dictionary.reserve(2);
  const size_t allocations = allocationsDuring([&] {
    dictionary.set(kName, 1);
    dictionary.set(kType, 2);
  });
  EXPECT_EQ(allocations, 0u);
  EXPECT_EQ(dictionary.begin()->key.view().data(), kName.view().data());
}

TEST(DictionaryTest, sharesTheTextOfItsKeys) {
  const String key("a key that came over the wire");
  Dictionary dictionary;
  dictionary.set(key, 1);
  EXPECT_EQ(dictionary.begin()->key.view().data(), key.view().data());
}

TEST(DictionaryTest, sharesItsStorageWithCopies) {
  const Dictionary dictionary{{kName, "x"}};
  const size_t allocations = allocationsDuring([&] {
    const Dictionary copy = dictionary;
    EXPECT_EQ(copy.begin(), dictionary.begin());
  });
  EXPECT_EQ(allocations, 0u);
}

TEST(DictionaryTest, changesOnlyTheCopyThatIsChanged) {
  const Dictionary original{{"a", 1}, {"b", 2}};
  Dictionary set = original;
  set.set("a", 10);
  Dictionary added = original;
  added.set("c", 3);
  Dictionary removed = original;
  removed.remove("a");
  Dictionary filtered = original;
  filtered.keepIf([](const String& key, const Value&) { return key == "b"; });
  Dictionary joined = original;
  joined.addEntriesFrom(Dictionary{{"d", 4}});
  EXPECT_EQ(original, (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_EQ(set, (Dictionary{{"a", 10}, {"b", 2}}));
  EXPECT_EQ(added, (Dictionary{{"a", 1}, {"b", 2}, {"c", 3}}));
  EXPECT_EQ(removed, (Dictionary{{"b", 2}}));
  EXPECT_EQ(filtered, removed);
  EXPECT_EQ(joined, (Dictionary{{"a", 1}, {"b", 2}, {"d", 4}}));
}

TEST(DictionaryTest, staysSharedWhenNothingChanges) {
  const Dictionary original{{"a", 1}, {"b", 2}};
  Dictionary copy = original;
  copy.remove("unknown");
  copy.set("unknown", Value());
  copy.keepIf([](const String&, const Value&) { return true; });
  copy.addEntriesFrom(Dictionary());
  copy.addEntriesFrom(original);
  EXPECT_EQ(copy.begin(), original.begin());
}

TEST(DictionaryTest, changesInPlaceWhenItIsTheOnlyOwner) {
  Dictionary dictionary;
  dictionary.reserve(20);
  const DictionaryEntry* place = dictionary.begin();
  { const Dictionary copy = dictionary; }
  for (int i = 0; i < 20; ++i) dictionary.set(numberedKey(i), i);
  EXPECT_EQ(dictionary.begin(), place);
}

TEST(DictionaryTest, addsEntriesAndReplacesEqualKeys) {
  Dictionary dictionary{{"a", 1}, {"b", 2}};
  dictionary.addEntriesFrom({{"b", 20}, {"c", 30}});
  EXPECT_EQ(dictionary, (Dictionary{{"a", 1}, {"b", 20}, {"c", 30}}));
  EXPECT_EQ(keysOf(dictionary), "a b c ");
}

TEST(DictionaryTest, sharesTheStorageOfWhatIsAddedToAnEmptyOne) {
  const Dictionary source{{"a", 1}};
  Dictionary dictionary;
  dictionary.addEntriesFrom(source);
  EXPECT_EQ(dictionary.begin(), source.begin());
}

TEST(DictionaryTest, addsEntriesOfADictionaryThatLivesInIt) {
  Dictionary dictionary{{"inner", Dictionary{{"inner", 1}, {"more", 2}}}};
  dictionary.addEntriesFrom(*dictionary["inner"].dictionary());
  EXPECT_EQ(dictionary, (Dictionary{{"inner", 1}, {"more", 2}}));
}

TEST(DictionaryTest, asksKeepIfOnceForEachEntryInOrder) {
  Dictionary dictionary{{"a", 1}, {"b", 2}, {"c", 3}, {"d", 4}};
  std::string asked;
  dictionary.keepIf([&asked](const String& key, const Value& value) {
    asked += key.view();
    return value.integerValue() % 2 == 0;
  });
  EXPECT_EQ(asked, "abcd");
  EXPECT_EQ(keysOf(dictionary), "b d ");
  dictionary.keepIf([](const String&, const Value&) { return false; });
  EXPECT_TRUE(dictionary.empty());
}

TEST(DictionaryTest, isEqualWhateverTheOrder) {
  EXPECT_EQ((Dictionary{{"a", 1}, {"b", 2}}), (Dictionary{{"b", 2}, {"a", 1}}));
  EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"a", 2}}));
  EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"b", 1}}));
  EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"a", true}}));
  EXPECT_EQ(Dictionary(), Dictionary{});
}

TEST(DictionaryTest, isEmptyAfterItWasMovedFrom) {
  Dictionary dictionary{{"a", 1}};
  const Dictionary taken = std::move(dictionary);
  EXPECT_TRUE(dictionary.empty());
  EXPECT_EQ(taken["a"], 1);
}

TEST(DictionaryTest, mayBeAssignedFromWithinItself) {
  Dictionary dictionary{{"inner", Dictionary{{"a", 1}}}};
  dictionary = *dictionary["inner"].dictionary();
  EXPECT_EQ(dictionary, (Dictionary{{"a", 1}}));
}

// Two texts with one 32-bit hash are found by trying; a sender can do the same.
TEST(DictionaryTest, tellsKeysWithEqualHashesApart) {
  std::unordered_map<uint32_t, int> seen;
  int second = 0;
  while (seen.try_emplace(keyHash(numberedKey(second)), second).second) ++second;
  const int first = seen[keyHash(numberedKey(second))];
  Dictionary dictionary;
  dictionary.set(numberedKey(first), "first");
  EXPECT_FALSE(dictionary.contains(numberedKey(second)));
  dictionary.set(numberedKey(second), "second");
  EXPECT_EQ(dictionary[numberedKey(first)], "first");
  EXPECT_EQ(dictionary[numberedKey(second)], "second");
  EXPECT_TRUE(dictionary.remove(numberedKey(first)));
  EXPECT_EQ(dictionary[numberedKey(second)], "second");
}

// Around the size at which the index comes and goes.
class DictionarySizeTest : public ::testing::TestWithParam<int> {};

TEST_P(DictionarySizeTest, findsEveryKeyThroughSettingAndRemoving) {
  const int count = GetParam();
  Dictionary dictionary = numbered(count);
  for (int i = 0; i < count; ++i) ASSERT_EQ(dictionary[numberedKey(i)], i);
  ASSERT_FALSE(dictionary.contains(numberedKey(count)));
  Dictionary copy = dictionary;
  for (int i = 0; i < count; i += 3) ASSERT_TRUE(copy.remove(numberedKey(i)));
  for (int i = 0; i < count; ++i) {
    ASSERT_EQ(copy[numberedKey(i)], i % 3 == 0 ? Value() : Value(i));
    ASSERT_EQ(dictionary[numberedKey(i)], i);
  }
  copy.set("new", "value");
  EXPECT_EQ(copy["new"], "value");
  EXPECT_EQ(std::prev(copy.end())->key, "new");
  EXPECT_TRUE(copy.remove("new"));
  EXPECT_FALSE(copy.contains("new"));
}

TEST_P(DictionarySizeTest, findsEveryKeyThatKeepIfLeft) {
  const int count = GetParam();
  Dictionary dictionary = numbered(count);
  dictionary.keepIf([](const String&, const Value& value) { return value.integerValue() % 5 != 1; });
  for (int i = 0; i < count; ++i) ASSERT_EQ(dictionary[numberedKey(i)], i % 5 == 1 ? Value() : Value(i));
  for (int i = 1; i < count; i += 5) dictionary.set(numberedKey(i), i);
  EXPECT_EQ(dictionary, numbered(count));
}

INSTANTIATE_TEST_SUITE_P(Sizes, DictionarySizeTest, ::testing::Values(1, 2, 31, 32, 33, 63, 64, 65, 66, 100, 1000));

template <class F>
double cpuSecondsOf(F&& callable) {
  const std::clock_t start = std::clock();
  callable();
  return static_cast<double>(std::clock() - start) / CLOCKS_PER_SEC;
}

void setFindAndFilter(int count) {
  Dictionary dictionary = numbered(count);
  ASSERT_EQ(dictionary.size(), static_cast<size_t>(count));
  for (int i = 0; i < count; ++i) ASSERT_EQ(dictionary[numberedKey(i)].integer(), i);
  Dictionary copy = dictionary;
  copy.keepIf([](const String&, const Value& value) { return value.integerValue() % 2 == 0; });
  ASSERT_EQ(copy.size(), static_cast<size_t>(count / 2));
  ASSERT_FALSE(copy.contains(numberedKey(count - 1)));
  copy.addEntriesFrom(dictionary);
  ASSERT_EQ(copy, dictionary);
}

// A hundred thousand keys are what a hostile sender can fit into one message. Ten times as many may take little more
// than ten times as long; anything in proportion to the square would take a hundred times as long.
TEST(DictionaryTest, staysFastWithAHundredThousandKeys) {
  const double fewer = cpuSecondsOf([] { setFindAndFilter(10'000); });
  const double more = cpuSecondsOf([] { setFindAndFilter(100'000); });
  EXPECT_LT(more, fewer * 45) << fewer << " s for 10,000 keys, " << more << " s for 100,000";
}

// Pairs of blocks that leave the hash in the same state; any choice of one from each pair gives a key of the same hash.
std::vector<std::array<std::string, 2>> collidingBlocks(size_t count) {
  std::vector<std::array<std::string, 2>> blocks;
  std::unordered_map<uint32_t, std::string> seen;
  std::string prefix;
  for (uint32_t number = 1; blocks.size() < count; ++number) {
    std::string block = fmt::format("{:08x}", number * 2654435761u);  // scattered, so that pairs are found soon
    const auto [found, isNew] = seen.try_emplace(keyHash(prefix + block), block);
    if (isNew) continue;
    prefix += block;
    blocks.push_back({found->second, std::move(block)});
    seen.clear();
  }
  return blocks;
}

std::string keyOfBlocks(const std::vector<std::array<std::string, 2>>& blocks, uint32_t choice) {
  std::string key;
  for (size_t i = 0; i < blocks.size(); ++i) key += blocks[i][choice >> i & 1];
  return key;
}

TEST(DictionaryTest, staysFastWhenEveryHashIsTheSame) {
  const auto blocks = collidingBlocks(14);
  const uint32_t count = 1u << blocks.size();
  const auto fill = [&](const std::function<std::string(uint32_t)>& suffix) {
    Dictionary dictionary;
    for (uint32_t i = 0; i < count; ++i) dictionary.set(String(keyOfBlocks(blocks, i) + suffix(i)), i);
    return dictionary;
  };
  Dictionary colliding;
  const double ordinary = cpuSecondsOf([&] { fill([](uint32_t i) { return std::to_string(i); }); });
  const double crafted = cpuSecondsOf([&] { colliding = fill([](uint32_t) { return std::string(); }); });
  ASSERT_EQ(colliding.begin()->hash, std::prev(colliding.end())->hash) << "the keys do not collide";
  EXPECT_EQ(colliding.size(), size_t{count});
  EXPECT_EQ(colliding[keyOfBlocks(blocks, 5)], 5);
  EXPECT_LT(crafted, ordinary * 10) << ordinary << " s for ordinary keys, " << crafted << " s for colliding ones";
}

TEST(DictionaryTest, givesAValueAwayWithItsKey) {
  Dictionary dictionary{{Key("a"), 1}, {Key("b"), "two"}, {Key("c"), 3}};
  EXPECT_EQ(dictionary.take(Key("b")), Value("two"));
  EXPECT_EQ(dictionary, (Dictionary{{Key("a"), 1}, {Key("c"), 3}}));
  EXPECT_FALSE(dictionary.take(Key("b")).isPresent());
}

TEST(DictionaryTest, leavesOtherOwnersWhatItGivesAway) {
  Dictionary dictionary{{Key("a"), 1}, {Key("b"), "two"}};
  const Dictionary other = dictionary;
  EXPECT_EQ(dictionary.take(Key("b")), Value("two"));
  EXPECT_EQ(other, (Dictionary{{Key("a"), 1}, {Key("b"), "two"}}));
}

TEST(DictionaryTest, givesASoleOwnersContainerAwayWithoutACopy) {
  Dictionary dictionary{{Key("payload"), Dictionary{{Key("n"), 1}}}};
  EXPECT_EQ(allocationsDuring([&] {
              Value payload = dictionary.take(Key("payload"));
              payload.dictionary()->set(Key("n"), 2);
            }),
            0u);
}

TEST(DictionaryTest, costsOneAllocationWithItsEntries) {
  EXPECT_EQ(allocationsDuring([] {
              Dictionary dictionary;
              dictionary.reserve(3);
              dictionary.set(Key("a"), 1);
              dictionary.set(Key("b"), 2);
              dictionary.set(Key("c"), 3);
            }),
            1u);
}

// A key is looked for among the others only when its hash could be there; removing keys must not mislead that.
TEST(DictionaryTest, findsAllThatIsThereAfterRemovalsAndGrowth) {
  Dictionary dictionary;
  for (int i = 0; i < 60; ++i) dictionary.set(String("key " + std::to_string(i)), i);
  dictionary.keepIf([](const String&, const Value& value) { return value.integerValue() % 3 != 0; });
  for (int i = 60; i < 90; ++i) dictionary.set(String("key " + std::to_string(i)), i);
  for (int i = 0; i < 90; ++i) {
    const bool isThere = i >= 60 || i % 3 != 0;
    EXPECT_EQ(dictionary["key " + std::to_string(i)], isThere ? Value(i) : Value()) << i;
  }
}

}  // namespace
}  // namespace telvane::testing
