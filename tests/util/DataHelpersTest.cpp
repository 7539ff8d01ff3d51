#include "util/DataHelpers.h"

#include <gtest/gtest.h>

#include <array>
#include <limits>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "platform/Compression.h"
#include "platform/Crypto.h"
#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

class DataHelpersTest : public ::testing::Test {
 protected:
  RecordingLog& log() { return process.log(); }
  String identifier(std::string_view clientPart, std::string_view suffixPart) {
    return getPersistentIdentifierForCustomClientIDSuffix(process.platform(), clientPart, suffixPart);
  }
  std::string deviceIDIn(size_t size) {
    std::string buffer(size, '#');
    copyUniqueDeviceID(process.deviceAnswers(), buffer);
    return buffer;
  }
  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
};

TEST_F(DataHelpersTest, gzipAndZlibAreToldByTheirFirstBytes) {
  const auto gzip = compressDataWithZlibOrGzip(log(), true, "hello");
  const auto zlib = compressDataWithZlibOrGzip(log(), false, "hello");
  ASSERT_TRUE(gzip.has_value() && zlib.has_value());
  EXPECT_EQ(gzip->view().substr(0, 2), "\x1f\x8b");
  EXPECT_EQ(zlib->view().substr(0, 2), "\x78\x9c");
  EXPECT_EQ(gzipDeflate(log(), "hello"), gzip);
  EXPECT_TRUE(hasLine(log(), fmt::format("compressDataWithZlibOrGzip: Compressed file from 5 to {}", gzip->size())));
}

TEST_F(DataHelpersTest, largeDataIsCompressed) {
  const std::string large(10'000'000, 'x');
  const auto compressed = gzipDeflate(log(), large);
  ASSERT_TRUE(compressed.has_value());
  EXPECT_LT(compressed->size(), large.size() / 100);
}

TEST_F(DataHelpersTest, emptyDataIsNotCompressed) {
  log().expectError("compressDataWithZlibOrGzip: Cannot compress empty NSData");
  EXPECT_EQ(compressDataWithZlibOrGzip(log(), true, ""), std::nullopt);
  EXPECT_EQ(gzipDeflate(log(), ""), std::nullopt);
}

TEST_F(DataHelpersTest, aPersistentIdentifierStaysAndDiffersByItsParts) {
  const String first = identifier("client", "suffix");
  EXPECT_EQ(first.size(), 36u);
  EXPECT_EQ(identifier("client", "suffix"), first);
  EXPECT_NE(identifier("client", "other"), first);
  EXPECT_NE(identifier("other", "suffix"), first);
  EXPECT_EQ(process.userDefaults().objectForKey("com.corvex.telvane", "uuid:client:suffix"), Value(first));
  EXPECT_TRUE(hasLine(
      log(), "getPersistentIdentifierForCustomClientIDSuffix: The value for uuid:client:suffix: " + first.str()));
}

TEST_F(DataHelpersTest, missingPartsOfAnIdentifierAreEmpty) {
  const String made = identifier("", "");
  EXPECT_EQ(process.userDefaults().objectForKey("com.corvex.telvane", "uuid::"), Value(made));
}

TEST_F(DataHelpersTest, namesThatTakeMuchStandInTheSettingsByTheirDigests) {
  const auto digest = [](const std::string& text) {
    return crypto::lowercaseHex(crypto::sha256({reinterpret_cast<const uint8_t*>(text.data()), text.size()}));
  };
  const auto storedKey = [this](const std::string& clientPart, const std::string& suffixPart) {
    const String made = identifier(clientPart, suffixPart);
    EXPECT_EQ(identifier(clientPart, suffixPart), made) << "the same names, the same identifier";
    for (const DictionaryEntry& entry : process.userDefaults().dictionaryRepresentation("com.corvex.telvane")) {
      if (entry.value == Value(made)) return entry.key.str();
    }
    return std::string();
  };
  const std::string longest(200, 'c');
  const std::string rest(56, 's');
  EXPECT_EQ(storedKey(longest, rest), "uuid:" + longest + ":" + rest);
  EXPECT_EQ(storedKey(longest, rest + "s"), "uuid:" + digest(longest) + ":" + digest(rest + "s"));
  const std::string huge(20u << 20, 'h');
  EXPECT_EQ(storedKey(huge, ""), "uuid:" + digest(huge) + ":" + digest(""));
  EXPECT_EQ(storedKey("", huge), "uuid:" + digest("") + ":" + digest(huge));
  for (const std::string& name : {std::string("a\0b", 3), std::string("a\nb"), std::string("a\x7f")}) {
    EXPECT_EQ(storedKey(name, "player"), "uuid:" + digest(name) + ":" + digest("player"));
    EXPECT_EQ(storedKey("player", name), "uuid:" + digest("player") + ":" + digest(name));
  }
}

TEST_F(DataHelpersTest, theDeviceIDIsCutToItsBuffer) {
  process.deviceAnswers().set("UniqueDeviceID", String("0123456789"));
  EXPECT_EQ(deviceIDIn(5), std::string("0123\0", 5));
  EXPECT_EQ(deviceIDIn(11), std::string("0123456789\0", 11));
  EXPECT_EQ(deviceIDIn(13), std::string("0123456789\0\0\0", 13));
  EXPECT_EQ(deviceIDIn(1), std::string("\0", 1));
  EXPECT_EQ(deviceIDIn(0), "");
}

TEST_F(DataHelpersTest, withoutADeviceIDTheBufferStays) {
  process.deviceAnswers().remove("UniqueDeviceID");
  EXPECT_EQ(deviceIDIn(3), "###");
}

TEST_F(DataHelpersTest, theClientServiceKeyIsLowerCased) {
  EXPECT_EQ(clientServiceKey(Dictionary{{kTelvaneUserInfoClientName, "Foo"}, {kTelvaneUserInfoServiceName, "BAR"}}),
            "foo:bar");
  EXPECT_EQ(clientServiceKey(Dictionary{{kTelvaneUserInfoClientName, "x"}}), "x:");
  EXPECT_EQ(clientServiceKey(Dictionary{{kTelvaneUserInfoServiceName, "y"}}), ":y");
  for (const Value& nothing : {Value(), Value("text"), Value(Dictionary()), Value(Array{1})}) {
    EXPECT_EQ(clientServiceKey(nothing), ":") << description(nothing);
  }
}

TEST_F(DataHelpersTest, aDefaultIsReadAsTextOrNotAtAll) {
  const Key key("telvane_storebag_url");
  EXPECT_EQ(userDefaultsString(process.userDefaults(), key), std::nullopt);
  for (const Value& wrong : {Value(1), Value(true), Value(Array{"a"}), Value(Dictionary())}) {
    ASSERT_TRUE(isOk(process.userDefaults().setObject(kTelvaneDefaultsSuite.view(), key.view(), wrong)));
    EXPECT_EQ(userDefaultsString(process.userDefaults(), key), std::nullopt) << description(wrong);
  }
  ASSERT_TRUE(isOk(process.userDefaults().setObject(kTelvaneDefaultsSuite.view(), key.view(), "text")));
  EXPECT_EQ(userDefaultsString(process.userDefaults(), key), String("text"));
}

TEST(TimeHelpersTest, customersTimesAreTruncatedToMinutes) {
  EXPECT_EQ(minuteRounding(125, false), 120);
  EXPECT_EQ(minuteRounding(125, true), 125);
  EXPECT_EQ(minuteRounding(-59, false), 0);
  EXPECT_EQ(minuteRounding(-61, false), -60);
  EXPECT_EQ(minuteRounding(-59, true), -59);
  EXPECT_EQ(minuteRounding(0, false), 0);
}

TEST(TimeHelpersTest, timeOfDayBecomesSeconds) {
  EXPECT_DOUBLE_EQ(timeOfDayToSeconds(12, 250000), 12.25);
  EXPECT_DOUBLE_EQ(timeOfDayToSeconds(-1, 0), -1.0);
}

TEST(TimeHelpersTest, whatIsNoFiniteNumberBecomesMinusOne) {
  EXPECT_EQ(finiteOrMinusOne(2.5), 2.5);
  EXPECT_EQ(finiteOrMinusOne(std::numeric_limits<double>::infinity()), -1.0);
  EXPECT_EQ(finiteOrMinusOne(-std::numeric_limits<double>::infinity()), -1.0);
  EXPECT_EQ(finiteOrMinusOne(std::numeric_limits<double>::quiet_NaN()), -1.0);
}

TEST(ObjectSizeEstimateTest, onlyContainersHaveASize) {
  for (const Value& value : {Value(), Value(1), Value("a long text"), Value(Data::copyOf("data")), Value(true)}) {
    EXPECT_EQ(objectSizeEstimate(value), 0u) << description(value);
  }
  EXPECT_EQ(objectSizeEstimate(Dictionary()), 0u);
  EXPECT_EQ(objectSizeEstimate(Array()), 0u);
}

TEST(ObjectSizeEstimateTest, growsWithKeysValuesAndWhatTheyContain) {
  const uint32_t one = objectSizeEstimate(Dictionary{{Key("k"), 1}});
  EXPECT_GT(one, 0u);
  EXPECT_GT(objectSizeEstimate(Dictionary{{Key("a longer key"), 1}}), one);
  EXPECT_EQ(objectSizeEstimate(Dictionary{{Key("k"), 1}, {Key("l"), 1}}), 2 * one);
  EXPECT_GE(objectSizeEstimate(Dictionary{{Key("k"), std::string(1000, 'x')}}), one + 1000);
  EXPECT_GE(objectSizeEstimate(Dictionary{{Key("k"), Value(Array{std::string(1000, 'x')})}}), one + 1000);
}

}  // namespace
}  // namespace telvane::testing
