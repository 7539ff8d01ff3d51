#include "tools/StorebagEnvelope.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "foundation/Base64.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "storebag/StorebagVerification.h"

namespace telvane::testing {
namespace {

constexpr char kAsJSON[] = R"( {"version": "1", "release": {"splunk": {"clients": [{"n": 1, "r": 1.0, "b": true}]}}})";
constexpr char kAsXML[] =
    "<!-- as an author writes it --><plist version=\"1.0\"><dict><key>version</key><string>1</string><key>release</key>"
    "<dict><key>splunk</key><dict><key>clients</key><array><dict><key>n</key><integer>1</integer><key>r</key>"
    "<real>1.0</real><key>b</key><true/></dict></array></dict></dict></dict></plist>";

class StorebagEnvelopeTest : public ::testing::Test {
 protected:
  static const crypto::PrivateKey& key() {
    static const crypto::PrivateKey key = crypto::PrivateKey::generate().value();
    return key;
  }
  static Dictionary bag() { return storebagenvelope::parseBag(Data::copyOf(kAsJSON)).value(); }
  static Data seal() { return storebagenvelope::seal(bag(), key()).value(); }
  static std::string faultOf(std::string_view envelope) {
    const auto opened = storebagenvelope::open(Data::copyOf(envelope));
    return opened.has_error() ? opened.error().description() : "no fault";
  }
  static std::string plist(const Value& value) {
    return std::string(propertylist::serialize(value, propertylist::Format::XML).value().view());
  }
};

TEST_F(StorebagEnvelopeTest, readsTheSameBagFromJSONAndFromAPropertyList) {
  const Result<Dictionary> xml = storebagenvelope::parseBag(Data::copyOf(kAsXML));
  ASSERT_TRUE(xml.has_value()) << xml.error().description();
  EXPECT_EQ(*xml, bag());
  const Data binary = propertylist::serialize(bag(), propertylist::Format::Binary).value();
  EXPECT_EQ(storebagenvelope::parseBag(binary).value(), bag());
}

TEST_F(StorebagEnvelopeTest, refusesABagThatIsNoDictionary) {
  for (const char* text :
       {"", "[1]", "garbage", "{\"a\":", "<plist><array/></plist>", "<plist><string>x</string></plist>"}) {
    EXPECT_TRUE(storebagenvelope::parseBag(Data::copyOf(text)).has_error()) << text;
  }
}

TEST_F(StorebagEnvelopeTest, sealsWhatItsKeyOpens) {
  const storebagenvelope::Content content = storebagenvelope::open(seal()).value();
  EXPECT_EQ(content.bag.view().substr(0, 8), "bplist00");
  EXPECT_EQ(storebagenvelope::parseSealedBag(content).value(), bag());
  const crypto::PublicKey publicKey = *crypto::PublicKey::fromDER(key().publicKeyDER());
  EXPECT_TRUE(verifyStorebagSignature(publicKey, content.bag, content.signature));
}

TEST_F(StorebagEnvelopeTest, anAlteredBagDoesNotFitItsSignature) {
  const storebagenvelope::Content content = storebagenvelope::open(seal()).value();
  const crypto::PublicKey publicKey = *crypto::PublicKey::fromDER(key().publicKeyDER());
  std::string altered(content.bag.view());
  altered[altered.size() / 2] ^= 1;
  EXPECT_FALSE(verifyStorebagSignature(publicKey, Data(altered), content.signature));
  const crypto::PrivateKey other = crypto::PrivateKey::generate().value();
  EXPECT_FALSE(
      verifyStorebagSignature(*crypto::PublicKey::fromDER(other.publicKeyDER()), content.bag, content.signature));
}

TEST_F(StorebagEnvelopeTest, saysWhatAnEnvelopeLacks) {
  using ::testing::HasSubstr;
  EXPECT_THAT(faultOf(""), HasSubstr("cannot be read"));
  EXPECT_THAT(faultOf(plist(Array{1})), HasSubstr("no dictionary"));
  EXPECT_THAT(faultOf(plist(Dictionary{{kEnvelopeSignature, "AA=="}})), HasSubstr("no text under \"bag\""));
  EXPECT_THAT(faultOf(plist(Dictionary{{kEnvelopeBag, "AA=="}})), HasSubstr("no text under \"signature\""));
  EXPECT_THAT(faultOf(plist(Dictionary{{kEnvelopeBag, 5}, {kEnvelopeSignature, "AA=="}})), HasSubstr("\"bag\""));
  EXPECT_THAT(faultOf(plist(Dictionary{{kEnvelopeBag, "A"}, {kEnvelopeSignature, "AA=="}})), HasSubstr("no base64"));
}

TEST_F(StorebagEnvelopeTest, tellsByLookingWhetherAFileIsABagOrAnEnvelope) {
  for (const std::string_view written : {std::string_view(kAsJSON), std::string_view(kAsXML)}) {
    const storebagenvelope::FileContent plain = storebagenvelope::parseFile(Data::copyOf(written)).value();
    EXPECT_FALSE(plain.isSigned);
    EXPECT_EQ(plain.bag, bag());
  }
  const storebagenvelope::FileContent sealed = storebagenvelope::parseFile(seal()).value();
  EXPECT_TRUE(sealed.isSigned);
  EXPECT_EQ(sealed.bag, bag());
  const auto broken = storebagenvelope::parseFile(Data(plist(Dictionary{{kEnvelopeBag, "AA=="}})));
  ASSERT_TRUE(broken.has_error());
  EXPECT_THAT(broken.error().description(), ::testing::HasSubstr("no text under \"signature\""));
  EXPECT_TRUE(storebagenvelope::parseFile(Data::copyOf("garbage")).has_error());
}

TEST_F(StorebagEnvelopeTest, takesBase64WithLineBreaks) {
  const storebagenvelope::Content content = storebagenvelope::open(seal()).value();
  std::string wrapped = base64Encode({content.bag.bytes(), content.bag.size()});
  for (size_t at = 64; at < wrapped.size(); at += 65) wrapped.insert(at, "\n");
  const std::string envelope = plist(Dictionary{{kEnvelopeBag, wrapped}, {kEnvelopeSignature, "AA=="}});
  EXPECT_EQ(storebagenvelope::open(Data::copyOf(envelope)).value().bag, content.bag);
}

}  // namespace
}  // namespace telvane::testing
