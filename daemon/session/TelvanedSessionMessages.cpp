// The road of a message through a session: aggregation, backends, flushes, uploads, shared data.
#include "daemon/session/TelvanedSession.h"
#include "interfaces/BackendNames.h"
#include "interfaces/FileURL.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/TelvaneErrors.h"

namespace telvane {
namespace {

constexpr char kNoBackends[] = "No backends available to send message";

bool isHTTPSPostName(std::string_view name) {
  return name == kTelvaneBackendHTTPPost2.view() || name.find(kTelvaneBackendHTTPPost.view()) != std::string_view::npos;
}

// A URL is one word of one line: what would break the line is written as URLs write it.
std::string withoutControlCharacters(std::string_view url) {
  std::string text;
  text.reserve(url.size());
  for (const char character : url) {
    const auto byte = static_cast<unsigned char>(character);
    constexpr unsigned char kFirstPrintable = 0x20;
    constexpr unsigned char kDelete = 0x7f;
    if (byte < kFirstPrintable || byte == kDelete) {
      fmt::format_to(std::back_inserter(text), "%{:02X}", byte);
    } else {
      text += character;
    }
  }
  return text;
}

// One flush over several backends: the caller hears once, at the first error or when the last one is done.
struct FlushCountdown {
  size_t backendsLeft;
  FlushReply completion;
};

}  // namespace

void TelvanedSession::sendMessageWithDictionary(Dictionary message, MessageReply reply) {
  log().message("sendMessageWithDictionary: Sending message for session {}", _sessionID);
  Value result = sendMessageToBackends(std::move(message));
  if (reply) reply(std::move(result));
}

Value TelvanedSession::sendMessageToBackends(Dictionary message) {
  if (!_backends.has_value() || _backends->empty()) {
    log().message("sendMessageWithDictionary: No backends available to send message");
    return {};
  }
  const Value& categoryValue = message[kTelvaneMessageParametersCategory];
  const Value& typeValue = message[kTelvaneMessageParametersType];
  if (!categoryValue.isPresent() || !typeValue.isPresent()) {
    log().message("sendMessageWithDictionary: Missing mandatory parameter '{}'",
                  categoryValue.isPresent() ? "type" : "category");
    return {};
  }
  activateHelperIfEnabledByParent();
  const uint16_t category = categoryValue.low16Bits();
  const uint16_t type = typeValue.low16Bits();
  const uint32_t flag = message[kTelvaneMessageParametersFlag].uint32Value();
  Value payload = message.take(kTelvaneMessageParametersPayload);
  // A payload of another kind than the one agreed counts as none.
  if (!payload.isDictionary()) payload = {};
  const Date now = _context.platform().clock.now();
  aggregateMessage(now.secondsSince1970(), category, type, payload);

  Dictionary blob = messageBlob(std::move(payload));
  size_t backendsLeft = _backends->size();
  Value chosen;
  for (const auto& [name, backend] : *_backends) {
    --backendsLeft;
    if (isDropped(*backend, category, "sendMessageWithDictionary")) continue;
    // The last one, which is most often the only one, may have the payload for its own.
    std::optional<String> result =
        backend->sendMessage(backendsLeft == 0 ? std::move(blob) : blob, now, category, type, flag);
    if (!result.has_value()) continue;
    _shared.messageLog.writeToLogFile("[{} -> sendMessageWithDictionary] {}", name, *result);
    if (isHTTPSPostName(name) || (name == kTelvaneBackendDashboard.view() && !chosen.isPresent())) {
      chosen = Value(*std::move(result));
    }
  }
  return chosen;
}

bool TelvanedSession::isDropped(const TelvaneBackend& backend, uint16_t category, std::string_view operation) const {
  if (!backend.isWhitelistedEvent(category)) {
    log().message("{}: Dropping event with category {} as it is not whitelisted for backend {}", operation, category,
                  backend.name());
    return true;
  }
  if (backend.isBlacklistedEvent(category)) {
    log().message("{}: Dropping event with category {} as it is blacklisted for backend {}", operation, category,
                  backend.name());
    return true;
  }
  return false;
}

Dictionary TelvanedSession::messageBlob(Value payload) {
  Dictionary blob;
  // Without a hierarchy there is nothing shared, and no lock to take for it.
  if (_hierarchyDictionary.has_value()) {
    MonitorLock lock(_sessionDelegate->monitor());
    if (std::optional<Dictionary> sharedData = _sessionDelegate->sharedDataForSession(*this)) {
      blob.set(kTelvaneMessageBlobSharedData, *std::move(sharedData));
    }
  }
  if (payload.isPresent()) blob.set(kTelvaneMessageBlobClientData, std::move(payload));
  return blob;
}

void TelvanedSession::internalSendMessage(const Value& payload, uint16_t method, uint16_t respCode) {
  Dictionary message{{kTelvaneMessageParametersCategory, method}, {kTelvaneMessageParametersType, respCode}};
  message.set(kTelvaneMessageParametersPayload, payload);
  message.set(kTelvaneMessageParametersFlag, Value(kOrdinaryFlag));
  sendMessageToBackends(std::move(message));
  log().message("internalSendMessage: Sent internal message (method:{} respCode:{})", method, respCode);
}

void TelvanedSession::aggregateMessage(double timestamp, uint16_t category, uint16_t type, const Value& payload) {
  // Neither an ancestor nor an own aggregator: the usual case costs no lock and no copy.
  if (!_hierarchyDictionary.has_value() && !_hasAggregator) return;
  {
    MonitorLock lock(_sessionDelegate->monitor());
    if (TelvanedSession* ancestor = _sessionDelegate->getAncestorWithAggregatorForSession(*this)) {
      ancestor->sendToAggregator(_sessionInfo, timestamp, category, type, withUserInfo(payload));
      return;
    }
  }
  if (_hasAggregator) sendToAggregator(_sessionInfo, timestamp, category, type, withUserInfo(payload));
}

Value TelvanedSession::withUserInfo(const Value& payload) const {
  const Dictionary* fields = payload.dictionary();
  if (fields == nullptr) return {};
  Dictionary copy = *fields;
  if (const Dictionary* userInfo = _userInfo.dictionary()) copy.addEntriesFrom(*userInfo);
  return copy;
}

void TelvanedSession::sendToAggregator(const Value& sessionInfo, double timestamp, uint16_t category, uint16_t type,
                                       const Value& payload) {
  std::shared_ptr<ipc::Connection> connection;
  {
    MutexLock lock(_connectionLock);
    connection = _connection;
  }
  if (connection == nullptr) return;
  ipc::Invocation invocation;
  invocation.operation = static_cast<uint16_t>(ClientSessionReplyOperation::SendMessageToClient);
  invocation.arguments = {sessionInfo, Value(timestamp), Value(category), Value(type), payload};
  // A client that does not read loses the newest; a notice and a log line for each would cost more than the message.
  invocation.isDroppedSilently = true;
  connection->send(std::move(invocation), [&log = log()](const Error& error) {
    log.message("sendMessageWithDictionary: Failed to get remote object proxy: {}", error);
  });
}

void TelvanedSession::shutdownSessionAggregation() {
  log().message("shutdownSessionAggregation: Disable aggregation module for session {}", _sessionID);
  if (_hasAggregator.exchange(false)) sendToAggregator({}, 0.0, 0, 0, {});
}

void TelvanedSession::flushMessagesWithCompletion(FlushReply completion) {
  log().message("flushMessagesWithCompletion: Flushing messages for session {}", _sessionID);
  internalFlushMessagesWithCompletion(std::move(completion));
}

void TelvanedSession::internalFlushMessagesWithCompletion(FlushReply completion) {
  if (!_backends.has_value() || _backends->empty()) {
    log().message("internalFlushMessagesWithCompletion: {}", kNoBackends);
    if (completion) completion({}, makeTelvaneError(kNoBackends, static_cast<int64_t>(TelvaneErrorCode::Failure)));
    return;
  }
  activateHelperIfEnabledByParent();
  const auto countdown = std::make_shared<FlushCountdown>(FlushCountdown{_backends->size(), std::move(completion)});
  for (const auto& [name, backend] : *_backends) {
    backend->flushMessagesWithCompletion([&log = log(), &shared = _shared, countdown, name = name](
                                             std::optional<String> result, std::optional<Error> error) {
      log.message("internalFlushMessagesWithCompletion: {}", name);
      if (result.has_value()) shared.messageLog.writeToLogFile("[{} -> flushMessages] {}", name, *result);
      FlushReply reply;
      {
        MutexLock lock(shared.flushLock);
        --countdown->backendsLeft;
        if (error.has_value() || countdown->backendsLeft == 0) reply = std::exchange(countdown->completion, nullptr);
      }
      if (reply) reply(result.has_value() ? Value(*std::move(result)) : Value(), std::move(error));
    });
  }
}

void TelvanedSession::uploadFileAtPath(String fileURL, ExtensionToken extensionToken,
                                       UniqueFunction<void(bool)> completionHandler) {
  log().message("uploadFileAtPath: Uploading file for session {}", _sessionID);
  const std::string path = pathOfFileURL(fileURL);
  bool success = false;
  if (_backends.has_value()) {
    for (const auto& [name, backend] : *_backends) {
      if (backend->uploadFileAtPath(path, extensionToken)) success = true;
    }
  }
  if (success) {
    log().message("uploadFileWithURL: File upload successful for {}", path);
  } else {
    log().error("uploadFileWithURL: File upload failed for {}", path);
  }
  _shared.messageLog.writeToLogFile("[uploadFileWithURL] Upload {} for file {}", success ? "succeeded" : "failed",
                                    withoutControlCharacters(fileURL));
  if (completionHandler) completionHandler(success);
}

void TelvanedSession::uploadLogData(Array logData, UniqueFunction<void(bool, std::optional<Error>)> completionHandler) {
  bool success = false;
  if (_backends.has_value()) {
    for (const auto& [name, backend] : *_backends) {
      if (backend->uploadLogData(logData)) success = true;
    }
  }
  if (success) {
    log().message("uploadLogData: Log data array upload successful");
  } else {
    log().error("uploadLogData: Log data array upload failed");
  }
  if (completionHandler) completionHandler(success, std::nullopt);
}

void TelvanedSession::updateSharedDataWithDictionary(Dictionary sharedData) {
  MonitorLock lock(_sessionDelegate->monitor());
  _sessionDelegate->updateSharedDataForSession(*this, sharedData);
}

void TelvanedSession::updateSharedDataForKey(String key, Value value) {
  MonitorLock lock(_sessionDelegate->monitor());
  if (!value.isPresent()) {
    _sessionDelegate->removeObjectFromSharedDataForSession(*this, key);
    return;
  }
  Dictionary entry;
  entry.set(key, std::move(value));
  _sessionDelegate->updateSharedDataForSession(*this, entry);
}

}  // namespace telvane
