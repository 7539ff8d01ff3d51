#pragma once

#include <ostream>
#include <string_view>

#include "platform/Mutex.h"

namespace telvane {

// Writes whole lines from any thread. The streams outlive it.
class Printer {
 public:
  // program: stands before each error line.
  Printer(std::string_view program, std::ostream& output, std::ostream& errors)
      : _program(program), _output(output), _errors(errors) {}

  void line(std::string_view text) {
    MutexLock lock(_mutex);
    _output << text << "\n" << std::flush;
  }
  // Whether all lines so far went out.
  bool hasPrinted() {
    MutexLock lock(_mutex);
    return static_cast<bool>(_output.flush());
  }
  void error(std::string_view text) {
    MutexLock lock(_mutex);
    _errors << _program << ": " << text << "\n" << std::flush;
  }

 private:
  const std::string_view _program;
  Mutex _mutex;
  std::ostream& _output GUARDED_BY(_mutex);
  std::ostream& _errors GUARDED_BY(_mutex);
};

}  // namespace telvane
