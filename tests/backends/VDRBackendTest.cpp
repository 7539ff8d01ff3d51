#include "backends/VDRBackend.h"

#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

constexpr char kBundle[] = "/System/Library/PrivateFrameworks/Confluxa.framework/Frameworks/ZPHPerformance.framework";
constexpr char kLoading[] = "VDRBackend(initWithName): Loading VDR adaptor class for client type ";
constexpr char kLost[] =
    "VDRBackend(sendMessage): VDR adaptor (null) does not respond to forwarding selector "
    "sendMessageWithMethod:respCode:dict:";

class VDRBackendTest : public BackendFixture {
 protected:
  void givenAdaptor() { diagnostics().putClass(kBundle, "VDRAdaptor"); }
  ScriptedWirelessDiagnostics& diagnostics() { return process().wirelessDiagnostics(); }
  std::shared_ptr<TelvaneBackend> newVDRBackend(uint32_t clientType, const Value& profile = Dictionary()) {
    return TelvaneBackend::newBackendWithName(context(), "vdr", profile, _productFamily, clientType);
  }
  // As the session hands an event over.
  std::optional<String> sendBlob(TelvaneBackend& backend, Dictionary blob) {
    return backend.sendMessage(std::move(blob), _world.clock().now(), 7, 2, 3);
  }
};

TEST_F(VDRBackendTest, isForThreeClientTypesOnly) {
  givenAdaptor();
  log().allowErrors();
  for (uint32_t type = 0; type <= 31; ++type) {
    const bool isTaken = type == 7 || type == 11 || type == 13;
    EXPECT_EQ(VDRBackend::isClientTypeAllowed(type), isTaken) << type;
    EXPECT_EQ(newVDRBackend(type) != nullptr, isTaken) << type;
  }
  EXPECT_FALSE(VDRBackend::isClientTypeAllowed(UINT32_MAX));
}

TEST_F(VDRBackendTest, saysForWhichClientTypeItLoadsItsAdaptorAndWhichItRefuses) {
  givenAdaptor();
  EXPECT_NE(newVDRBackend(11), nullptr);
  EXPECT_TRUE(hasLines(log(), 1, kLoading + std::string("11")));
  log().expectError("VDRBackend(initWithName): No matching bundle found for client type 8");
  EXPECT_EQ(newVDRBackend(8), nullptr);
  EXPECT_TRUE(hasLines(log(), 1, kLoading + std::string("8")));
  EXPECT_EQ(diagnostics().openedPaths(), std::vector<std::string>{kBundle}) << "nothing is opened for who is refused";
}

TEST_F(VDRBackendTest, withoutAClientTypeThereIsNone) {
  givenAdaptor();
  log().expectError("VDRBackend(initWithName): No matching bundle found for client type 0");
  EXPECT_EQ(VDRBackend::initWithName(context(), "vdr", Dictionary(), _productFamily), nullptr);
}

TEST_F(VDRBackendTest, readsNothingInItsSection) {
  givenAdaptor();
  _productFamily = "";
  for (const Value& profile : {Value(), Value(5), Value(Array()), Value(Dictionary{{kProfileActive, false}})}) {
    const auto backend = TelvaneBackend::newBackendWithName(context(), "vdr", profile, std::nullopt, 7);
    ASSERT_NE(backend, nullptr);
    EXPECT_EQ(backend->name(), "vdr");
    EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
    EXPECT_EQ(backend->displayURL(), std::nullopt);
  }
}

TEST_F(VDRBackendTest, isEnabledWithoutConsentAndUserInfo) {
  givenAdaptor();
  process().consent().set(false);
  const auto backend = newVDRBackend(7);
  EXPECT_EQ(backend->state(), TelvaneBackendStateUnknown);
  EXPECT_EQ(backend->updateState(), TelvaneBackendStateEnabled);
  EXPECT_EQ(backend->state(), TelvaneBackendStateEnabled);
}

TEST_F(VDRBackendTest, handsOverWhatTheClientSentAndNothingElse) {
  givenAdaptor();
  const auto backend = newVDRBackend(13);
  const Dictionary payload{{Key("rating"), 5}, {Key("deep"), Dictionary{{Key("list"), Array{1, "two"}}}}};
  EXPECT_EQ(sendBlob(*backend, {{kTelvaneMessageBlobClientData, payload},
                                {kTelvaneMessageBlobSharedData, Dictionary{{Key("call"), "a"}}}}),
            std::nullopt);
  const auto messages = diagnostics().messages();
  ASSERT_EQ(messages.size(), 1u);
  EXPECT_EQ(messages[0].method, 7);
  EXPECT_EQ(messages[0].respCode, 2);
  EXPECT_EQ(messages[0].dict, payload);
  EXPECT_EQ(messages[0].adaptor, std::string("<VDRAdaptor of ") + kBundle + ">");
}

TEST_F(VDRBackendTest, handsOverAnEmptyMessageWhereTheClientSentNoPayloadAndNotWhatItsHierarchyShares) {
  givenAdaptor();
  const auto backend = newVDRBackend(7);
  sendBlob(*backend, {{kTelvaneMessageBlobSharedData, Dictionary{{Key("call"), "a"}}}});
  sendBlob(*backend, {});
  const auto messages = diagnostics().messages();
  ASSERT_EQ(messages.size(), 2u);
  EXPECT_EQ(messages[0].dict, Dictionary());
  EXPECT_EQ(messages[1].dict, Dictionary());
}

// Whatever its keys are called: only a session's own wrapping is taken off.
TEST_F(VDRBackendTest, handsOverAMessageOfItsOwnShapeAsItIs) {
  givenAdaptor();
  const auto backend = newVDRBackend(7);
  const std::vector<Dictionary> sent{
      {{Key("bare"), true}},
      {{kTelvaneMessageBlobClientData, "text"}},
      {{kTelvaneMessageBlobSharedData, 5}},
      {{kTelvaneMessageBlobClientData, Dictionary{{Key("n"), 1}}}, {Key("more"), 2}},
      {{kTelvaneMessageBlobClientData, Dictionary{{Key("n"), 1}}}, {kTelvaneMessageBlobSharedData, 5}}};
  for (const Dictionary& message : sent) {
    sendBlob(*backend, message);
    EXPECT_EQ(diagnostics().messages().back().dict, message);
  }
}

TEST_F(VDRBackendTest, handsOverTheLargestNumbers) {
  givenAdaptor();
  const auto backend = newVDRBackend(7);
  backend->sendMessage({}, _world.clock().now(), 65535, 65534, UINT32_MAX);
  ASSERT_EQ(diagnostics().messages().size(), 1u);
  EXPECT_EQ(diagnostics().messages()[0].method, 65535);
  EXPECT_EQ(diagnostics().messages()[0].respCode, 65534);
}

TEST_F(VDRBackendTest, losesEachEventWithOneErrorWhereThereIsNoBundle) {
  const auto backend = newVDRBackend(7);
  ASSERT_NE(backend, nullptr);
  EXPECT_EQ(diagnostics().openedPaths(), std::vector<std::string>{kBundle});
  log().expectError(kLost);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(sendBlob(*backend, {}), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 3, kLost));
}

TEST_F(VDRBackendTest, losesEachEventWithOneErrorWhereTheBundleHasNoSuchClass) {
  diagnostics().putClass(kBundle, "AnotherAdaptor");
  const auto backend = newVDRBackend(7);
  ASSERT_NE(backend, nullptr);
  log().expectError(kLost);
  sendBlob(*backend, {});
  EXPECT_TRUE(hasLines(log(), 1, kLost));
}

TEST_F(VDRBackendTest, namesAnAdaptorWithoutTheSelectorInEachError) {
  diagnostics().putClass(kBundle, "VDRAdaptor", {"sendMessage:", "sendMessageWithMethod:respCode:"});
  const auto backend = newVDRBackend(11);
  log().expectError("VDRBackend(sendMessage): VDR adaptor <VDRAdaptor of");
  sendBlob(*backend, {});
  sendBlob(*backend, {});
  EXPECT_TRUE(hasLines(log(), 2,
                       std::string("VDRBackend(sendMessage): VDR adaptor <VDRAdaptor of ") + kBundle +
                           "> does not respond to forwarding selector sendMessageWithMethod:respCode:dict:"));
  EXPECT_TRUE(diagnostics().messages().empty());
}

TEST_F(VDRBackendTest, letsGoOfAdaptorAndBundleWhenItGoes) {
  givenAdaptor();
  auto one = newVDRBackend(7);
  auto other = newVDRBackend(7);
  EXPECT_EQ(diagnostics().liveAdaptors(), 2u) << "each backend has an adaptor of its own";
  one->cleanup();
  one.reset();
  EXPECT_EQ(diagnostics().liveAdaptors(), 1u);
  EXPECT_EQ(diagnostics().liveBundles(), 1u);
  other.reset();
  EXPECT_EQ(diagnostics().liveAdaptors(), 0u);
  EXPECT_EQ(diagnostics().liveBundles(), 0u);
}

TEST_F(VDRBackendTest, neitherBatchesNorUploads) {
  givenAdaptor();
  const auto backend = newVDRBackend(7);
  backend->setBatchEvents(true);
  sendBlob(*backend, {{Key("n"), 1}});
  EXPECT_EQ(diagnostics().messages().size(), 1u);
  EXPECT_EQ(backend->batchedEventsSize(), 0u);
  EXPECT_EQ(backend->flushMessagesWithCompletion(nullptr), std::nullopt);
  EXPECT_FALSE(backend->uploadFileAtPath("/tmp/file", {}));
  EXPECT_FALSE(backend->uploadLogData({}));
  EXPECT_FALSE(backend->isHTTPSPostBackend());
}

}  // namespace
}  // namespace telvane::testing
