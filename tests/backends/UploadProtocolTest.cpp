// That docs/upload-protocol.md says what is sent: its tables name every parameter and header, and no other, and its
// example is a post byte for byte.
#include <gmock/gmock.h>

#include <cstring>

#include "platform/Compression.h"
#include "tests/backends/ProtocolPage.h"
#include "tests/backends/UploadFixture.h"
#include "tests/support/BodyBytes.h"

namespace telvane::testing {
namespace {

// The rows of the table that begins with a column of this name: first and second column.
std::vector<std::pair<std::string, std::string>> tableOf(const ProtocolPage& page, const std::string& column) {
  const std::string text = between(page.text(), "\n| " + column + " | value |\n|---|---|\n", "\n\n") + "\n";
  std::vector<std::pair<std::string, std::string>> rows;
  for (size_t at = 0, end; (end = text.find('\n', at)) != std::string::npos; at = end + 1) {
    const std::string line = text.substr(at, end - at);
    rows.emplace_back(between(line, "| `", "` |"), between(line, "` | ", " |"));
  }
  return rows;
}

std::string bytesOf(const std::string& hexadecimal) {
  std::string bytes;
  for (size_t i = 0; i + 1 < hexadecimal.size(); i += 2) {
    bytes += static_cast<char>(std::stoi(hexadecimal.substr(i, 2), nullptr, 16));
  }
  return bytes;
}

class UploadProtocolTest : public UploadFixture {
 protected:
  static constexpr char kExamplePath[] = "/var/log/app/a call.log";

  // The post of the example.
  URLRequest postExample() {
    givenFile(_page.example("content") + "\n", kExamplePath);
    makeUploadBackend(_page.example("url"))->setUdid("A5D0AEE2");
    EXPECT_TRUE(upload(kExamplePath));
    return helper().requests.empty() ? URLRequest() : helper().requests.back();
  }

  const ProtocolPage _page{"upload-protocol.md"};
};

TEST_F(UploadProtocolTest, theTablesAreWhatIsSentAndInThatOrder) {
  const URLRequest request = postExample();
  std::string query;
  for (const auto& [name, value] : tableOf(_page, "parameter")) {
    query += (query.empty() ? "" : "&") + name + "=";
    query += value.starts_with('`') ? value.substr(1, value.size() - 2) : "";
  }
  std::string sent = request.url.substr(request.url.find('?') + 1);
  for (const char* given : {"A5D0AEE2", "4711", "a%20call.log.gz"}) {
    const size_t at = sent.find(given);
    ASSERT_NE(at, std::string::npos) << given;
    sent.erase(at, std::strlen(given));
  }
  EXPECT_EQ(query, sent);
  std::vector<std::pair<std::string, std::string>> headers;
  for (const URLRequest::Header& header : request.headers) headers.emplace_back(header.name, "`" + header.value + "`");
  EXPECT_EQ(tableOf(_page, "header"), headers);
}

TEST_F(UploadProtocolTest, theExampleIsAPostByteForByte) {
  const URLRequest request = postExample();
  EXPECT_EQ(_page.example("request"), request.url);
  EXPECT_EQ(_page.example("headers"), headerLines(request));
  EXPECT_EQ(compression::inflate(bytesOf(_page.example("body")), 1000)->view(), _page.example("content") + "\n");
  const std::string sent(bodyBytes(request).view());
  // Another zlib may choose other codes; the frame is the same everywhere.
  const std::string written = bytesOf(_page.example("body"));
  EXPECT_EQ(sent.substr(0, 10), written.substr(0, 10));
  EXPECT_EQ(sent.substr(sent.size() - 8), written.substr(written.size() - 8));
  EXPECT_EQ(RecordingConnectivity::bodyText(request), _page.example("content") + "\n");
}

}  // namespace
}  // namespace telvane::testing
