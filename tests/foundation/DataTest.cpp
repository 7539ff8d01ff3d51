#include "foundation/Data.h"

#include <gtest/gtest.h>

#include <numeric>

namespace telvane::testing {
namespace {

Data countingUpTo(uint8_t count) {
  std::vector<uint8_t> bytes(count);
  std::iota(bytes.begin(), bytes.end(), uint8_t{0});
  return Data(std::move(bytes));
}

TEST(DataTest, isEmptyByDefaultAndNeverNull) {
  EXPECT_TRUE(Data().empty());
  EXPECT_NE(Data().bytes(), nullptr);
  EXPECT_EQ(Data(std::string()).size(), 0u);
  EXPECT_EQ(Data(), Data(std::vector<uint8_t>()));
}

TEST(DataTest, takesAVectorOverWithoutCopying) {
  std::vector<uint8_t> bytes(1000, 7);
  const uint8_t* place = bytes.data();
  EXPECT_EQ(Data(std::move(bytes)).bytes(), place);
}

TEST(DataTest, takesAStringOverWithoutCopying) {
  std::string bytes(1000, 'x');
  const void* place = bytes.data();
  EXPECT_EQ(Data(std::move(bytes)).bytes(), place);
}

TEST(DataTest, holdsShortStringsWhereTheyStay) {
  const Data data(std::string("ab"));
  const Data copy = data;
  EXPECT_EQ(copy.view(), "ab");
  EXPECT_EQ(copy.bytes(), data.bytes());
}

TEST(DataTest, copiesWhatItIsAskedToCopy) {
  std::string bytes = "original";
  const Data fromText = Data::copyOf(bytes);
  const Data fromSpan = Data::copyOf(std::span(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()));
  bytes[0] = 'X';
  EXPECT_EQ(fromText.view(), "original");
  EXPECT_EQ(fromSpan.view(), "original");
  EXPECT_EQ(fromText, fromSpan);
}

TEST(DataTest, describesItsBytesInGroupsOfFour) {
  EXPECT_EQ(Data().description(), "<>");
  EXPECT_EQ(countingUpTo(1).description(), "<00>");
  EXPECT_EQ(countingUpTo(4).description(), "<00010203>");
  EXPECT_EQ(countingUpTo(5).description(), "<00010203 04>");
  EXPECT_EQ(countingUpTo(20).description(), "<00010203 04050607 08090a0b 0c0d0e0f 10111213>");
  EXPECT_EQ(Data::copyOf("\xff\xa0").description(), "<ffa0>");
}

}  // namespace
}  // namespace telvane::testing
