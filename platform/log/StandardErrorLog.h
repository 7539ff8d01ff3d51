#pragma once

#include <memory>
#include <string>

#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/log/LineWriter.h"

namespace telvane {

// The log of a program in the foreground: one line per message on standard error,
//
//   2026-11-20T23:17:51.123456Z telvaned[123] <default> message
//
// with a line feed inside the message written as "\n". Made by the entry point. Writing never waits: see LineWriter.
// What was written reaches standard error when the log is let go of, unless that is blocked for a second.
class StandardErrorLog final : public Log, private LineWriter::Target {
 public:
  // program: the name that each line shows. The descriptor is borrowed.
  StandardErrorLog(LogLevel leastImportant, std::string program, std::shared_ptr<const Clock> clock, int descriptor,
                   const LineWriter::Options& options = {});
  void flush() override { _writer.flush(); }

 private:
  void write(LogLevel level, std::string_view message) override;
  int descriptor() override { return _descriptor; }
  void writingFailed() override {}
  std::string lineForDropped(uint64_t count) override;

  // Constant after construction.
  const std::shared_ptr<const Clock> _clock;
  const int _descriptor;
  const std::string _nameAndProcess;  // " telvaned[123] "

  // Synchronised by itself. The last field, so that its thread ends first.
  LineWriter _writer;
};

}  // namespace telvane
