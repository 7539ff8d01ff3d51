#include "util/QueryText.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

TEST(QueryTextTest, leavesWhatMayStandInAQuery) {
  for (const char* text : {"", "abcXYZ019", "-._~!$&'()*+,;=:@/?"}) EXPECT_EQ(percentEncodedForQuery(text), text);
}

TEST(QueryTextTest, encodesEveryOtherByte) {
  EXPECT_EQ(percentEncodedForQuery("a b"), "a%20b");
  EXPECT_EQ(percentEncodedForQuery("%#[]\"<>\\^`{|}"), "%25%23%5B%5D%22%3C%3E%5C%5E%60%7B%7C%7D");
  EXPECT_EQ(percentEncodedForQuery(std::string_view("\0\n\x7f\x80\xff", 5)), "%00%0A%7F%80%FF");
}

TEST(QueryTextTest, knowsTheURLsOfWebServers) {
  for (const char* url : {"https://h", "http://h/", "HTTPS://h:8443/a?b=c#d", "https://[::1]:9/", "https://h/%20"}) {
    EXPECT_TRUE(isWebURL(url)) << url;
  }
  for (const char* url : {"", "h", "https:", "https://", "https:///a", "https://?a", "ftp://h/", "httpss://h/",
                          "xhttp://h", "https//h", "https://a b/", "https://h/\n", "https://h/\xC3\xA4", "https://h/%2",
                          "https://h/%", "https://h/%zz", "https://h/<a>", "https://h/\"", "https://h/{a}"}) {
    EXPECT_FALSE(isWebURL(url)) << url;
  }
}

}  // namespace
}  // namespace telvane::testing
