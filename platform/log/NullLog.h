#pragma once

#include "platform/Log.h"

namespace telvane {

// Keeps nothing: for a library in a process whose output is not ours.
class NullLog final : public Log {
 public:
  NullLog() noexcept : Log(LogLevel::Error) {}

 private:
  void write(LogLevel, std::string_view) override {}
};

}  // namespace telvane
