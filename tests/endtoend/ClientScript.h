#pragma once

#include <chrono>
#include <cstdint>
#include <string>

#include "foundation/Value.h"

namespace telvane::testing {

// What a client process is to do, step by step: made by a test, carried out by the program telvane-scripted-client,
// which says on standard output what it was told, one line for each step that is answered. A step is for the session
// that was opened last. Values may be anything, also what no property list holds. A value.
//
//   ClientScript script;
//   script.open(sessionInfo, userInfo).configure().send(21, 1, Dictionary{{Key("n"), 1}}).flush();
class ClientScript {
 public:
  ClientScript& open(Dictionary sessionInfo, Value userInfo = {});
  // Opens a session that takes the messages of those below it: "aggregated: CATEGORY TYPE FROM N" for each, the last
  // two from its payload, and "aggregated: end" when it hears no more. For one of category 21 it then does as told: ""
  // for nothing, "send" (the payload once more under category 30, and a flush), "let go" or "throw".
  ClientScript& openAggregating(Dictionary sessionInfo, Value userInfo, const char* reaction = "");
  // Lets the session go.
  ClientScript& letGo();
  // "configured: [names]", "configured: nothing", or "configured: no answer" after some time or the given one: a
  // session that is one too many is never told.
  ClientScript& configure();
  ClientScript& configure(std::chrono::seconds patience);
  // "states: [names]", or "states: nothing".
  ClientScript& fetchStates(Value userInfo);
  ClientScript& send(uint16_t category, uint16_t type, Value payload = {}, uint32_t flag = 0);
  // Sends so many events with a payload of "from", "n" counted from the first number on, and a "text" of so many bytes.
  ClientScript& sendMany(uint16_t category, const std::string& from, int count, int first = 0, int textSize = 0);
  // "flushed: ok", or "flushed: error CODE TEXT".
  ClientScript& flush();
  // Uploads the file: "handed over: yes" or "no" when the call returns, and for a yes "uploaded: yes" or "no" when the
  // daemon has answered.
  ClientScript& upload(const std::string& path);
  // Uploads the log data: "log data uploaded: yes" or "no" when the daemon has answered.
  ClientScript& uploadLogData(Array logData);
  ClientScript& share(Dictionary sharedData);
  ClientScript& setDigestKey(const std::string& key, int32_t algorithm = 0);
  ClientScript& sendOneShot(Dictionary sessionInfo, Value userInfo, uint16_t category, uint16_t type, Value payload);
  // Says "waiting" and waits for a line on standard input, or its end.
  ClientScript& wait();

  // The property list that the program reads.
  std::string text() const;

  // The program's side. Steps are dictionaries with the step's name under kStep and its arguments under the others.
  static Array parse(const std::string& text);
  static constexpr char kStep[] = "step";
  static constexpr char kSessionInfo[] = "sessionInfo";
  static constexpr char kUserInfo[] = "userInfo";
  static constexpr char kCategory[] = "category";
  static constexpr char kType[] = "type";
  static constexpr char kPayload[] = "payload";
  static constexpr char kFlag[] = "flag";
  static constexpr char kKey[] = "key";
  static constexpr char kAlgorithm[] = "algorithm";
  static constexpr char kReaction[] = "reaction";
  static constexpr char kSeconds[] = "seconds";
  static constexpr char kFrom[] = "from";
  static constexpr char kCount[] = "count";
  static constexpr char kFirst[] = "first";
  static constexpr char kPath[] = "path";
  static constexpr char kTextSize[] = "textSize";

 private:
  ClientScript& add(const char* name, Dictionary arguments = {});
  Array _steps;
};

}  // namespace telvane::testing
