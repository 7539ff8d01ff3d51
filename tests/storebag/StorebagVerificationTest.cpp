// Envelopes: what is opened, and what is refused with which words.
#include "foundation/Base64.h"
#include "platform/PropertyList.h"
#include "tests/storebag/StorebagFixture.h"

namespace telvane::testing {
namespace {

constexpr char kNotVerified[] = "fetchStorebagWithName: Signature can not be verified, 0x";
constexpr char kNoSignature[] = "fetchStorebagWithName: Signature is missing";

class StorebagVerificationTest : public StorebagFixture {
 protected:
  void expectRefused(std::string_view envelope, const char* errorLine) {
    givenServedEnvelope(envelope);
    expectNothingFetched(errorLine);
  }
  // Refused without a word of its own.
  void expectRefusedSilently(std::string_view envelope) {
    givenServedEnvelope(envelope);
    expectNothingFetched("loadStorebagFromDisk");
    EXPECT_TRUE(hasNoLine(log(), "fetchStorebagWithName: Signature"));
  }
  static Value part(const char* key) {
    const auto parsed = propertylist::parse(Data::copyOf(StorebagBuilder().envelope()));
    return (*parsed->dictionary())[key];
  }
};

TEST_F(StorebagVerificationTest, aBagAlteredByOneByteIsRefusedAndNotSaved) {
  const Value bag = part("bag");
  std::string bytes(base64DecodeIgnoringUnknownCharacters(bag.text())->view());
  bytes[bytes.size() / 2] ^= 1;
  const Data altered = Data::copyOf(bytes);
  expectRefused(StorebagBuilder::rawEnvelope(base64Encode({altered.bytes(), altered.size()}), part("signature")),
                kNotVerified);
}

TEST_F(StorebagVerificationTest, aBagSignedByAStrangerIsRefused) {
  expectRefused(StorebagBuilder::envelopeOfAStranger(StorebagBuilder().bag()), kNotVerified);
}

TEST_F(StorebagVerificationTest, aSignatureOfAnotherLengthIsRefused) {
  expectRefused(StorebagBuilder::rawEnvelope(part("bag"), "c2hvcnQ="), kNotVerified);
}

TEST_F(StorebagVerificationTest, anEmptySignatureIsRefused) {
  expectRefused(StorebagBuilder::rawEnvelope(part("bag"), ""), kNotVerified);
}

TEST_F(StorebagVerificationTest, aMissingSignatureIsRefused) {
  expectRefused(StorebagBuilder::rawEnvelope(part("bag"), Value()), kNoSignature);
}

TEST_F(StorebagVerificationTest, aSignatureThatIsNoTextIsRefused) {
  expectRefused(StorebagBuilder::rawEnvelope(part("bag"), Data::copyOf("signature")), kNoSignature);
}

TEST_F(StorebagVerificationTest, garbageIsRefused) {
  expectRefused("\x01\x02garbage", kNoSignature);
  EXPECT_TRUE(hasLine(log(), "fetchStorebagWithName: propertyListWithData error "));
}

TEST_F(StorebagVerificationTest, aTruncatedEnvelopeIsRefused) {
  const std::string envelope = StorebagBuilder().envelope();
  expectRefused(envelope.substr(0, envelope.size() / 2), kNoSignature);
}

TEST_F(StorebagVerificationTest, anEnvelopeThatIsNoDictionaryIsRefused) {
  const Data list = propertylist::serialize(Array{1, 2}, propertylist::Format::XML).value();
  expectRefused(list.view(), kNoSignature);
}

TEST_F(StorebagVerificationTest, anOversizedEnvelopeIsRefused) {
  expectRefused(StorebagBuilder::rawEnvelope(part("bag"), std::string(17u << 20, 'A')), kNoSignature);
}

TEST_F(StorebagVerificationTest, aMissingBagIsRefusedWithoutAWord) {
  expectRefusedSilently(StorebagBuilder::rawEnvelope(Value(), part("signature")));
}

TEST_F(StorebagVerificationTest, aBagThatIsNoTextIsRefusedWithoutAWord) {
  expectRefusedSilently(StorebagBuilder::rawEnvelope(7, part("signature")));
}

TEST_F(StorebagVerificationTest, aSignatureThatIsNoBase64IsRefusedWithoutAWord) {
  expectRefusedSilently(StorebagBuilder::rawEnvelope(part("bag"), "A"));
}

TEST_F(StorebagVerificationTest, withoutAPublicKeyEverythingIsRefusedWithoutAWord) {
  process.clientBundle().setPublicKey(std::nullopt);
  expectRefusedSilently(StorebagBuilder().envelope());
}

TEST_F(StorebagVerificationTest, aPublicKeyThatIsNoneRefusesEverythingWithoutAWord) {
  process.clientBundle().setPublicKey(Data::copyOf("no key"));
  expectRefusedSilently(StorebagBuilder().envelope());
}

TEST_F(StorebagVerificationTest, lineBreaksAndOtherKeysInTheEnvelopeAreFine) {
  std::string bag(part("bag").text());
  for (size_t at = 64; at < bag.size(); at += 65) bag.insert(at, "\n");
  const Dictionary envelope{
      {kEnvelopeBag, bag}, {kEnvelopeSignature, " " + std::string(part("signature").text()) + "\r\n"}, {Key("x"), 1}};
  givenServedEnvelope(propertylist::serialize(envelope, propertylist::Format::Binary)->view());
  EXPECT_TRUE(fetchUncached().section.has_value());
}

TEST_F(StorebagVerificationTest, aSignedBagThatIsNoDictionaryGivesNothing) {
  givenServedEnvelope(StorebagBuilder::envelopeOf(Array{1, 2}));
  log().expectError("fetchStorebagWithName: storebag 'media' is signed but is no dictionary: another kind of value");
  log().expectError("Could not fetch storebag for client type 6");
  EXPECT_FALSE(fetchUncached().section.has_value());
}

TEST_F(StorebagVerificationTest, aSignedBagThatIsNoPropertyListGivesNothing) {
  givenServedEnvelope(StorebagBuilder::envelopeAround(Data::copyOf("no list")));
  log().expectError("fetchStorebagWithName: storebag 'media' is signed but is no dictionary: ");
  log().expectError("Could not fetch storebag for client type 6");
  EXPECT_FALSE(fetchUncached().section.has_value());
}

TEST_F(StorebagVerificationTest, aVersionOfAnotherTypeTravelsAsItIs) {
  givenCachedEnvelope(StorebagBuilder().set(kStorebagVersion, 7).envelope());
  EXPECT_EQ(fetch().version, Value(7));
}

TEST_F(StorebagVerificationTest, aBagWithoutAVersionGivesItsSectionWithoutOne) {
  givenCachedEnvelope(StorebagBuilder().set(kStorebagVersion, Value()).envelope());
  const auto fetched = fetch();
  EXPECT_TRUE(fetched.section.has_value());
  EXPECT_EQ(fetched.version, Value());
}

}  // namespace
}  // namespace telvane::testing
