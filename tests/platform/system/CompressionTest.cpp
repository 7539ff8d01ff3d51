#include "platform/Compression.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/platform/system/Expect.h"

namespace telvane::compression {
namespace {

using telvane::testing::failsWith;
using telvane::testing::succeeds;

constexpr uint64_t kEnough = 1u << 20;

Data deflated(Framing framing, std::string_view input) {
  const boost::system::result<Data, Failure> result = deflate(framing, input);
  EXPECT_TRUE(result.has_value());
  return result.has_value() ? *result : Data();
}

// Text that does not compress to nothing.
std::string variedText(size_t size) {
  std::string text;
  uint32_t state = 1;
  while (text.size() < size) {
    state = state * 1664525u + 1013904223u;
    text += static_cast<char>(state >> 24);
  }
  return text;
}

TEST(CompressionTest, beginsWithTheMarksOfItsFraming) {
  EXPECT_EQ(deflated(Framing::Gzip, "hello").view().substr(0, 2), "\x1f\x8b");
  EXPECT_EQ(deflated(Framing::Zlib, "hello").view().substr(0, 2), "\x78\x9c");
}

TEST(CompressionTest, inflatesWhatItDeflated) {
  for (const std::string& input : {std::string("x"), std::string(300000, 'a'), variedText(300000)}) {
    for (const Framing framing : {Framing::Zlib, Framing::Gzip}) {
      const Result<Data> inflated = inflate(deflated(framing, input).view(), kEnough);
      ASSERT_TRUE(succeeds(inflated));
      EXPECT_TRUE(inflated->view() == input) << "expected " << input.size() << " bytes, got " << inflated->size();
    }
  }
}

std::string deflatedInPieces(Framing framing, std::string_view input, size_t pieceSize) {
  auto deflater = Deflater::make(framing);
  EXPECT_TRUE(deflater.has_value());
  std::string output;
  for (; !input.empty(); input.remove_prefix(std::min(pieceSize, input.size()))) {
    EXPECT_TRUE(deflater->add(input.substr(0, pieceSize), output).has_value());
  }
  EXPECT_TRUE(deflater->finish(output).has_value());
  return output;
}

TEST(CompressionTest, deflatesPiecesToTheSameAsTheWhole) {
  for (const std::string& input : {std::string(), std::string("x"), std::string(300000, 'a'), variedText(300000)}) {
    for (const Framing framing : {Framing::Zlib, Framing::Gzip}) {
      const std::string inOne = deflatedInPieces(framing, input, input.size() + 1);
      for (const size_t size : {size_t{7}, size_t{1000}, size_t{65536}}) {
        EXPECT_TRUE(deflatedInPieces(framing, input, size) == inOne) << input.size() << " in pieces of " << size;
      }
      const Result<Data> inflated = inflate(inOne, kEnough);
      ASSERT_TRUE(succeeds(inflated));
      EXPECT_TRUE(inflated->view() == input) << "expected " << input.size() << " bytes, got " << inflated->size();
    }
  }
}

TEST(CompressionTest, refusesMoreContentThanAllowed) {
  const Data bomb = deflated(Framing::Gzip, std::string(1u << 20, '\0'));
  EXPECT_TRUE(succeeds(inflate(bomb.view(), 1u << 20)));
  const Result<Data> refused = inflate(bomb.view(), (1u << 20) - 1);
  ASSERT_FALSE(refused.has_value());
  EXPECT_EQ(refused.error().description(), "Cannot inflate: the content is too large");
}

TEST(CompressionTest, refusesEveryCutAndWhatFollowsTheEnd) {
  const std::string whole(deflated(Framing::Gzip, "hello, hello, hello").view());
  for (size_t size = 0; size < whole.size(); ++size) {
    EXPECT_FALSE(inflate(std::string_view(whole).substr(0, size), kEnough).has_value()) << "cut to " << size;
  }
  EXPECT_FALSE(inflate(whole + "x", kEnough).has_value());
  EXPECT_FALSE(inflate("no stream at all", kEnough).has_value());
}

TEST(CompressionTest, noticesAnAlteredByte) {
  std::string altered(deflated(Framing::Gzip, "hello, hello, hello").view());
  altered[altered.size() - 6] ^= 1;  // in the check sum
  EXPECT_FALSE(inflate(altered, kEnough).has_value());
}

}  // namespace
}  // namespace telvane::compression
