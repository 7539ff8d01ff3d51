#pragma once

#include <string>

#include "foundation/Value.h"

namespace telvane::testing {

// What a client process without the library is to do, step by step: made by the soak, carried out by the program
// telvane-soak-client, which says on standard output what it was answered. It says what the library never does: one
// session's info again with another one in it, and a message without a session whose answer somebody looks at. A step
// is for the connection that was opened last. A value.
class WireScript {
 public:
  // Opens a connection and tells its session info.
  WireScript& open(Dictionary sessionInfo, Dictionary userInfo);
  // Tells the session of that connection another session info.
  WireScript& tellAgain(Dictionary sessionInfo, Dictionary userInfo);
  // "configured: [names]", or "configured: nothing" when there are none or the daemon has ended the connection.
  WireScript& configure();
  WireScript& send(int category, Dictionary payload);
  // "flushed" when the daemon has answered, whatever it says.
  WireScript& flush();
  // On a connection of its own: "one-shot: ANSWER", or "one-shot: nothing". userInfo may be absent.
  WireScript& sendOneShot(Dictionary sessionInfo, Value userInfo, int category, Dictionary payload);
  // Says "waiting" and waits for a line on standard input, or its end.
  WireScript& wait();

  // The property list that the program reads.
  std::string text() const;

  // The program's side. Steps are dictionaries with the step's name under kStep and its arguments under the others.
  static Array parse(const std::string& text);
  static constexpr char kStep[] = "step";
  static constexpr char kSessionInfo[] = "sessionInfo";
  static constexpr char kUserInfo[] = "userInfo";
  static constexpr char kCategory[] = "category";
  static constexpr char kPayload[] = "payload";

 private:
  WireScript& add(const char* name, Dictionary arguments = {});
  Array _steps;
};

}  // namespace telvane::testing
