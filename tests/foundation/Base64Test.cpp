#include "foundation/Base64.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

std::string encode(std::string_view text) {
  return base64Encode(std::span(reinterpret_cast<const uint8_t*>(text.data()), text.size()));
}

// The decoded text, or "(nothing)".
std::string decode(std::string_view text) {
  const auto data = base64DecodeIgnoringUnknownCharacters(text);
  return data ? std::string(data->view()) : "(nothing)";
}

TEST(Base64Test, encodesWithPadding) {
  EXPECT_EQ(encode(""), "");
  EXPECT_EQ(encode("f"), "Zg==");
  EXPECT_EQ(encode("fo"), "Zm8=");
  EXPECT_EQ(encode("foo"), "Zm9v");
  EXPECT_EQ(encode("foob"), "Zm9vYg==");
  EXPECT_EQ(encode("fooba"), "Zm9vYmE=");
  EXPECT_EQ(encode("foobar"), "Zm9vYmFy");
  EXPECT_EQ(encode("\xff\xef\xbe"), "/+++");
}

TEST(Base64Test, decodesWhatItEncoded) {
  std::string bytes;
  for (int i = 0; i < 256; ++i) {
    EXPECT_EQ(decode(encode(bytes)), bytes) << i << " bytes";
    bytes += static_cast<char>(i * 7);
  }
}

TEST(Base64Test, passesOverUnknownCharacters) {
  EXPECT_EQ(decode("Zm9v\r\n  YmFy\n"), "foobar");
  EXPECT_EQ(decode(std::string_view("Z-m_9\0v*", 8)), "foo");
  EXPECT_EQ(decode("\xff\x80Zg==\n"), "f");
  EXPECT_EQ(decode("?!"), "");
}

TEST(Base64Test, decodesWithoutPadding) {
  EXPECT_EQ(decode("Zg"), "f");
  EXPECT_EQ(decode("Zm8"), "fo");
  EXPECT_EQ(decode("Zg="), "f");
}

TEST(Base64Test, refusesWhatIsNoWholeNumberOfBytes) {
  EXPECT_EQ(decode("Z"), "(nothing)");
  EXPECT_EQ(decode("Zm9vY"), "(nothing)");
  EXPECT_EQ(decode("Z==="), "(nothing)");
}

TEST(Base64Test, refusesDataAfterPadding) {
  EXPECT_EQ(decode("Zg==Zg=="), "(nothing)");
  EXPECT_EQ(decode("Zm9v=A"), "(nothing)");
}

}  // namespace
}  // namespace telvane::testing
