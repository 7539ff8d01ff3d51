#pragma once

#include <functional>

#include "interfaces/ClientSessionInterface.h"
#include "platform/ipc/Connection.h"

namespace telvane {

// The daemon's session as its client sees it: turns each operation into a call of the local connection and each answer
// back into what the operation's reply block takes.
//
// Made on the spot for one call, or a few that share an error handler, and let go after it; the connection, given by
// reference, outlives it, not the calls. The error handler is called, on the connection's queue, once for each call
// that can no longer be delivered or answered; the reply block of that call is then dropped without being called.
// Answers of a wrong shape are read leniently: what is missing is absent, false or empty.
class ClientSessionProxy final : public ClientSessionInterface {
 public:
  using ErrorHandler = std::function<void(const Error& error)>;

  // errorHandler may be empty. REQUIRES: connection has been resumed.
  static ClientSessionProxy remoteObjectProxyWithErrorHandler(ipc::Connection& connection, ErrorHandler errorHandler);

  void setSessionInfo(Dictionary sessionInfo, Value userInfo, Value frameworksToCheck,
                      bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(StatesReply completionHandler) override;
  void fetchStatesWithUserInfo(Value userInfo, StatesReply completionHandler) override;
  void fetchDisplayURL(UniqueFunction<void(String)> reply) override;
  void sendMessageWithDictionary(Dictionary message, MessageReply reply) override;
  void flushMessagesWithCompletion(FlushReply completion) override;
  void finishSessionGracefully() override;
  void uploadFileAtPath(String fileURL, ExtensionToken extensionToken,
                        UniqueFunction<void(bool)> completionHandler) override;
  void uploadLogData(Array logData,
                     UniqueFunction<void(bool success, std::optional<Error> error)> completionHandler) override;
  void sendMessageWithSessionInfo(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type,
                                  Dictionary payload, UniqueFunction<void(String status)> reply) override;
  void updateSharedDataWithDictionary(Dictionary sharedData) override;
  void updateSharedDataForKey(String key, Value value) override;
  void setDigestKey(Value digestKey, int32_t algorithm) override;

  // fetchDisplayURL and sendMessageWithSessionInfo for a reply that is told an absent text from an empty one: what is
  // no text is absent.
  void fetchDisplayURLValue(UniqueFunction<void(Value url)> reply);
  void sendMessageForStatusValue(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type,
                                 Dictionary payload, UniqueFunction<void(Value status)> reply);
  // sendMessageWithDictionary for the reply's values as they come, the first of which is the reply: it saves the way of
  // every event an allocation. A message that is dropped because too many wait is not told of one by one; the
  // connection writes one line for all of them.
  void sendMessageForValues(Dictionary message, ipc::ReplyBlock reply);

 private:
  ClientSessionProxy(ipc::Connection& connection, ErrorHandler errorHandler)
      : _connection(connection), _errorHandler(std::move(errorHandler)) {}

  void send(ClientSessionOperation operation, Array arguments);
  void sendWithReply(ClientSessionOperation operation, Array arguments, ipc::ReplyBlock reply);
  ipc::Connection::ErrorHandler errorHandler() const;

  ipc::Connection& _connection;
  const ErrorHandler _errorHandler;
};

}  // namespace telvane
