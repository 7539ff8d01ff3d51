// Bags on disk: how long they stay fresh, how they are refreshed, and what damages them.
#include <gmock/gmock.h>

#include <cerrno>

#include "tests/storebag/StorebagFixture.h"
#include "tests/support/RecordingConnectivity.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

class StorebagCacheTest : public StorebagFixture {};

TEST_F(StorebagCacheTest, aFileYoungerThanMaxAgeNeedsNoNetwork) {
  givenCachedEnvelope(StorebagBuilder().envelope(), 3600);
  world.advance(3599s);
  const auto fetched = fetch();
  EXPECT_TRUE(fetched.section.has_value());
  EXPECT_EQ(fetched.maxAge, 3600);
  world.advance(3h);
  EXPECT_TRUE(world.network().requests().empty());
  EXPECT_TRUE(hasLine(log(),
                      "fetchStorebagWithName: storebag 'media' loaded from disk cache. Disk cache is valid and "
                      "will not be refreshed"));
}

TEST_F(StorebagCacheTest, aFileOfExactlyMaxAgeIsStillValid) {
  givenCachedEnvelope(StorebagBuilder().envelope(), 3600);
  world.advance(3600s);
  fetch();
  EXPECT_TRUE(hasLine(log(), "Disk cache is valid and will not be refreshed"));
}

TEST_F(StorebagCacheTest, anOlderFileIsUsedNowAndRefreshedWithinTwoHours) {
  givenCachedEnvelope(StorebagBuilder().set(kStorebagVersion, "old").envelope(), 60);
  givenDefault("CACHED_media_Last-Modified", "yesterday");
  const std::string fresh = StorebagBuilder().set(kStorebagVersion, "new").envelope();
  givenServedEnvelope(fresh);
  world.advance(61s);
  EXPECT_EQ(fetch().version, Value("old"));
  EXPECT_TRUE(hasLine(log(), "Disk cache expired and will be refreshed"));
  EXPECT_TRUE(hasLine(log(), "fetchNetworkStorebag: Adding 'Last-Modified: yesterday' to the header"));
  world.advance(2h);
  ASSERT_EQ(world.network().requests().size(), 1u);
  EXPECT_THAT(world.network().requests().front().request, HasHeader("If-Modified-Since", "yesterday"));
  EXPECT_EQ(process.files().content(cachePath()), fresh);
  EXPECT_EQ(fetch().version, Value("new"));
}

TEST_F(StorebagCacheTest, aRefreshThatSays304LeavesFileAndMetricsAsTheyWere) {
  const std::string envelope = StorebagBuilder().envelope();
  givenCachedEnvelope(envelope, 60);
  givenDefault("CACHED_media_Last-Modified", "yesterday");
  givenServerAnswers(NetworkAnswer::status(304).withHeader("Cache-Control", "max-age=5"));
  world.advance(61s);
  fetch();
  world.advance(2h);
  EXPECT_EQ(world.network().requests().size(), 1u);
  EXPECT_EQ(process.files().content(cachePath()), envelope);
  EXPECT_EQ(storedDefault("CACHED_media_max-age"), Value(60));
  EXPECT_EQ(storedDefault("CACHED_media_Last-Modified"), Value("yesterday"));
}

TEST_F(StorebagCacheTest, aRefreshOfABadBagLeavesTheFileAsItWas) {
  const std::string envelope = StorebagBuilder().envelope();
  givenCachedEnvelope(envelope, 60);
  givenServedEnvelope(StorebagBuilder::envelopeOfAStranger(StorebagBuilder().bag()));
  world.advance(61s);
  fetch();
  log().expectError("fetchStorebagWithName: Signature can not be verified, ");
  world.advance(2h);
  EXPECT_EQ(process.files().content(cachePath()), envelope);
}

TEST_F(StorebagCacheTest, aFileWithoutMetricsIsRefreshed) {
  process.files().place(cachePath(), StorebagBuilder().envelope());
  world.advance(1s);
  EXPECT_EQ(fetch().maxAge, 0);
  EXPECT_TRUE(hasLine(log(), "Disk cache expired and will be refreshed"));
}

TEST_F(StorebagCacheTest, metricsOfWrongTypesCountAsNone) {
  givenCachedEnvelope(StorebagBuilder().envelope());
  givenDefault("CACHED_media_max-age", Array{1});
  givenDefault("CACHED_media_Last-Modified", 7);
  givenServedEnvelope(StorebagBuilder().envelope());
  world.advance(1s);
  EXPECT_TRUE(fetch().section.has_value());
  world.advance(2h);
  ASSERT_EQ(world.network().requests().size(), 1u);
  EXPECT_EQ(RecordingConnectivity::header(world.network().requests().front().request, "If-Modified-Since"),
            std::nullopt);
}

TEST_F(StorebagCacheTest, theStoredLastModificationAlwaysCountsAsChanged) {
  givenCachedEnvelope(StorebagBuilder().envelope());
  givenDefault("CACHED_media_Last-Modified", "yesterday");
  EXPECT_FALSE(fetch().unchanged);
  EXPECT_TRUE(hasLine(log(),
                      "getLastLoadedStorebagMetricsWithName: 'Last-Modified' has changed to 'yesterday' for "
                      "storebag 'media'"));
}

TEST_F(StorebagCacheTest, aFileThatNoLongerVerifiesGivesNothingOnEveryLoad) {
  givenCachedEnvelope(StorebagBuilder::envelopeOfAStranger(StorebagBuilder().bag()));
  log().expectError("fetchStorebagWithName: Signature can not be verified, ");
  log().expectError("Could not fetch storebag for client type 6");
  EXPECT_FALSE(fetch().section.has_value());
  EXPECT_FALSE(fetch().section.has_value());
  EXPECT_TRUE(world.network().requests().empty());
}

TEST_F(StorebagCacheTest, anUnreadableFolderIsPassedOver) {
  givenCachedEnvelope(StorebagBuilder().envelope());
  process.fileFaults().failReads(EACCES, "storebags");
  givenServedEnvelope(StorebagBuilder().set(kStorebagVersion, "served").envelope());
  log().expectError(
      "loadStorebagFromDisk: could not load storebag 'media' from file 'file:///home/user/Library/Caches/"
      "telvaned/storebags/media'. Error is '");
  EXPECT_EQ(fetch().version, Value("served"));
}

TEST_F(StorebagCacheTest, anOversizedFileIsPassedOver) {
  givenCachedEnvelope(std::string((16u << 20) + 1, 'x'));
  givenServedEnvelope(StorebagBuilder().envelope());
  EXPECT_TRUE(fetchUncached().section.has_value());
}

TEST_F(StorebagCacheTest, internalBuildsTakeTheProtectionAwayBeforeReading) {
  process.deviceAnswers().set("ReleaseType", "Internal");
  givenDefault(kDefaultsEnvironmentType, 4);
  givenCachedEnvelope(StorebagBuilder().envelope());
  EXPECT_TRUE(fetch().section.has_value());
  const std::string folder = "/home/user/Library/Caches/telvaned";
  EXPECT_THAT(process.files().unprotectedPaths(),
              ElementsAre(folder, folder + "/storebags", folder + "/storebags/media"));
}

TEST_F(StorebagCacheTest, aProtectionThatStaysIsLogged) {
  process.deviceAnswers().set("ReleaseType", "Internal");
  givenDefault(kDefaultsEnvironmentType, 4);
  givenCachedEnvelope(StorebagBuilder().envelope());
  process.fileFaults().failWrites(EPERM, "telvaned");
  log().expectError("setStorageClassProtectionLevel: could not set attribute ");
  EXPECT_TRUE(fetch().section.has_value());
  EXPECT_TRUE(hasLines(log(), 3, "NSFileProtectionKey = NSFileProtectionNone;"));
}

TEST_F(StorebagCacheTest, otherBuildsLeaveTheProtectionAlone) {
  givenCachedEnvelope(StorebagBuilder().envelope());
  fetch();
  EXPECT_TRUE(process.files().unprotectedPaths().empty());
}

}  // namespace
}  // namespace telvane::testing
