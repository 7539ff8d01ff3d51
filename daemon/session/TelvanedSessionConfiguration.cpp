// Configuration of a session: session info, user info, backends from the storebag, start message.
#include <algorithm>

#include "daemon/session/TelvanedSession.h"
#include "interfaces/BackendNames.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionEvents.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"

namespace telvane {
namespace {

constexpr size_t kMaximumHierarchyTokenBytes = 1024;

Value orUnknown(std::optional<String> answer) {
  return answer.has_value() ? Value(*std::move(answer)) : Value(String::fromStatic(kUnknown));
}

}  // namespace

void TelvanedSession::setSessionInfo(Dictionary sessionInfo, Value userInfo, Value frameworksToCheck,
                                     bool hasAggregationBlock) {
  {
    MonitorLock lock(_sessionDelegate->monitor());
    _sessionInfo = sessionInfo;
  }
  if (_sessionDelegate->isActiveClientLimitReachedForSession(*this, _sessionInfo)) return;
  setSessionID(sessionInfo);
  log().message("setSessionInfo: Configuring session {}", _sessionID);
  if (userInfo.isPresent() && !sessionInfo[kTelvaneSessionInfoRequireUserInfo].booleanValue()) {
    log().error("setSessionInfo: Configure session: user info provided without requiring it");
  }
  setHierarchyFromSessionInfo();
  _sessionDelegate->updateCorrelatedSessions(*this);
  _frameworks = std::move(frameworksToCheck);
  updateUserInfo(std::move(userInfo));
  // In the midst of a session's life its helper may be another one from here on.
  activateHelperOfEnabledBackends();
  _hasAggregator = hasAggregationBlock;
}

void TelvanedSession::setSessionID(const Dictionary& sessionInfo) {
  MonitorLock lock(_sessionDelegate->monitor());
  _sessionID = sessionInfo[kTelvaneSessionInfoSessionID].uint32Value();
}

void TelvanedSession::setHierarchyFromSessionInfo() {
  MonitorLock lock(_sessionDelegate->monitor());
  const Dictionary* sessionInfo = _sessionInfo.dictionary();
  const Dictionary* token =
      sessionInfo != nullptr ? (*sessionInfo)[kTelvaneSessionInfoHierarchyToken].dictionary() : nullptr;
  _hierarchyDictionary = token != nullptr ? std::optional(*token) : std::nullopt;
  // The agent keeps the text longer than the session lives.
  if (const auto text = hierarchyToken(); text.has_value() && text->size() > kMaximumHierarchyTokenBytes) {
    log().error("setSessionInfo: the hierarchy token of session {} has more than {} bytes. It counts as standalone",
                _sessionID, kMaximumHierarchyTokenBytes);
    _hierarchyDictionary = std::nullopt;
  }
}

bool TelvanedSession::hasValidUserInfoKeys() const {
  const Dictionary* userInfo = _userInfo.dictionary();
  return userInfo != nullptr &&
         (userInfo->contains(kTelvaneUserInfoClientName) || userInfo->contains(kTelvaneUserInfoServiceName));
}

void TelvanedSession::releaseUserInfo() {
  // User info without a name took no helper. Released all the same, it would give up the helper of the sessions whose
  // names are empty, which stand under the same key.
  if (_connectivityHelper != nullptr) _sessionDelegate->releaseSharedConnectivityHelperForReportingSession(*this);
  _userInfo = Value();
  _connectivityHelper.reset();
}

void TelvanedSession::updateUserInfo(Value userInfo) {
  releaseUserInfo();
  // Anything but a dictionary counts as no user info.
  if (userInfo.isDictionary()) _userInfo = std::move(userInfo);
  if (!hasValidUserInfoKeys()) return;
  _connectivityHelper = _sessionDelegate->copySharedConnectivityHelperForReportingSession(
      *this, ReportingSessionConnectivityHelper::POSTRequestMode());
  if (_connectivityHelper == nullptr) return;
  _connectivityHelper->setReleaseTimeout(_connectivityHelperReleaseTimeout);
  if (!_backends.has_value()) return;
  for (const auto& [name, backend] : *_backends) backend->setReportingSessionConnectivityDelegate(_connectivityHelper);
}

bool TelvanedSession::isNameChanged(const Value& newUserInfo, const Key& nameKey) const {
  const Dictionary* newDictionary = newUserInfo.dictionary();
  const String* newName = newDictionary != nullptr ? (*newDictionary)[nameKey].string() : nullptr;
  const String* oldName = _userInfo.isDictionary() ? (*_userInfo.dictionary())[nameKey].string() : nullptr;
  return newName == nullptr || oldName == nullptr || !(*newName == *oldName);
}

void TelvanedSession::receivedUserInfo(Value userInfo) {
  if (!userInfo.isDictionary()) userInfo = Value();
  bool isChanged = true;
  if (_userInfo.isPresent()) {
    const Dictionary* sessionInfo = _sessionInfo.dictionary();
    const bool isRequired = sessionInfo != nullptr && (*sessionInfo)[kTelvaneSessionInfoRequireUserInfo].booleanValue();
    if (!userInfo.isPresent() && isRequired) return;
    isChanged =
        isNameChanged(userInfo, kTelvaneUserInfoClientName) || isNameChanged(userInfo, kTelvaneUserInfoServiceName);
  } else if (!userInfo.isPresent()) {
    return;
  }
  updateUserInfo(std::move(userInfo));
  updateUserInfoForBackends();
  if (!isChanged) {
    activateHelperOfEnabledBackends();
    return;
  }
  log().message("receivedUserInfo: Received new user info for session {}", _sessionID);
  updateSessionWithDefaultSessionInfo();
}

// The pool may have given the helper up between its release and the new request, and a new one has no URL session yet.
void TelvanedSession::activateHelperOfEnabledBackends() {
  if (!_backends.has_value() || _connectivityHelper == nullptr) return;
  const bool isAnyEnabled = std::any_of(_backends->begin(), _backends->end(), [](const auto& entry) {
    return entry.second->state() == TelvaneBackendStateEnabled;
  });
  if (isAnyEnabled) _connectivityHelper->activate(_connectivityHelperReleaseTimeout);
}

void TelvanedSession::activateHelperIfEnabledByParent() {
  if (_isEnabledByParent.load(std::memory_order_relaxed) && _isEnabledByParent.exchange(false)) {
    activateHelperOfEnabledBackends();
  }
}

void TelvanedSession::updateUserInfoForBackends() {
  if (!_backends.has_value()) return;
  for (const auto& [name, backend] : *_backends) {
    backend->setUserInfoDict(_userInfo);
    if (name != kTelvaneBackendQRS.view()) continue;
    backend->setDigestKey(_digestKey);
    // The session does not keep the algorithm, so a change of user info sets it back to HMAC-SHA1.
    backend->setDigestAlgorithm(0);
  }
}

void TelvanedSession::startConfigWithCompletionHandler(StatesReply completionHandler) {
  log().message("startConfigWithCompletionHandler: Starting configuration for session {}", _sessionID);
  const std::optional<Dictionary> storebag = _sessionDelegate->storebagForSession(*this);
  if (!storebag.has_value()) {
    completionHandler({}, {}, {});
    return;
  }
  if (_backends.has_value()) {
    log().error("startConfigWithCompletionHandler: has been called more than once for session {}", _sessionID);
  } else {
    const std::optional<String> version = _sessionDelegate->storebagVersionForSession(*this);
    _storebagVersion = version.has_value() ? std::optional<Value>(*version) : std::nullopt;
    createBackendsWithStorebag(*storebag);
    updateSessionWithDefaultSessionInfo();
    sendStartMessage();
  }
  replyStates(completionHandler);
}

void TelvanedSession::createBackendsWithStorebag(const Dictionary& storebag) {
  log().message("createBackendsWithStorebag: Creating backends for session {}", _sessionID);
  const Value& releaseTimeout = storebag[kStorebagReleaseTimeout];
  _connectivityHelperReleaseTimeout =
      releaseTimeout.isPresent() ? releaseTimeout.uint32Value() : kDefaultReleaseTimeout;
  // A message without a configured session may come in the midst of one; what that one's backends hold goes out first.
  if (_backends.has_value() && !_backends->empty()) internalFlushMessagesWithCompletion(nullptr);
  std::optional<BackendTable> backends = createBackends(_context, storebag, _sessionInfo, _userInfo, _deviceid);
  if (backends.has_value()) {
    for (const auto& [name, backend] : *backends) {
      backend->setReportingSessionConnectivityDelegate(_connectivityHelper);
      backend->setCombinedSessionIDString(_sessionIDString);
    }
  }
  {
    MonitorLock lock(_sessionDelegate->monitor());
    _backends.swap(backends);
  }
  // What a dashboard of the one before has not acknowledged goes on by itself.
  if (!backends.has_value()) return;
  for (const auto& [name, backend] : *backends) backend->cleanup();
}

void TelvanedSession::updateSessionWithDefaultSessionInfo() {
  if (updateReportingStates() && _connectivityHelper != nullptr) {
    _connectivityHelper->activate(_connectivityHelperReleaseTimeout);
  }
  _sessionDelegate->updateDownstreamSessions(*this);
}

void TelvanedSession::sendStartMessage() {
  const Platform& platform = _context.platform();
  const DeviceAnswers& answers = platform.deviceAnswers;
  Dictionary payload;
  if (_context.isInternalBuild()) {
    payload.set(kEventSerialNum, orUnknown(answers.answer(DeviceAnswers::kSerialNumber)));
    payload.set(kEventVersion, orUnknown(answers.answer(DeviceAnswers::kProductVersion)));
    payload.set(kEventBuildNumber, orUnknown(answers.answer(DeviceAnswers::kBuildVersion)));
    payload.set(kEventHardware, orUnknown(answers.answer(DeviceAnswers::kHWModelStr)));
    payload.set(kEventProduct, orUnknown(answers.answer(DeviceAnswers::kDeviceName)));
    payload.set(kEventReportVersion, _context.clientFrameworkVersion());
  }
  payload.set(kEventLocale, orUnknown(platform.locale.countryCode()));
  const Value automatic = platform.userDefaults.objectForKey(kTimedDefaultsSuite, kDefaultsAutomaticTimeZoneEnabled);
  payload.set(kEventAutomaticTimeSet, Value(!automatic.isPresent() || automatic.booleanValue()));
  internalSendMessage(payload, kSessionMethod, kSessionStart);
}

const std::shared_ptr<TelvaneBackend>* TelvanedSession::backendNamed(std::string_view name) const {
  if (!_backends.has_value()) return nullptr;
  const auto found =
      std::find_if(_backends->begin(), _backends->end(), [name](const auto& entry) { return entry.first == name; });
  return found != _backends->end() ? &found->second : nullptr;
}

void TelvanedSession::setDigestKey(Value digestKey, int32_t algorithm) {
  _digestKey = std::move(digestKey);
  if (const auto* backend = backendNamed(kTelvaneBackendQRS)) {
    (*backend)->setDigestKey(_digestKey);
    (*backend)->setDigestAlgorithm(algorithm);
  }
}

}  // namespace telvane
