#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/StorebagKeys.h"
#include "storebag/StorebagRetriever.h"
#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"
#include "tests/support/StorebagBuilder.h"

namespace telvane::testing {

// One process that fetches storebags from a scripted server. The test's own thread is the one that waits for them.
class StorebagFixture : public ::testing::Test {
 protected:
  static constexpr char kServer[] = "https://bags.example/root";
  static constexpr int32_t kClientType = 6;
  static constexpr char kName[] = "media";
  static constexpr char kConferencing[] = "conferencing";

  StorebagFixture() {
    givenDefault(kDefaultsStorebagURL, kServer);
    process.clientBundle().setPublicKey(StorebagBuilder::publicKey());
  }
  ~StorebagFixture() override {
    retriever.reset();
    world.end();
  }

  void givenDefault(std::string_view key, Value value) {
    ASSERT_TRUE(isOk(process.userDefaults().setObject(kTelvaneDefaultsSuite.view(), key, std::move(value))));
  }
  Value storedDefault(const std::string& key) {
    return process.userDefaults().objectForKey(kTelvaneDefaultsSuite.view(), key);
  }
  static std::string cachePath(const std::string& name = kName) {
    return "~/Library/Caches/telvaned/storebags/" + name;
  }
  static std::string bagURL(const std::string& name = kName) { return std::string(kServer) + "/" + name; }

  void givenServerAnswers(NetworkAnswer answer, const std::string& name = kName) {
    world.network().answer(bagURL(name), std::move(answer));
  }
  void givenServedEnvelope(std::string_view envelope) { givenServerAnswers(NetworkAnswer::ok(envelope)); }
  // A cache file of now that stays fresh that long.
  void givenCachedEnvelope(std::string_view envelope, int maxAge = 3600) {
    process.files().place(cachePath(), envelope);
    givenDefault(std::string("CACHED_") + kName + "_max-age", maxAge);
  }
  StorebagRetriever::FetchResult fetch(int32_t clientType = kClientType) {
    if (retriever == nullptr) {
      context = std::make_unique<ProcessContext>(process.platform());
      retriever = std::make_shared<StorebagRetriever>(*context, shared);
    }
    auto result = retriever->fetchStorebagForEnvironmentAndClientType(clientType);
    world.runUntilIdle();
    return result;
  }
  // A first fetch, for which there is no cache file yet.
  StorebagRetriever::FetchResult fetchUncached(int32_t clientType = kClientType) {
    log().expectError("loadStorebagFromDisk: could not load storebag '");
    return fetch(clientType);
  }
  // A first fetch that gives nothing; the error line besides that on the missing file.
  void expectNothingFetched(const char* errorLine) {
    log().expectError(errorLine);
    log().expectError("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type 6");
    EXPECT_FALSE(fetchUncached().section.has_value());
    EXPECT_FALSE(process.files().exists(cachePath()));
  }
  RecordingLog& log() { return process.log(); }

  SimulatedWorld world;
  SimulatedPlatform& process = world.makeProcess("telvaned");
  std::unique_ptr<ProcessContext> context;
  ConnectivityShared shared;
  std::shared_ptr<StorebagRetriever> retriever;
};

}  // namespace telvane::testing
