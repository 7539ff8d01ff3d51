#pragma once

#include <cstdint>
#include <string>

#include "foundation/Error.h"
#include "foundation/Value.h"

namespace telvane {

// What a command line says of the messages to send. Empty texts were not given.
struct MessageOptions {
  int32_t clientType = 0;
  uint16_t category = 0;
  uint16_t type = 0;
  int32_t flag = 0;
  uint32_t count = 1;
  bool isFlushing = false;
  std::string clientName;
  std::string serviceName;
  std::string payload;      // a JSON object
  std::string sessionInfo;  // a JSON object, laid over the session info that the others make
  std::string userInfo;     // the same for the user info
  std::string digestKey;    // hexadecimal
  std::string uploadFile;

  // User info and session info as a client would hand them over, what was given as JSON on top. A session with user
  // info requires it, so that the gates of the storebag's client entries apply; one that flushes batches. Absent user
  // info is an absent value. These fail on text that is no JSON object.
  Result<Value> makeUserInfo() const;
  Result<Dictionary> makeSessionInfo(int64_t sessionID) const;
  // One message: category, type, flag, and the payload if there is one.
  Result<Dictionary> makeMessage() const;
  // The bytes of the digest key; absent when none was given. Fails on text that is no hexadecimal.
  Result<Value> makeDigestKey() const;
};

}  // namespace telvane
