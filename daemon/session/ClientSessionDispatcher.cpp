#include "daemon/session/ClientSessionDispatcher.h"

#include "interfaces/ErrorCoding.h"

namespace telvane {
namespace {

Dictionary dictionaryOrEmpty(Value value) {
  Dictionary* dictionary = value.dictionary();
  return dictionary != nullptr ? std::move(*dictionary) : Dictionary();
}

Array arrayOrEmpty(const Value& value) {
  const Array* array = value.array();
  return array != nullptr ? *array : Array();
}

StatesReply statesReply(ipc::ReplyBlock reply) {
  return [reply = std::move(reply)](Value names, Value whitelist, Value blacklist) mutable {
    if (reply) reply({std::move(names), std::move(whitelist), std::move(blacklist)});
  };
}

template <class T>
UniqueFunction<void(T)> singleReply(ipc::ReplyBlock reply) {
  return [reply = std::move(reply)](T value) mutable {
    if (reply) reply({Value(std::move(value))});
  };
}

// What a backend returned for a message is mostly nothing, which a reply without values says for less.
MessageReply messageReply(ipc::ReplyBlock reply) {
  return [reply = std::move(reply)](Value result) mutable {
    if (reply) reply(result.isPresent() ? Array{std::move(result)} : Array());
  };
}

}  // namespace

ClientSessionDispatcher::ClientSessionDispatcher(Log& log, std::shared_ptr<ClientSessionInterface> session,
                                                 std::shared_ptr<DaemonStatusProvider> status, PeerIdentity client)
    : _log(log), _session(std::move(session)), _status(std::move(status)), _client(std::move(client)) {}

void ClientSessionDispatcher::invoke(ipc::Invocation invocation, ipc::ReplyBlock reply) {
  Array& arguments = invocation.arguments;
  switch (static_cast<ClientSessionOperation>(invocation.operation)) {
    case ClientSessionOperation::SetSessionInfo:
      return _session->setSessionInfo(dictionaryOrEmpty(arguments[0]), arguments[1], arguments[2],
                                      arguments[3].booleanValue());
    case ClientSessionOperation::StartConfig:
      return _session->startConfigWithCompletionHandler(statesReply(std::move(reply)));
    case ClientSessionOperation::FetchStates:
      return _session->fetchStatesWithUserInfo(arguments[0], statesReply(std::move(reply)));
    case ClientSessionOperation::FetchDisplayURL:
      return _session->fetchDisplayURL(singleReply<String>(std::move(reply)));
    case ClientSessionOperation::SendMessageWithDictionary:
      return _session->sendMessageWithDictionary(dictionaryOrEmpty(arguments.take(0)), messageReply(std::move(reply)));
    case ClientSessionOperation::FlushMessages:
      return _session->flushMessagesWithCompletion(
          [reply = std::move(reply)](Value result, std::optional<Error> error) mutable {
            if (reply) reply({std::move(result), errorcoding::encode(error)});
          });
    case ClientSessionOperation::FinishSessionGracefully:
      return _session->finishSessionGracefully();
    case ClientSessionOperation::UploadFileAtPath:
      return invokeUpload(invocation, std::move(reply));
    case ClientSessionOperation::UploadLogData:
      return _session->uploadLogData(arrayOrEmpty(arguments[0]),
                                     [reply = std::move(reply)](bool success, std::optional<Error> error) mutable {
                                       if (reply) reply({Value(success), errorcoding::encode(error)});
                                     });
    case ClientSessionOperation::SendMessageWithSessionInfo:
      return invokeOneMessage(arguments, std::move(reply));
    case ClientSessionOperation::UpdateSharedDataWithDictionary:
      return _session->updateSharedDataWithDictionary(dictionaryOrEmpty(arguments[0]));
    case ClientSessionOperation::UpdateSharedDataForKey:
      if (arguments[0].isString()) _session->updateSharedDataForKey(*arguments[0].string(), arguments[1]);
      return;
    case ClientSessionOperation::SetDigestKey:
      return _session->setDigestKey(arguments[0], arguments[1].int32Value());
    case ClientSessionOperation::DaemonStatus:
      if (reply) reply({Value(_status->daemonStatus())});
      return;
  }
  _log.error("ClientSessionDispatcher(invoke): there is no operation {}", invocation.operation);
}

void ClientSessionDispatcher::invokeUpload(const ipc::Invocation& invocation, ipc::ReplyBlock reply) {
  _session->uploadFileAtPath(invocation.arguments[0].isString() ? *invocation.arguments[0].string() : String(),
                             {invocation.descriptor.get(), _client}, singleReply<bool>(std::move(reply)));
}

void ClientSessionDispatcher::invokeOneMessage(const Array& arguments, ipc::ReplyBlock reply) {
  _session->sendMessageWithSessionInfo(dictionaryOrEmpty(arguments[0]), arguments[1], arguments[2].low16Bits(),
                                       arguments[3].low16Bits(), dictionaryOrEmpty(arguments[4]),
                                       singleReply<String>(std::move(reply)));
}

}  // namespace telvane
