#include "client/ClientSessionProxy.h"

#include "interfaces/ErrorCoding.h"

namespace telvane {
namespace {

ipc::Invocation invocation(ClientSessionOperation operation, Array arguments) {
  return {static_cast<uint16_t>(operation), std::move(arguments), {}};
}

Value stringOrAbsent(const Value& value) { return value.isString() ? value : Value(); }

ipc::ReplyBlock statesReply(StatesReply reply) {
  return [reply = std::move(reply)](Array values) mutable { reply(values[0], values[1], values[2]); };
}

ipc::ReplyBlock stringReply(UniqueFunction<void(Value)> reply) {
  return [reply = std::move(reply)](Array values) mutable { reply(stringOrAbsent(values[0])); };
}

UniqueFunction<void(Value)> orEmpty(UniqueFunction<void(String)> reply) {
  return [reply = std::move(reply)](const Value& text) mutable { reply(text.isString() ? *text.string() : String()); };
}

}  // namespace

ClientSessionProxy ClientSessionProxy::remoteObjectProxyWithErrorHandler(ipc::Connection& connection,
                                                                         ErrorHandler errorHandler) {
  return {connection, std::move(errorHandler)};
}

void ClientSessionProxy::setSessionInfo(Dictionary sessionInfo, Value userInfo, Value frameworksToCheck,
                                        bool hasAggregationBlock) {
  send(ClientSessionOperation::SetSessionInfo,
       {std::move(sessionInfo), std::move(userInfo), std::move(frameworksToCheck), hasAggregationBlock});
}

void ClientSessionProxy::startConfigWithCompletionHandler(StatesReply completionHandler) {
  sendWithReply(ClientSessionOperation::StartConfig, {}, statesReply(std::move(completionHandler)));
}

void ClientSessionProxy::fetchStatesWithUserInfo(Value userInfo, StatesReply completionHandler) {
  sendWithReply(ClientSessionOperation::FetchStates, {std::move(userInfo)}, statesReply(std::move(completionHandler)));
}

void ClientSessionProxy::fetchDisplayURL(UniqueFunction<void(String)> reply) {
  fetchDisplayURLValue(orEmpty(std::move(reply)));
}

void ClientSessionProxy::fetchDisplayURLValue(UniqueFunction<void(Value)> reply) {
  sendWithReply(ClientSessionOperation::FetchDisplayURL, {}, stringReply(std::move(reply)));
}

void ClientSessionProxy::sendMessageWithDictionary(Dictionary message, MessageReply reply) {
  sendMessageForValues(std::move(message), [reply = std::move(reply)](Array values) mutable { reply(values[0]); });
}

void ClientSessionProxy::sendMessageForValues(Dictionary message, ipc::ReplyBlock reply) {
  Array arguments;
  arguments.append(std::move(message));
  ipc::Invocation call = invocation(ClientSessionOperation::SendMessageWithDictionary, std::move(arguments));
  call.isDroppedSilently = true;
  _connection.sendWithReply(std::move(call), std::move(reply), errorHandler());
}

void ClientSessionProxy::flushMessagesWithCompletion(FlushReply completion) {
  sendWithReply(ClientSessionOperation::FlushMessages, {}, [completion = std::move(completion)](Array values) mutable {
    completion(values[0], errorcoding::decode(values[1]));
  });
}

void ClientSessionProxy::finishSessionGracefully() { send(ClientSessionOperation::FinishSessionGracefully, {}); }

void ClientSessionProxy::uploadFileAtPath(String fileURL, ExtensionToken extensionToken,
                                          UniqueFunction<void(bool)> completionHandler) {
  ipc::Invocation call = invocation(ClientSessionOperation::UploadFileAtPath, {std::move(fileURL)});
  call.descriptor = ipc::Descriptor(extensionToken.descriptor);
  _connection.sendWithReply(
      std::move(call),
      [completionHandler = std::move(completionHandler)](Array values) mutable {
        completionHandler(values[0].booleanValue());
      },
      errorHandler());
}

void ClientSessionProxy::uploadLogData(
    Array logData, UniqueFunction<void(bool success, std::optional<Error> error)> completionHandler) {
  sendWithReply(ClientSessionOperation::UploadLogData, Array{std::move(logData)},
                [completionHandler = std::move(completionHandler)](Array values) mutable {
                  completionHandler(values[0].booleanValue(), errorcoding::decode(values[1]));
                });
}

void ClientSessionProxy::sendMessageWithSessionInfo(Dictionary sessionInfo, Value userInfo, uint16_t category,
                                                    uint16_t type, Dictionary payload,
                                                    UniqueFunction<void(String status)> reply) {
  sendMessageForStatusValue(std::move(sessionInfo), std::move(userInfo), category, type, std::move(payload),
                            orEmpty(std::move(reply)));
}

void ClientSessionProxy::sendMessageForStatusValue(Dictionary sessionInfo, Value userInfo, uint16_t category,
                                                   uint16_t type, Dictionary payload,
                                                   UniqueFunction<void(Value status)> reply) {
  sendWithReply(ClientSessionOperation::SendMessageWithSessionInfo,
                {std::move(sessionInfo), std::move(userInfo), category, type, std::move(payload)},
                stringReply(std::move(reply)));
}

void ClientSessionProxy::updateSharedDataWithDictionary(Dictionary sharedData) {
  send(ClientSessionOperation::UpdateSharedDataWithDictionary, {std::move(sharedData)});
}

void ClientSessionProxy::updateSharedDataForKey(String key, Value value) {
  send(ClientSessionOperation::UpdateSharedDataForKey, {std::move(key), std::move(value)});
}

void ClientSessionProxy::setDigestKey(Value digestKey, int32_t algorithm) {
  send(ClientSessionOperation::SetDigestKey, {std::move(digestKey), algorithm});
}

void ClientSessionProxy::send(ClientSessionOperation operation, Array arguments) {
  _connection.send(invocation(operation, std::move(arguments)), errorHandler());
}

void ClientSessionProxy::sendWithReply(ClientSessionOperation operation, Array arguments, ipc::ReplyBlock reply) {
  _connection.sendWithReply(invocation(operation, std::move(arguments)), std::move(reply), errorHandler());
}

ipc::Connection::ErrorHandler ClientSessionProxy::errorHandler() const {
  if (!_errorHandler) return {};
  return _errorHandler;
}

}  // namespace telvane
