// Messages that are sent without a configured session.
#include "daemon/session/TelvanedSession.h"
#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionEvents.h"
#include "interfaces/SessionKeys.h"

namespace telvane {

void TelvanedSession::sendMessageWithSessionInfo(Dictionary sessionInfo, Value userInfo, uint16_t category,
                                                 uint16_t type, Dictionary payload,
                                                 UniqueFunction<void(String)> reply) {
  {
    MonitorLock lock(_sessionDelegate->monitor());
    _sessionInfo = sessionInfo;
  }
  const bool isOneTooMany = isRefused();
  if (isOneTooMany) reply(fmt::format("Exceeded maximum active reporting session limit for userInfo='{}'", userInfo));
  endIfRefused();
  if (isOneTooMany) return;
  if (!sessionInfo.contains(kTelvaneSessionInfoClientType) || !sessionInfo.contains(kTelvaneSessionInfoSessionID)) {
    log().error("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    reply("Could not retrieve identifiers from sessionInfo");
    return;
  }
  setSessionID(sessionInfo);
  setHierarchyFromSessionInfo();
  _sessionDelegate->updateCorrelatedSessions(*this);
  log().message("sendMessageWithSessionInfo: Sending message with session info for session {}", _sessionID);
  const std::optional<Dictionary> storebag = _sessionDelegate->storebagForSession(*this);
  if (!storebag.has_value()) {
    reply("storebag not available");
    return;
  }
  sendOneMessageWithSessionInfo(sessionInfo, userInfo, *storebag, category, type, payload);
  reply("finished");
}

void TelvanedSession::sendOneMessageWithSessionInfo(const Dictionary& sessionInfo, const Value& userInfo,
                                                    const Dictionary& storebag, uint16_t category, uint16_t type,
                                                    const Dictionary& payload) {
  log().message("sendOneMessageWithSessionInfo: Sending single message with sessionID {}",
                sessionInfo[kTelvaneSessionInfoSessionID].integerValue());
  if (!userInfo.isDictionary()) {
    log().error("sendOneMessageWithSessionInfo: userInfo must be present and valid!!! Aborting method...");
    return;
  }
  fillDeviceID();
  createBackendsWithStorebag(storebag);
  if (!_backends.has_value() || _backends->empty()) {
    log().error("sendOneMessageWithSessionInfo: No backends available to send single message");
    return;
  }
  receivedUserInfo(userInfo);
  const Date now = _context.platform().clock.now();
  for (const auto& [name, backend] : *_backends) {
    backend->updateState();
    backend->setReportingSessionConnectivityDelegate(_connectivityHelper);
    activateHelperOfEnabledBackends();
    if (isDropped(*backend, category, "sendOneMessageWithSessionInfo")) continue;
    sendOneMessageToBackend(*backend, now, category, type, payload);
  }
}

void TelvanedSession::sendOneMessageToBackend(TelvaneBackend& backend, Date timestamp, uint16_t category, uint16_t type,
                                              const Dictionary& payload) {
  Dictionary message = payload;
  if (_context.isInternalBuild()) {
    const auto serialNumber = _context.platform().deviceAnswers.answer(DeviceAnswers::kSerialNumber);
    message.set(kEventSerialNum, serialNumber.has_value() ? Value(*serialNumber) : Value(kUnknown));
  }
  const std::optional<String> result = backend.sendMessage(message, timestamp, category, type, kOrdinaryFlag);
  if (!result.has_value()) return;
  _shared.messageLog.writeToLogFile("[{} -> sendOneMessageWithSessionInfo] {}", backend.name(), *result);
}

}  // namespace telvane
