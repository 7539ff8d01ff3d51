// That docs/collector-protocol.md says what is sent: its tables name every header and key, and no other, and its
// example is a post byte for byte.
#include <gmock/gmock.h>
#include <openssl/hmac.h>

#include <set>

#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"
#include "tests/backends/ProtocolPage.h"

namespace telvane::testing {
namespace {

constexpr char kDigestKey[] = "secret";

std::set<std::string> keysOf(const Dictionary& dictionary) {
  std::set<std::string> keys;
  for (const DictionaryEntry& entry : dictionary) keys.emplace(entry.key.view());
  return keys;
}

std::set<std::string> setOf(const std::vector<std::string>& names) { return {names.begin(), names.end()}; }

class CollectorProtocolTest : public BackendFixture {
 protected:
  // One event from a session that has all that a request can tell of.
  Dictionary postEverything() {
    _client.set(kClientEntryIncludeSessionID, 1);
    makeBackend();
    backend().setCombinedSessionIDString("c2Vzc2lvbg==");
    backend().setDigestKey(Data::copyOf(kDigestKey));
    return posted({{Key("title"), "song"}});
  }
  // The names in the first column of the section's table.
  std::vector<std::string> namesIn(const std::string& section) const {
    std::vector<std::string> names;
    const std::string text = _page.section(section);
    for (size_t at = text.find("\n| `"); at != std::string::npos; at = text.find("\n| `", at + 1)) {
      names.push_back(between(text.substr(at), "`", "`"));
    }
    return names;
  }

  const ProtocolPage _page{"collector-protocol.md"};
};

TEST_F(CollectorProtocolTest, theTableOfHeadersIsWhatIsSentAndInThatOrder) {
  givenInternalBuild();
  _isInternal = true;
  postEverything();
  EXPECT_EQ(namesIn("Headers"), RecordingConnectivity::headerNames(posts().lastRequest()));
}

TEST_F(CollectorProtocolTest, theTableOfTheBodyNamesItsKeys) {
  postEverything();
  const Value body = RecordingConnectivity::bodyValue(posts().lastRequest());
  EXPECT_EQ(setOf(namesIn("The body")), keysOf(*body.dictionary()));
}

TEST_F(CollectorProtocolTest, theTableOfAnEventNamesItsKeys) {
  givenInternalBuild();
  _userInfo = Dictionary{{Key("own"), 1}};
  makeBackend();
  backend().setCombinedSessionIDString("c2Vzc2lvbg==");
  Dictionary event = posted({}, 7, 2, kPeriodicReportFlag);
  event.remove("own");
  EXPECT_EQ(setOf(namesIn("An event")), keysOf(event));
}

TEST_F(CollectorProtocolTest, theExampleIsAPostByteForByte) {
  postEverything();
  const URLRequest request = posts().lastRequest();
  EXPECT_EQ(_page.example("json"), RecordingConnectivity::bodyText(request));
  EXPECT_EQ(_page.example("headers"), headerLines(request));
}

TEST_F(CollectorProtocolTest, theExamplesDigestIsThatOfItsText) {
  const std::string json = _page.example("json");
  std::string hex;
  for (const char c : std::string_view(kDigestKey)) hex += fmt::format("{:02x}", c);
  EXPECT_EQ(_page.example("key"), hex);
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned size = 0;
  ASSERT_NE(HMAC(EVP_sha1(), kDigestKey, sizeof kDigestKey - 1, reinterpret_cast<const unsigned char*>(json.data()),
                 json.size(), digest, &size),
            nullptr);
  std::string groups;
  for (unsigned i = 0; i < size; ++i) groups += fmt::format("{}{:02x}", i > 0 && i % 4 == 0 ? " " : "", digest[i]);
  EXPECT_EQ(size, 20u);
  EXPECT_EQ(between(_page.example("headers") + "\n", "X-TVN-DIGEST: <", ">\n"), groups);
}

}  // namespace
}  // namespace telvane::testing
