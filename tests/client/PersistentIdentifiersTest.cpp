#include "platform/identifiers/PersistentIdentifiers.h"

#include <gtest/gtest.h>

#include <regex>

#include "interfaces/DefaultsKeys.h"
#include "tests/support/MemoryUserDefaults.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/SeededRandom.h"

namespace telvane::testing {
namespace {

class PersistentIdentifiersTest : public ::testing::Test {
 protected:
  static IdentifierPlace place(bool respectsDNU) {
    return {kTelvaneDefaultsSuite, defaultsKeyOfIdentifierForDNU(respectsDNU)};
  }
  Value get(bool respectsDNU) { return getPersistentIdentifierForDNU(_defaults, _random, _log, place(respectsDNU)); }
  Value stored(const Key& key) { return _defaults.objectForKey(kTelvaneDefaultsSuite, key); }

  RecordingLog _log;
  SeededRandom _random{1};
  MemoryUserDefaults _defaults;
};

TEST_F(PersistentIdentifiersTest, makesAUUIDOnFirstUseAndKeepsIt) {
  const Value first = get(true);
  EXPECT_TRUE(std::regex_match(std::string(first.text()),
                               std::regex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}")))
      << first.text();
  EXPECT_EQ(get(true), first);
  EXPECT_EQ(stored(kDefaultsUUIDRespectDNU), first);
  EXPECT_EQ(_log.count("getPersistentIdentifierForDNU: The value for uuidRespectDNU: " + std::string(first.text())), 2u)
      << _log.text();
}

TEST_F(PersistentIdentifiersTest, keepsTheTwoApart) {
  const Value respecting = get(true);
  const Value overriding = get(false);
  EXPECT_NE(respecting, overriding);
  EXPECT_EQ(stored(kDefaultsUUIDOverrideDNU), overriding);
  EXPECT_EQ(get(true), respecting);
}

TEST_F(PersistentIdentifiersTest, returnsWhateverIsStored) {
  ASSERT_TRUE(_defaults.setObject(kTelvaneDefaultsSuite, kDefaultsUUIDRespectDNU, 17).has_value());
  EXPECT_EQ(get(true), Value(17));
}

TEST_F(PersistentIdentifiersTest, regeneratesOnlyTheOneAskedFor) {
  const Value respecting = get(true);
  const Value overriding = get(false);
  regeneratePersistentIdentifierForDNU(_defaults, _random, _log, place(true));
  const Value renewed = get(true);
  EXPECT_NE(renewed, respecting);
  EXPECT_EQ(get(false), overriding);
  EXPECT_EQ(_log.count("regeneratePersistentIdentifierForDNU: Set new value for uuidRespectDNU: " +
                       std::string(renewed.text())),
            1u)
      << _log.text();
}

}  // namespace
}  // namespace telvane::testing
