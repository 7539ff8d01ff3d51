#include <gtest/gtest.h>

#include "platform/URLSession.h"

namespace telvane::testing {

TEST(URLRequestTest, appendsAHeaderOrReplacesTheValueOfOneWithTheSameName) {
  URLRequest request;
  request.setHeader("First", "1");
  request.setHeader("Second", "2");
  request.setHeader("FIRST", "3");
  ASSERT_EQ(request.headers.size(), 2u);
  EXPECT_EQ(request.headers[0].name, "First");
  EXPECT_EQ(request.headers[0].value, "3");
  EXPECT_EQ(request.headers[1].name, "Second");
}

TEST(URLRequestTest, findsAResponseHeaderWithoutRegardToCase) {
  URLResponse response;
  response.headers = {{"Last-Modified", "yesterday"}, {"last-modified", "today"}};
  ASSERT_NE(response.header("LAST-MODIFIED"), nullptr);
  EXPECT_EQ(*response.header("LAST-MODIFIED"), "yesterday");
  EXPECT_EQ(response.header("Last-Modifie"), nullptr);
}

}  // namespace telvane::testing
