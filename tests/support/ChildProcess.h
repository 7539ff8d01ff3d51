#pragma once

#include <sys/types.h>

#include <chrono>
#include <string>
#include <vector>

namespace telvane::testing {

// A program that was started as a process of its own; it is ended with this object.
class ChildProcess {
 public:
  struct Files {
    std::string output;  // gets standard output, from its end on
    std::string errors;  // gets standard error
  };

  // arguments: the program's path first. environment: all of it ("NAME=value"). Standard input is a pipe from here.
  ChildProcess(const std::vector<std::string>& arguments, const std::vector<std::string>& environment,
               const Files& files);
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const noexcept { return _pid; }
  void signal(int number);
  // Stops it, and returns once all its threads stand still. SIGCONT lets it go on.
  void stop();
  // Writes an empty line to its standard input; does nothing when it has ended.
  void writeLine();
  void closeInput();
  bool isRunning();
  // Waits until it has ended, so long at most (it is killed then); returns the exit status, minus the signal's number
  // when a signal ended it.
  int wait(std::chrono::milliseconds patience = std::chrono::seconds(60));

 private:
  pid_t _pid = -1;
  int _input = -1;
  int _status = 0;
};

}  // namespace telvane::testing
