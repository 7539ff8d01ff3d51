#include "interfaces/FileURL.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(FileURLTest, takesThePathOfAURL) {
  EXPECT_EQ(pathOfFileURL("file:///var/log/a.txt"), "/var/log/a.txt");
  EXPECT_EQ(pathOfFileURL("file://localhost/var/log/a.txt"), "/var/log/a.txt");
  EXPECT_EQ(pathOfFileURL("file:/var/log/a.txt"), "/var/log/a.txt");
}

TEST(FileURLTest, undoesPercentEncoding) { EXPECT_EQ(pathOfFileURL("file:///a%20b/%C3%A4%2Fc"), "/a b/\xC3\xA4/c"); }

TEST(FileURLTest, leavesQueryAndFragmentOut) {
  EXPECT_EQ(pathOfFileURL("file:///a?b"), "/a");
  EXPECT_EQ(pathOfFileURL("file:///a#b"), "/a");
}

TEST(FileURLTest, takesAnythingElseForAPath) {
  EXPECT_EQ(pathOfFileURL("/tmp/100%.log"), "/tmp/100%.log");
  EXPECT_EQ(pathOfFileURL("relative"), "relative");
}

TEST(FileURLTest, refusesBrokenEncodingAndNULs) {
  EXPECT_EQ(pathOfFileURL("file:///a%"), "");
  EXPECT_EQ(pathOfFileURL("file:///a%2"), "");
  EXPECT_EQ(pathOfFileURL("file:///a%-1"), "");
  EXPECT_EQ(pathOfFileURL("file:///a%zz"), "");
  EXPECT_EQ(pathOfFileURL("file:///a%00b"), "");
  EXPECT_EQ(pathOfFileURL(std::string_view("/a\0b", 4)), "");
  EXPECT_EQ(pathOfFileURL("file://host-without-path"), "");
}

TEST(FileURLTest, makesURLsThatLeadBackToThePath) {
  for (const char* path : {"/", "/var/log/a.txt", "/a b/%41/\xC3\xA4?#[]"}) {
    EXPECT_EQ(pathOfFileURL(fileURLOfPath(path)), path);
  }
  EXPECT_EQ(fileURLOfPath("/a b"), "file:///a%20b");
  EXPECT_EQ(fileURLOfPath("relative"), "relative");
}

}  // namespace
}  // namespace telvane::testing
