// Macros of a bag.
#include "storebag/StorebagMacros.h"

#include "tests/storebag/StorebagFixture.h"

namespace telvane::testing {
namespace {

class StorebagMacrosTest : public StorebagFixture {
 protected:
  // What a value in the release section becomes when "==HOSTS" stands for a,b.
  Value expanded(Value value) {
    Dictionary bag{{kStorebagSharedValues, Dictionary{{Key("==HOSTS"), "a,b"}}}};
    bag.set(kEnvironmentRelease, Dictionary{{Key("x"), std::move(value)}});
    const Dictionary result = expandStorebag(log(), bag);
    return (*result[kEnvironmentRelease].dictionary())["x"];
  }
  const Array hosts{"a", "b"};
};

TEST_F(StorebagMacrosTest, aReferenceBecomesTheArrayOfItsPieces) {
  EXPECT_EQ(expanded("==HOSTS"), Value(hosts));
  EXPECT_TRUE(hasLine(log(), "expandMacroForDataSet: Expanding macro '==HOSTS' into '"));
}

TEST_F(StorebagMacrosTest, referencesAreFoundAtAnyDepth) {
  EXPECT_EQ(expanded(Array{"==HOSTS", "c"}), Value(Array{Value(hosts), "c"}));
  const Value deep = Array{Value(Dictionary{{Key("y"), Array{Value("==HOSTS")}}})};
  EXPECT_EQ(expanded(deep), Value(Array{Value(Dictionary{{Key("y"), Array{Value(hosts)}}})}));
}

TEST_F(StorebagMacrosTest, otherTextsStay) {
  for (const char* text : {"HOSTS", "=HOSTS", "==OTHER", " ==HOSTS", "==HOSTS2", "=="}) {
    EXPECT_EQ(expanded(text), Value(text));
  }
}

TEST_F(StorebagMacrosTest, theSameTextOutsideTheFourSectionsStays) {
  const Dictionary bag{{kStorebagSharedValues, Dictionary{{Key("==HOSTS"), "a,b"}}},
                       {kStorebagVersion, "==HOSTS"},
                       {Key("other"), Dictionary{{Key("x"), "==HOSTS"}}}};
  const Dictionary result = expandStorebag(log(), bag);
  EXPECT_EQ(result[kStorebagVersion], Value("==HOSTS"));
  EXPECT_EQ(result["other"], bag["other"]);
  EXPECT_FALSE(result.contains(kStorebagSharedValues));
}

TEST_F(StorebagMacrosTest, allFourSectionsAreExpanded) {
  Dictionary bag{{kStorebagSharedValues, Dictionary{{Key("==HOSTS"), "a,b"}}}};
  for (const Key& key : {kEnvironmentInternal, kEnvironmentDevelopment, kEnvironmentSeed, kEnvironmentRelease}) {
    bag.set(key, Dictionary{{Key("x"), "==HOSTS"}});
  }
  const Dictionary result = expandStorebag(log(), bag);
  for (const Key& key : {kEnvironmentInternal, kEnvironmentDevelopment, kEnvironmentSeed, kEnvironmentRelease}) {
    EXPECT_EQ(result[key], Value(Dictionary{{Key("x"), Value(hosts)}})) << key.view();
  }
}

TEST_F(StorebagMacrosTest, aTextWithoutACommaBecomesAnArrayOfOne) {
  const Dictionary macros = splitMacroValues({{Key("==A"), "a"}, {Key("==B"), ",b,"}, {Key("==N"), 5}});
  EXPECT_EQ(macros["==A"], Value(Array{Value("a")}));
  EXPECT_EQ(macros["==B"], Value(Array{"", "b", ""}));
  EXPECT_EQ(macros["==N"], Value(5));
}

TEST_F(StorebagMacrosTest, whatWasInsertedIsNotExpandedAgain) {
  const Dictionary bag{{kStorebagSharedValues, Dictionary{{Key("==A"), "==B"}, {Key("==B"), "b"}}},
                       {kEnvironmentRelease, Dictionary{{Key("x"), Array{"==A", "==B"}}}}};
  const Dictionary result = expandStorebag(log(), bag);
  EXPECT_EQ(result[kEnvironmentRelease],
            Value(Dictionary{{Key("x"), Array{Value(Array{Value("==B")}), Value(Array{Value("b")})}}}));
}

TEST_F(StorebagMacrosTest, withoutMacrosTheBagIsHandedOnAsItIs) {
  for (const Value& sharedValues : {Value(), Value(Dictionary()), Value("==A"), Value(Array{1}), Value(3)}) {
    Dictionary bag{{kEnvironmentRelease, Dictionary{{Key("x"), "==A"}}}};
    bag.set(kStorebagSharedValues, sharedValues);
    EXPECT_EQ(expandStorebag(log(), bag), bag) << description(sharedValues);
  }
}

TEST_F(StorebagMacrosTest, reachTheSectionThatIsHandedOut) {
  StorebagBuilder bag;
  bag.set(kStorebagSharedValues, Dictionary{{Key("==COUNTRIES"), "US,DE"}});
  Dictionary client = StorebagBuilder::permissiveClient();
  client.set(kClientEntryLocaleWhitelist, "==COUNTRIES");
  bag.set(kEnvironmentRelease, StorebagBuilder::section("splunk", client));
  givenCachedEnvelope(bag.envelope());
  client.set(kClientEntryLocaleWhitelist, Array{"US", "DE"});
  EXPECT_EQ(fetch().section, StorebagBuilder::section("splunk", client));
}

}  // namespace
}  // namespace telvane::testing
