#include <gtest/gtest.h>

#include <atomic>

#include "tests/platform/url/URLSessionFixture.h"

namespace telvane::testing {

class CurlURLSessionRedirectTest : public URLSessionFixture {
 protected:
  CurlURLSessionRedirectTest() {
    _handler = [this](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
      ++_requests;
      if (request.target == "/end") return responder->send({.body = Data::copyOf(request.method + " arrived")});
      responder->send({.status = 302, .headers = {{"Location", _location}}, .body = Data::copyOf("moved")});
    };
  }
  void givenRedirectTo(std::string location) { _location = std::move(location); }

  std::string _location;
  std::atomic<int> _requests = 0;
};

TEST_F(CurlURLSessionRedirectTest, followsARedirectOfAGet) {
  givenRedirectTo("/end");
  const TaskOutcome outcome = get("/start");
  EXPECT_FALSE(outcome.error.has_value());
  EXPECT_EQ(outcome.body(), "GET arrived");
  EXPECT_EQ(outcome.response->statusCode, 200);
  EXPECT_EQ(outcome.response->url, url("/end"));
  EXPECT_EQ(outcome.response->header("Location"), nullptr);
  EXPECT_EQ(_requests, 2);
}

TEST_F(CurlURLSessionRedirectTest, neverFollowsToPlainHTTP) {
  HTTPServer::Options plain;
  const auto insecure = HTTPServer::start(plain, [](const Server::Request&, auto responder) {
    ADD_FAILURE() << "the request went out in the clear";
    responder->send({});
  });
  ASSERT_TRUE(insecure.has_value());
  givenRedirectTo("http://" + (*insecure)->address() + "/end");
  const TaskOutcome outcome = get("/start");
  expectError(outcome, URLErrorCode::UnsafeRedirect);
  EXPECT_FALSE(outcome.response.has_value());
  EXPECT_EQ((*insecure)->acceptedConnections(), 0u);
}

TEST_F(CurlURLSessionRedirectTest, neverFollowsToOtherSchemes) {
  for (const char* location : {"file:///etc/passwd", "ftp://localhost/x", "gopher://localhost/"}) {
    givenRedirectTo(location);
    expectError(get("/start"), URLErrorCode::UnsafeRedirect);
  }
}

TEST_F(CurlURLSessionRedirectTest, endsAfterTenRedirects) {
  givenRedirectTo("/again");
  expectError(get("/start"), URLErrorCode::UnsafeRedirect);
  EXPECT_EQ(_requests, 11);
}

TEST_F(CurlURLSessionRedirectTest, givesAPostItsRedirectAsTheResponse) {
  givenRedirectTo("/end");
  const TaskOutcome outcome = run(post(url("/start"), "body"));
  EXPECT_FALSE(outcome.error.has_value());
  EXPECT_EQ(outcome.response->statusCode, 302);
  EXPECT_EQ(*outcome.response->header("Location"), "/end");
  EXPECT_EQ(outcome.body(), "moved");
  EXPECT_EQ(_requests, 1);
}

TEST_F(CurlURLSessionRedirectTest, verifiesTheServerThatItIsSentTo) {
  HTTPServer::Options other;
  const TestCertificates::Server files = _certificates.fromUnknownAuthority();
  other.certificateFile = files.certificateFile;
  other.privateKeyFile = files.privateKeyFile;
  const auto untrusted = HTTPServer::start(other, [](const Server::Request&, auto responder) { responder->send({}); });
  ASSERT_TRUE(untrusted.has_value());
  givenRedirectTo("https://" + (*untrusted)->address() + "/end");
  expectError(get("/start"), URLErrorCode::ServerCertificateUntrusted);
}

}  // namespace telvane::testing
