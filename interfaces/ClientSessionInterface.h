#pragma once

#include <cstdint>
#include <optional>

#include "foundation/Error.h"
#include "foundation/ExtensionToken.h"
#include "foundation/UniqueFunction.h"
#include "foundation/Value.h"

namespace telvane {

inline constexpr char kTelvanedServiceName[] = "com.corvex.telvaned";
inline constexpr char kTelvanedEntitlement[] = "com.corvex.private.telvaned";

// The numbers by which the operations of ClientSessionInterface travel. Fixed: the wire schema documents them.
enum class ClientSessionOperation : uint16_t {
  SetSessionInfo = 1,
  StartConfig = 2,
  FetchStates = 3,
  FetchDisplayURL = 4,
  SendMessageWithDictionary = 5,
  FlushMessages = 6,
  FinishSessionGracefully = 7,
  UploadFileAtPath = 8,
  UploadLogData = 9,
  SendMessageWithSessionInfo = 10,
  UpdateSharedDataWithDictionary = 11,
  UpdateSharedDataForKey = 12,
  SetDigestKey = 13,
  // Beside the session's own operations: what the daemon is and holds, without any event's content.
  DaemonStatus = 32,
};

enum class ClientSessionReplyOperation : uint16_t {
  SendMessageToClient = 1,
};

// The reply of startConfig and fetchStates: names of enabled backends, whitelisted and blacklisted event categories;
// each may be absent.
using StatesReply = UniqueFunction<void(Value enabledBackendNames, Value whitelistedEvents, Value blacklistedEvents)>;
// The reply of sendMessageWithDictionary: what the chosen backend returned, or absent when nothing was sent.
using MessageReply = UniqueFunction<void(Value reply)>;
// The reply of flushMessages: the flushed text or absent, and an error or nothing.
using FlushReply = UniqueFunction<void(Value result, std::optional<Error> error)>;

// What a client may ask of its session in the daemon. Every call is one-way; a reply, where there is one, comes through
// the block given last. Calls of one connection come one at a time, in the order in which they were made.
class ClientSessionInterface {
 public:
  virtual ~ClientSessionInterface() = default;
  virtual void setSessionInfo(Dictionary sessionInfo, Value userInfo, Value frameworksToCheck,
                              bool hasAggregationBlock) = 0;
  virtual void startConfigWithCompletionHandler(StatesReply completionHandler) = 0;
  virtual void fetchStatesWithUserInfo(Value userInfo, StatesReply completionHandler) = 0;
  virtual void fetchDisplayURL(UniqueFunction<void(String)> reply) = 0;
  virtual void sendMessageWithDictionary(Dictionary message, MessageReply reply) = 0;
  virtual void flushMessagesWithCompletion(FlushReply completion) = 0;
  virtual void finishSessionGracefully() = 0;
  // extensionToken: borrowed for the length of the call; from a client, its descriptor is given away with it.
  virtual void uploadFileAtPath(String fileURL, ExtensionToken extensionToken,
                                UniqueFunction<void(bool)> completionHandler) = 0;
  virtual void uploadLogData(Array logData,
                             UniqueFunction<void(bool success, std::optional<Error> error)> completionHandler) = 0;
  virtual void sendMessageWithSessionInfo(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type,
                                          Dictionary payload, UniqueFunction<void(String status)> reply) = 0;
  virtual void updateSharedDataWithDictionary(Dictionary sharedData) = 0;
  // An absent value removes the key.
  virtual void updateSharedDataForKey(String key, Value value) = 0;
  virtual void setDigestKey(Value digestKey, int32_t algorithm) = 0;
};

// What the daemon may ask of a client that registered an aggregation block.
class ClientSessionReplyInterface {
 public:
  virtual ~ClientSessionReplyInterface() = default;
  // client: the sending session's session info; timestamp: seconds since 1970; payload: the message's payload with the
  // sending session's user info added, or absent. Category 0, type 0, timestamp 0 and nothing else says that
  // aggregation for this session has ended.
  virtual void sendMessageToClient(Value client, double timestamp, uint16_t category, uint16_t type, Value payload) = 0;
};

}  // namespace telvane
