// Bags that come from the server: what is asked for, and what becomes of each kind of answer.
#include <cerrno>

#include "tests/storebag/StorebagFixture.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class StorebagDownloadTest : public StorebagFixture {
 protected:
  int64_t maxAgeStoredFor(const char* cacheControl) {
    givenServerAnswers(NetworkAnswer::ok(StorebagBuilder().envelope()).withHeader("Cache-Control", cacheControl));
    fetchUncached();
    return storedDefault("CACHED_media_max-age").integerValue();
  }
  void expectNoUpdate() {
    log().expectError("fetchStorebagWithName: Signature is missing");
    expectNothingFetched("loadStorebagFromDisk: could not load storebag 'media'");
    EXPECT_TRUE(hasLines(log(), 1,
                         "fetchNetworkStorebag: storebag 'media' does not need update as its content has not changed "
                         "on the server"));
    EXPECT_TRUE(hasLine(log(),
                        "fetchNetworkStorebag: Error resolving with lookup server "
                        "https://bags.example/root/media?version=1.0, sendSynchronousRequest error "));
    EXPECT_EQ(storedDefault("CACHED_media_max-age"), Value());
  }
};

TEST_F(StorebagDownloadTest, withoutACacheFileAVerifiedAnswerIsSavedWithItsMetricsAndItsSectionReturned) {
  const std::string envelope = StorebagBuilder().envelope();
  givenServerAnswers(NetworkAnswer::ok(envelope)
                         .withHeader("Cache-Control", "max-age=600")
                         .withHeader("Last-Modified", "Thu, 01 Jan 2026 00:00:00 GMT"));
  const auto fetched = fetchUncached();
  ASSERT_TRUE(fetched.section.has_value());
  EXPECT_EQ(*fetched.section, StorebagBuilder::section("splunk"));
  EXPECT_EQ(fetched.version, Value("3.1"));
  EXPECT_EQ(fetched.maxAge, 600);
  EXPECT_FALSE(fetched.unchanged);
  EXPECT_EQ(process.files().content(cachePath()), envelope);
  EXPECT_EQ(storedDefault("CACHED_media_max-age"), Value(600));
  EXPECT_EQ(storedDefault("CACHED_media_Last-Modified"), Value("Thu, 01 Jan 2026 00:00:00 GMT"));
  EXPECT_TRUE(hasLine(log(),
                      "saveLastLoadedStorebagMetricsWithName: New storebag 'media' received: maxAge 600, "
                      "Last-Modified 'Thu, 01 Jan 2026 00:00:00 GMT'"));
  EXPECT_TRUE(hasLine(log(), "fetchStorebagWithName: storebag 'media' has been saved to disk cache"));
}

TEST_F(StorebagDownloadTest, asksOneGETThatReloadsAndTakes15Seconds) {
  process.clientBundle().setVersion(String("8.1"));
  givenServedEnvelope(StorebagBuilder().envelope());
  fetchUncached();
  ASSERT_EQ(world.network().requests().size(), 1u);
  const RecordedRequest& request = world.network().requests().front();
  EXPECT_EQ(request.request.url, "https://bags.example/root/media?version=8.1");
  EXPECT_EQ(request.request.method, "GET");
  EXPECT_EQ(request.request.timeout, 15s);
  EXPECT_EQ(request.request.cachePolicy, URLRequest::CachePolicy::ReloadIgnoringLocalCache);
  EXPECT_EQ(RecordingConnectivity::header(request.request, "If-Modified-Since"), std::nullopt);
  EXPECT_EQ(request.configuration.sourceApplicationSecondaryIdentifier, "storebag:shared");
  EXPECT_TRUE(hasLine(log(), "fetchNetworkStorebag: Storebag Server URL: https://bags.example/root/media?version=8.1"));
}

TEST_F(StorebagDownloadTest, withoutABundleVersionAsksAsVersion8) {
  process.clientBundle().setVersion(std::nullopt);
  givenServedEnvelope(StorebagBuilder().envelope());
  fetchUncached();
  EXPECT_EQ(world.network().countTo("/root/media?version=8.0"), 1u);
}

TEST_F(StorebagDownloadTest, theBuiltInServerIsTheBuildsOwnUnlessTheDefaultsNameOne) {
  givenDefault(kDefaultsStorebagURL, Value());
  log().allowErrors();
  fetch();
  EXPECT_EQ(world.network().countTo("https://storebag.telvane.example/bags/media?"), 1u) << log().text();
}

TEST_F(StorebagDownloadTest, anInternalBuildAsksTheInternalServer) {
  givenDefault(kDefaultsStorebagURL, Value());
  process.deviceAnswers().set("ReleaseType", "Internal");
  log().allowErrors();
  fetch();
  EXPECT_EQ(world.network().countTo("https://storebag-internal.telvane.example/bags/media?"), 1u) << log().text();
}

TEST_F(StorebagDownloadTest, maxAgeIsReadFromCacheControl) { EXPECT_EQ(maxAgeStoredFor("max-age=600"), 600); }
TEST_F(StorebagDownloadTest, maxAgeIsFoundAmongOtherDirectives) {
  EXPECT_EQ(maxAgeStoredFor("public, max-age=600, must-revalidate"), 600);
}
TEST_F(StorebagDownloadTest, aCacheControlWithoutMaxAgeStoresADay) { EXPECT_EQ(maxAgeStoredFor("no-cache"), 86400); }
TEST_F(StorebagDownloadTest, aMaxAgeWithoutANumberStoresADay) { EXPECT_EQ(maxAgeStoredFor("max-age"), 86400); }
TEST_F(StorebagDownloadTest, whatFollowsABlankMaxAgeIsReadLeniently) { EXPECT_EQ(maxAgeStoredFor("max-age=x"), 0); }

TEST_F(StorebagDownloadTest, withoutHeadersStoresADayAndForgetsTheLastModification) {
  givenDefault("CACHED_media_Last-Modified", "yesterday");
  givenServedEnvelope(StorebagBuilder().envelope());
  EXPECT_EQ(fetchUncached().maxAge, 86400);
  EXPECT_EQ(storedDefault("CACHED_media_max-age"), Value(86400));
  EXPECT_EQ(storedDefault("CACHED_media_Last-Modified"), Value());
}

TEST_F(StorebagDownloadTest, aServerThatSays304GivesNothing) {
  givenServerAnswers(NetworkAnswer::status(304));
  expectNoUpdate();
}

TEST_F(StorebagDownloadTest, aServerThatSays404GivesNothing) {
  givenServerAnswers(NetworkAnswer::status(404, StorebagBuilder().envelope()));
  expectNoUpdate();
}

TEST_F(StorebagDownloadTest, aServerThatSays500GivesNothing) {
  givenServerAnswers(NetworkAnswer::status(500, "broken"));
  expectNoUpdate();
}

TEST_F(StorebagDownloadTest, aServerThatHangsIsGivenUpAfter15Seconds) {
  givenServerAnswers(NetworkAnswer::silence());
  const auto before = world.scheduler().now();
  expectNoUpdate();
  EXPECT_EQ(world.scheduler().now() - before, 15s);
}

TEST_F(StorebagDownloadTest, aServerThatClosesEarlyGivesNothing) {
  givenServerAnswers(
      NetworkAnswer::ok(StorebagBuilder().envelope().substr(0, 100)).thenFailing(URLErrorCode::NetworkConnectionLost));
  expectNoUpdate();
}

TEST_F(StorebagDownloadTest, noNetworkAtAllIsGivenUpAfter15Seconds) {
  world.network().loseConnectivity();
  expectNoUpdate();
}

TEST_F(StorebagDownloadTest, anEmptyAnswerStoresItsMetricsAndCountsAsUnchanged) {
  givenServedEnvelope("");
  log().expectError("fetchStorebagWithName: Signature is missing");
  expectNothingFetched("loadStorebagFromDisk");
  EXPECT_TRUE(hasLine(log(), "fetchNetworkStorebag: received zero-length storebag for 'media‘, treat as unchanged"));
  EXPECT_EQ(storedDefault("CACHED_media_max-age"), Value(86400));
}

TEST_F(StorebagDownloadTest, theConferencingBagsBuiltInDefaultIsOfferedButNeverAccepted) {
  givenServerAnswers(NetworkAnswer::status(500), kConferencing);
  log().expectError("fetchStorebagWithName: Signature is missing");
  log().expectError("Could not fetch storebag for client type 7");
  EXPECT_FALSE(fetchUncached(7).section.has_value());
  EXPECT_TRUE(hasLine(log(), "fetchNetworkStorebag: Loading default storebag 'conferencing'"));
  EXPECT_TRUE(hasNoLine(log(), "propertyListWithData error"));
  EXPECT_FALSE(process.files().exists(cachePath(kConferencing)));
}

TEST_F(StorebagDownloadTest, clientTypesThatShareANameGetTheSameBag) {
  givenServedEnvelope(StorebagBuilder().envelope());
  const auto first = fetchUncached(6);
  const auto second = fetch(14);
  const auto third = fetch(15);
  EXPECT_EQ(first.section, second.section);
  EXPECT_EQ(first.section, third.section);
  EXPECT_EQ(world.network().requests().size(), 1u);
}

TEST_F(StorebagDownloadTest, aBagThatCannotBeSavedIsUsedAllTheSame) {
  process.fileFaults().fillDisk();
  givenServedEnvelope(StorebagBuilder().envelope());
  log().expectError(
      "saveStorebagToDisk: could not save storebag 'media' to file 'file:///home/user/Library/Caches/"
      "telvaned/storebags/media'. Error is '");
  EXPECT_TRUE(fetchUncached().section.has_value());
  EXPECT_TRUE(hasNoLine(log(), "has been saved to disk cache"));
}

TEST_F(StorebagDownloadTest, aSecondFetchOfANameWhoseFileHasGoneWaitsForEver) {
  givenServedEnvelope(StorebagBuilder().envelope());
  fetchUncached();
  ASSERT_TRUE(isOk(process.files().remove(cachePath())));
  bool hasReturned = false;
  process.spawn("second fetch", [this, &hasReturned] {
    retriever->fetchStorebagForEnvironmentAndClientType(kClientType);
    hasReturned = true;
  });
  world.advance(24h);
  EXPECT_FALSE(hasReturned);
  EXPECT_TRUE(hasLines(log(), 1, "getURLRequestWithCompletionHandler: ignored duplicate request for storebag"));
}

}  // namespace
}  // namespace telvane::testing
