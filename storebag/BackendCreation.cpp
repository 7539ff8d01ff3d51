#include "storebag/BackendCreation.h"

#include "interfaces/SessionKeys.h"
#include "util/DataHelpers.h"

namespace telvane {
namespace {

// The client types whose events may hold arrays and dictionaries, the second on internal builds only.
constexpr int32_t kNestedDataClientType = 28;
constexpr int32_t kNestedDataInternalClientType = 7;

// Everything that all backends of one call are stamped with.
struct Identity {
  uint32_t sessionID;
  int32_t clientType;
  uint16_t clientVersion;
  String deviceIdentifier;
  std::optional<String> productVersion;
  std::optional<String> buildVersion;
  std::optional<String> productType;
  bool isInternal;
  bool requireUserInfo;
  bool batchEvents;
  bool allowNestedData;
  Value userInfo;
  String selfVersion;
  Date startTimestamp;
};

Identity identityOf(const ProcessContext& context, const Dictionary& sessionInfo, const Value& userInfo,
                    String deviceIdentifier) {
  const DeviceAnswers& answers = context.platform().deviceAnswers;
  const int32_t clientType = sessionInfo[kTelvaneSessionInfoClientType].int32Value();
  const Value& requireUserInfo = sessionInfo[kTelvaneSessionInfoRequireUserInfo];
  const bool isInternal = context.isInternalBuild();
  return {.sessionID = sessionInfo[kTelvaneSessionInfoSessionID].uint32Value(),
          .clientType = clientType,
          .clientVersion = sessionInfo[kTelvaneSessionInfoClientVersion].low16Bits(),
          .deviceIdentifier = std::move(deviceIdentifier),
          .productVersion = answers.answer(DeviceAnswers::kProductVersion),
          .buildVersion = answers.answer(DeviceAnswers::kBuildVersion),
          .productType = answers.answer(DeviceAnswers::kProductType),
          .isInternal = isInternal,
          .requireUserInfo = !requireUserInfo.isPresent() || requireUserInfo.booleanValue(),
          .batchEvents = sessionInfo[kTelvaneSessionInfoBatchEvent].booleanValue(),
          .allowNestedData =
              clientType == kNestedDataClientType || (isInternal && clientType == kNestedDataInternalClientType),
          .userInfo = userInfo,
          .selfVersion = context.clientFrameworkVersion(),
          .startTimestamp = context.platform().clock.now()};
}

void stamp(TelvaneBackend& backend, const Identity& identity) {
  backend.setSessionID(identity.sessionID);
  backend.setCompType(static_cast<uint32_t>(identity.clientType));
  backend.setClientVersion(identity.clientVersion);
  backend.setUdid(identity.deviceIdentifier);
  backend.setProductVersion(identity.productVersion);
  backend.setBuildVersion(identity.buildVersion);
  backend.setHardwareType(identity.productType);
  backend.setIsInternal(identity.isInternal);
  backend.setRequireUserInfo(identity.requireUserInfo);
  backend.setBatchEvents(identity.batchEvents);
  backend.setAllowNestedData(identity.allowNestedData);
  backend.setUserInfoDict(identity.userInfo);
  backend.setSelfVersion(identity.selfVersion);
  backend.setStartTimestamp(identity.startTimestamp);
}

}  // namespace

std::optional<BackendTable> createBackends(const ProcessContext& context, const Value& storebag,
                                           const Value& sessionInfo, const Value& userInfo, String deviceIdentifier) {
  if (!storebag.isDictionary()) {
    context.log().error("createBackends: Attempted to create backends with nil storebag");
    return std::nullopt;
  }
  if (!sessionInfo.isDictionary()) {
    context.log().error("createBackends: Attempted to create backends with nil session info");
    return std::nullopt;
  }
  const Identity identity = identityOf(context, *sessionInfo.dictionary(), userInfo, std::move(deviceIdentifier));
  const std::optional<String> productFamily = context.platform().deviceAnswers.answer(DeviceAnswers::kDeviceName);
  BackendTable backends;
  for (const DictionaryEntry& entry : *storebag.dictionary()) {
    auto backend = TelvaneBackend::newBackendWithName(context, entry.key, entry.value, productFamily,
                                                      static_cast<uint32_t>(identity.clientType));
    if (backend == nullptr) continue;
    stamp(*backend, identity);
    backends.emplace_back(entry.key, std::move(backend));
  }
  return backends;
}

}  // namespace telvane
