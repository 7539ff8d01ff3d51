#include "foundation/UUID.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(UUIDTest, isWrittenInUpperCaseGroups) {
  const UUID uuid(UUID::Bytes{0x01, 0x23, 0x45, 0x67, 0x89, 0xab, 0xcd, 0xef, 0, 1, 2, 3, 4, 5, 6, 0xff});
  EXPECT_EQ(uuid.string(), "01234567-89AB-CDEF-0001-0203040506FF");
  EXPECT_EQ(UUID().string(), "00000000-0000-0000-0000-000000000000");
}

TEST(UUIDTest, marksVersionAndVariantOfRandomBytes) {
  UUID::Bytes ones;
  ones.fill(0xff);
  EXPECT_EQ(UUID::fromRandomBytes(ones).string(), "FFFFFFFF-FFFF-4FFF-BFFF-FFFFFFFFFFFF");
  EXPECT_EQ(UUID::fromRandomBytes(UUID::Bytes{}).string(), "00000000-0000-4000-8000-000000000000");
}

TEST(UUIDTest, comparesByBytes) {
  EXPECT_EQ(UUID(UUID::Bytes{1}), UUID(UUID::Bytes{1}));
  EXPECT_NE(UUID(UUID::Bytes{1}), UUID(UUID::Bytes{2}));
}

}  // namespace
}  // namespace telvane::testing
