#include "platform/Crypto.h"

#include <gtest/gtest.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <string>

#include "tests/platform/system/Expect.h"

namespace telvane::crypto {
namespace {

using telvane::testing::succeeds;

std::span<const uint8_t> bytesOf(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// One key for all tests: making one takes a moment.
const PrivateKey& privateKey() {
  static const PrivateKey key = *PrivateKey::generate();
  return key;
}

Data signatureOf(std::string_view message) {
  const Result<Data> signature = privateKey().signSHA1(bytesOf(message));
  EXPECT_TRUE(succeeds(signature));
  return signature ? *signature : Data();
}

// Turns the one form of a public key into the other.
Data asPKCS1(const Data& subjectPublicKeyInfo) {
  const unsigned char* next = subjectPublicKeyInfo.bytes();
  EVP_PKEY* key = d2i_PUBKEY(nullptr, &next, static_cast<long>(subjectPublicKeyInfo.size()));
  unsigned char* bytes = nullptr;
  const int size = i2d_PublicKey(key, &bytes);
  Data der = Data::copyOf(std::span<const uint8_t>(bytes, static_cast<size_t>(size)));
  OPENSSL_free(bytes);
  EVP_PKEY_free(key);
  return der;
}

Data altered(const Data& data, size_t position) {
  std::string bytes(data.view());
  bytes[position] ^= 1;
  return Data(std::move(bytes));
}

// RFC 3174 and FIPS 180-4.
TEST(CryptoTest, digestsTheKnownExamples) {
  EXPECT_EQ(lowercaseHex(sha1(bytesOf("abc"))), "a9993e364706816aba3e25717850c26c9cd0d89d");
  EXPECT_EQ(lowercaseHex(sha1(bytesOf(""))), "da39a3ee5e6b4b0d3255bfef95601890afd80709");
  EXPECT_EQ(lowercaseHex(sha1(bytesOf(std::string(1000000, 'a')))), "34aa973cd4c4daa4f61eeb2bdbad27316534016f");
  EXPECT_EQ(lowercaseHex(sha256(bytesOf("abc"))), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
}

// RFC 2202 and RFC 4231.
TEST(CryptoTest, authenticatesTheKnownExamples) {
  EXPECT_EQ(lowercaseHex(hmacSHA1(bytesOf(std::string(20, '\x0b')), bytesOf("Hi There"))),
            "b617318655057264e28bc0b6fb378c8ef146be00");
  EXPECT_EQ(lowercaseHex(hmacSHA1(bytesOf("Jefe"), bytesOf("what do ya want for nothing?"))),
            "effcdf6ae5eb2fa2d27416d5f184df9c259a7c79");
  EXPECT_EQ(lowercaseHex(hmacSHA1(bytesOf(std::string(80, '\xaa')),
                                  bytesOf("Test Using Larger Than Block-Size Key - Hash Key First"))),
            "aa4ae5e15272d00e95705637ce8a3b55ed402112");
  EXPECT_EQ(lowercaseHex(hmacSHA256(bytesOf("Jefe"), bytesOf("what do ya want for nothing?"))),
            "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843");
}

TEST(CryptoTest, takesAnEmptyKeyForAKey) {
  EXPECT_EQ(lowercaseHex(hmacSHA1({}, {})), "fbdb1d1b18aa6c08324b7d64b71fb76370690e1d");
  hmacSHA1(bytesOf("another key"), {});
  EXPECT_EQ(lowercaseHex(hmacSHA1({}, {})), "fbdb1d1b18aa6c08324b7d64b71fb76370690e1d");
}

TEST(CryptoTest, verifiesWithBothFormsOfThePublicKey) {
  const Data signature = signatureOf("the bag");
  const Data keyInfo = privateKey().publicKeyDER();
  for (const Data& der : {keyInfo, asPKCS1(keyInfo)}) {
    const std::optional<PublicKey> key = PublicKey::fromDER(der);
    ASSERT_TRUE(key.has_value());
    EXPECT_TRUE(key->verifySHA1(sha1(bytesOf("the bag")), signature));
    EXPECT_NE(key->address(), nullptr);
  }
}

TEST(CryptoTest, refusesAnAlteredMessageOrSignature) {
  const Data signature = signatureOf("the bag");
  const std::optional<PublicKey> key = PublicKey::fromDER(privateKey().publicKeyDER());
  ASSERT_TRUE(key.has_value());
  EXPECT_FALSE(key->verifySHA1(sha1(bytesOf("the bad")), signature));
  for (const size_t position : {size_t{0}, size_t{100}, signature.size() - 1}) {
    EXPECT_FALSE(key->verifySHA1(sha1(bytesOf("the bag")), altered(signature, position))) << "byte " << position;
  }
  EXPECT_FALSE(key->verifySHA1(sha1(bytesOf("the bag")), Data()));
  EXPECT_FALSE(key->verifySHA1(sha1(bytesOf("the bag")), Data::copyOf(signature.view().substr(1))));
}

TEST(CryptoTest, refusesTheSignatureOfAnotherKey) {
  const Result<PrivateKey> other = PrivateKey::generate(1024);
  ASSERT_TRUE(succeeds(other));
  const std::optional<PublicKey> key = PublicKey::fromDER(other->publicKeyDER());
  ASSERT_TRUE(key.has_value());
  EXPECT_FALSE(key->verifySHA1(sha1(bytesOf("the bag")), signatureOf("the bag")));
}

TEST(CryptoTest, readsNoKeyFromGarbageCutsOrOtherAlgorithms) {
  const Data der = privateKey().publicKeyDER();
  EXPECT_FALSE(PublicKey::fromDER(Data()).has_value());
  EXPECT_FALSE(PublicKey::fromDER(Data::copyOf("no key")).has_value());
  EXPECT_FALSE(PublicKey::fromDER(Data::copyOf(der.view().substr(0, der.size() - 1))).has_value());
  EXPECT_FALSE(PublicKey::fromDER(Data(std::string(der.view()) + "x")).has_value());
  EVP_PKEY* curve = EVP_EC_gen("P-256");
  unsigned char* bytes = nullptr;
  const int size = i2d_PUBKEY(curve, &bytes);
  EXPECT_FALSE(
      PublicKey::fromDER(Data::copyOf(std::span<const uint8_t>(bytes, static_cast<size_t>(size)))).has_value());
  OPENSSL_free(bytes);
  EVP_PKEY_free(curve);
}

TEST(CryptoTest, keepsAPrivateKeyThroughItsFile) {
  const Data pem = privateKey().pem();
  EXPECT_TRUE(
      pem.view().starts_with("-----BEGIN "
                             "PRIVATE KEY-----"));
  const Result<PrivateKey> read = PrivateKey::fromPEM(pem);
  ASSERT_TRUE(succeeds(read));
  EXPECT_EQ(read->publicKeyDER(), privateKey().publicKeyDER());
}

TEST(CryptoTest, refusesAFileWithoutAPrivateKey) {
  for (const char* text : {"", "no key",
                           "-----BEGIN "
                           "PRIVATE KEY-----\nAAAA\n-----END PRIVATE KEY-----\n"}) {
    const Result<PrivateKey> read = PrivateKey::fromPEM(Data::copyOf(std::string_view(text)));
    ASSERT_FALSE(read.has_value()) << text;
    EXPECT_NE(read.error().description().find("private key"), std::string::npos) << read.error().description();
  }
}

}  // namespace
}  // namespace telvane::crypto
