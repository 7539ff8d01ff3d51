#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/ipc/Connection.h"

namespace telvane::testing {

// A process of the program telvane_ipc_peer, killed at the latest when this goes.
class PeerProcess {
 public:
  // passed: becomes descriptor 3 of the process, as from a service manager; may be -1.
  explicit PeerProcess(std::vector<std::string> arguments, int passed = -1);
  ~PeerProcess();
  PeerProcess(const PeerProcess&) = delete;
  PeerProcess& operator=(const PeerProcess&) = delete;

  // The next line that it writes; empty at its end or when none comes before the deadline.
  std::string readLine();
  // What it writes until its end.
  std::string readAll();
  void writeLine(const std::string& line);
  void closeInput() { _input = ipc::Descriptor(); }
  void kill();
  // Its exit status, or -1 for any other end.
  int wait();
  static std::string program();

 private:
  bool fill();

  pid_t _process = -1;
  ipc::Descriptor _input;
  ipc::Descriptor _output;
  std::string _read;
};

}  // namespace telvane::testing
