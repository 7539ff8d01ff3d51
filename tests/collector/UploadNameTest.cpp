#include "collector/UploadName.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

std::string nameOf(const std::string& value) { return uploadName("/upload?uuid=d&filename=" + value + "&raw=true"); }

TEST(UploadNameTest, isTheFileName) {
  EXPECT_EQ(nameOf("call.log.gz"), "call.log.gz");
  EXPECT_EQ(nameOf("A-1_b.gz"), "A-1_b.gz");
  EXPECT_EQ(uploadName("/upload?filename=call.gz"), "call.gz");
  EXPECT_EQ(uploadName("/upload?filename=call.gz&other=1"), "call.gz");
}

TEST(UploadNameTest, mayHoldWhatAQueryMay) {
  EXPECT_EQ(nameOf("a&b=c.gz"), "a_b_c.gz");
  EXPECT_EQ(nameOf("a&raw=true.gz"), "a_raw_true.gz");
}

TEST(UploadNameTest, leadsNowhereElse) {
  EXPECT_EQ(nameOf("..%2F..%2Fetc%2Fpasswd.gz"), "_._.._etc_passwd.gz");
  EXPECT_EQ(nameOf("../../etc/passwd.gz"), "_._.._etc_passwd.gz");
  EXPECT_EQ(nameOf("%2Fabsolute"), "_absolute");
  EXPECT_EQ(nameOf(".hidden"), "_hidden");
  EXPECT_EQ(nameOf("a%00b%0Ac%1B[31m"), "a_b_c__31m");
  EXPECT_EQ(nameOf("%C3%A4.gz"), "__.gz");
}

TEST(UploadNameTest, isNeverNothing) {
  for (const char* value : {"", ".", "..", "%2F", "...", "%2E%2E"}) EXPECT_EQ(nameOf(value), "upload") << value;
  for (const char* target : {"/upload", "/upload?", "/upload?uuid=filename", "", "?", "/upload?afilename=x"}) {
    EXPECT_EQ(uploadName(target), "upload") << target;
  }
}

TEST(UploadNameTest, isNoLongerThanADiskTakesAndKeepsItsEnd) {
  const std::string name = nameOf(std::string(5000, 'x') + ".gz");
  EXPECT_EQ(name.size(), 200u);
  EXPECT_TRUE(name.ends_with("x.gz"));
}

TEST(UploadNameTest, takesBrokenEncodingAsItStands) {
  EXPECT_EQ(nameOf("100%"), "100_");
  EXPECT_EQ(nameOf("a%4"), "a_4");
  EXPECT_EQ(nameOf("a%zzb"), "a_zzb");
  EXPECT_EQ(nameOf("a%-1b"), "a_-1b");
}

TEST(QueryValueTest, isDecodedAndEndsAtTheNextKey) {
  EXPECT_EQ(queryValue("/upload?uuid=a%20b&x=1", "uuid"), "a b");
  EXPECT_EQ(queryValue("/upload?x=1&uuid=2", "uuid"), "2");
  EXPECT_EQ(queryValue("/upload?x=1", "uuid"), "");
}

}  // namespace
}  // namespace telvane::testing
