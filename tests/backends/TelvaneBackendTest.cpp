#include "backends/TelvaneBackend.h"

#include "interfaces/BackendNames.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

// A kind of backend that overrides nothing but what the tests look at.
class PlainBackend final : public TelvaneBackend {
 public:
  explicit PlainBackend(const ProcessContext& context) : TelvaneBackend(context, "plain", Dictionary(), "TelvaneBox") {}

  using TelvaneBackend::sendMessage;
  std::optional<String> sendMessage(Dictionary blob, Date timestamp, uint16_t method, uint16_t respCode,
                                    uint16_t eventID, uint32_t flag) override {
    lastEventID = eventID;
    return TelvaneBackend::sendMessage(std::move(blob), timestamp, method, respCode, eventID, flag);
  }
  void setLists(Value whitelist, Value blacklist) {
    _eventWhitelist = std::move(whitelist);
    _eventBlacklist = std::move(blacklist);
  }
  using TelvaneBackend::selfVersionText;
  using TelvaneBackend::versionComponents;

  uint16_t lastEventID = 0;
};

class TelvaneBackendTest : public BackendFixture {
 protected:
  std::shared_ptr<TelvaneBackend> named(const char* name) {
    return TelvaneBackend::newBackendWithName(context(), name, profile(), _productFamily, _clientType);
  }
  std::shared_ptr<PlainBackend> plain() { return std::make_shared<PlainBackend>(context()); }
};

TEST_F(TelvaneBackendTest, namesAnUnknownBackendInOneErrorLineAndMakesNone) {
  log().expectError("TelvaneBackend(newBackendWithName): release_timeout");
  EXPECT_EQ(named("release_timeout"), nullptr);
  EXPECT_TRUE(hasLines(log(), 1, "TelvaneBackend(newBackendWithName): "));
}

TEST_F(TelvaneBackendTest, anyNameThatContainsTheHTTPSNameIsOne) {
  for (const char* name : {"splunk", "splunk2", "my-splunk", "asplunkb", "gonzo", "qrs"}) {
    const auto backend = named(name);
    ASSERT_NE(backend, nullptr) << name;
    EXPECT_TRUE(backend->isHTTPSPostBackend()) << name;
    EXPECT_EQ(backend->name(), name);
  }
}

TEST_F(TelvaneBackendTest, otherNamesMustBeEqual) {
  log().allowErrors();
  for (const char* name : {"gonzo2", "Splunk", "qrs ", "splun", ""}) EXPECT_EQ(named(name), nullptr) << name;
}

TEST_F(TelvaneBackendTest, theOtherKindsAreMadeOfWhatTheirProfilesNeed) {
  _clientType = 7;
  const std::pair<const char*, Dictionary> kinds[] = {
      {"dashboard", {{kProfileIP, "192.0.2.1"}, {kProfilePort, 9000}}},
      {"upload_server", {{kProfilePostURL, "https://collector.example/upload"}}},
      {"power", {}},
      {"vdr", {}}};
  for (const auto& [name, needed] : kinds) {
    const auto backend = TelvaneBackend::newBackendWithName(context(), name, needed, _productFamily, _clientType);
    ASSERT_NE(backend, nullptr) << name;
    EXPECT_EQ(backend->name(), name);
    EXPECT_FALSE(backend->isHTTPSPostBackend()) << name;
    EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled) << name;
    backend->cleanup();
  }
  _world.runUntilIdle();
}

TEST_F(TelvaneBackendTest, aDesktopComputerHasNoWirelessDiagnostics) {
  process().deviceAnswers().set("ProductType", String(kDesktopProductType));
  log().expectError("TelvaneBackend(newBackendWithName): vdr");
  EXPECT_EQ(named("vdr"), nullptr);
}

TEST_F(TelvaneBackendTest, startsInStateZeroWithItsQueueAndDraw) {
  givenSamplingFactor(0.1234);
  const auto backend = plain();
  EXPECT_EQ(backend->state(), TelvaneBackendStateUnknown);
  EXPECT_DOUBLE_EQ(backend->samplingFactor(), 0.1234);
  givenSamplingFactor(0.9999);
  EXPECT_DOUBLE_EQ(plain()->samplingFactor(), 0.9999);
  givenSamplingFactor(0);
  EXPECT_EQ(plain()->samplingFactor(), 0.0);
}

TEST_F(TelvaneBackendTest, aReadBehindAWriteOfTheSameThreadSeesIt) {
  const auto backend = plain();
  backend->setState(TelvaneBackendStateSampledOut);
  backend->setState(TelvaneBackendStateDisabled);
  EXPECT_EQ(backend->state(), TelvaneBackendStateDisabled);
  EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
  EXPECT_EQ(backend->state(), TelvaneBackendStateEnabled);
}

TEST_F(TelvaneBackendTest, aWrittenStateDoesNotNeedTheBackendToLive) {
  auto backend = plain();
  backend->setState(TelvaneBackendStateEnabled);
  const std::weak_ptr<PlainBackend> weak = backend;
  backend.reset();
  _world.runUntilIdle();
  EXPECT_TRUE(weak.expired());
}

TEST_F(TelvaneBackendTest, doesNothingByDefault) {
  const auto backend = plain();
  int calls = 0;
  EXPECT_EQ(backend->flushMessagesWithCompletion([&calls](std::optional<String> text, std::optional<Error> error) {
    ++calls;
    EXPECT_FALSE(text.has_value() || error.has_value());
  }),
            std::nullopt);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(backend->flushMessagesWithCompletion(nullptr), std::nullopt);
  EXPECT_EQ(backend->sendMessage({}, Date(), 1, 1, 0), std::nullopt);
  EXPECT_FALSE(backend->uploadFileAtPath("/tmp/file", {}));
  EXPECT_FALSE(backend->uploadLogData({}));
  EXPECT_EQ(backend->batchedEventsSize(), 0u);
  EXPECT_FALSE(backend->isHTTPSPostBackend());
  backend->cleanup();
  EXPECT_EQ(backend->combinedSessionIDString(), std::nullopt);
  backend->setCorrelatedSessionID("a.b");
  EXPECT_EQ(backend->combinedSessionIDString(), String("a.b"));
}

TEST_F(TelvaneBackendTest, numbersEventsFromOneAndWrapsAt65536) {
  const auto backend = plain();
  backend->sendMessage({}, Date(), 1, 1, 0);
  EXPECT_EQ(backend->lastEventID, 1);
  for (int i = 2; i <= 65535; ++i) backend->sendMessage({}, Date(), 1, 1, 0);
  EXPECT_EQ(backend->lastEventID, 65535);
  backend->sendMessage({}, Date(), 1, 1, 0);
  EXPECT_EQ(backend->lastEventID, 0);
}

TEST_F(TelvaneBackendTest, readsItsOwnVersionLeniently) {
  using Version = std::tuple<uint8_t, uint8_t, uint8_t>;
  EXPECT_EQ(PlainBackend::versionComponents("3"), Version(3, 0, 0));
  EXPECT_EQ(PlainBackend::versionComponents("1.300.2"), Version(1, 44, 2));
  EXPECT_EQ(PlainBackend::versionComponents(""), Version(0, 0, 0));
  EXPECT_EQ(PlainBackend::versionComponents("a.2b..9"), Version(0, 2, 0));
  EXPECT_EQ(PlainBackend::versionComponents("1.2.3.4"), Version(1, 2, 3));
  EXPECT_EQ(PlainBackend::versionComponents("1..3"), Version(1, 0, 3));
}

TEST_F(TelvaneBackendTest, writesAVersionWithoutAMinorPartOfZero) {
  const auto backend = plain();
  EXPECT_EQ(backend->selfVersionText(), "0.0");
  backend->setSelfVersion("3");
  EXPECT_EQ(backend->selfVersionText(), "3.0");
  backend->setSelfVersion("1.300.2");
  EXPECT_EQ(backend->selfVersionText(), "1.44.2");
}

TEST_F(TelvaneBackendTest, anAbsentWhitelistAdmitsAllAndAnEmptyOneNone) {
  const auto backend = plain();
  EXPECT_TRUE(backend->isWhitelistedEvent(7));
  backend->setLists(Array(), {});
  EXPECT_FALSE(backend->isWhitelistedEvent(7));
  backend->setLists(Array{5, 7.9, "8"}, {});
  EXPECT_TRUE(backend->isWhitelistedEvent(7)) << "numbers are read as integers";
  EXPECT_TRUE(backend->isWhitelistedEvent(8));
  EXPECT_FALSE(backend->isWhitelistedEvent(6));
}

TEST_F(TelvaneBackendTest, comparesCategoriesIn32Bits) {
  const auto backend = plain();
  backend->setLists(Array{65543}, {});
  EXPECT_FALSE(backend->isWhitelistedEvent(7)) << "65543 has 7 in its low 16 bits only";
  backend->setLists(Array{(int64_t{1} << 32) + 7}, {});
  EXPECT_TRUE(backend->isWhitelistedEvent(7));
}

TEST_F(TelvaneBackendTest, anAbsentOrEmptyBlacklistRefusesNone) {
  const auto backend = plain();
  EXPECT_FALSE(backend->isBlacklistedEvent(7));
  backend->setLists({}, Array());
  EXPECT_FALSE(backend->isBlacklistedEvent(7));
  backend->setLists({}, Array{7});
  EXPECT_TRUE(backend->isBlacklistedEvent(7));
  EXPECT_FALSE(backend->isBlacklistedEvent(8));
}

TEST_F(TelvaneBackendTest, digestsTextAsLowercaseHexadecimal) {
  EXPECT_EQ(TelvaneBackend::convertIntoSHA256(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
}

}  // namespace
}  // namespace telvane::testing
