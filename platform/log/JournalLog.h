#pragma once

#include <string>

#include "foundation/UniqueFunction.h"
#include "platform/Log.h"
#include "platform/log/LineWriter.h"

namespace telvane {

// The log of a service: one entry of the system's journal per message, with the program's name as identifier. Error
// lines have the priority "err", default lines "notice", info lines "info". Writing never waits, even when the journal
// does: see LineWriter. A journal that went away is looked for again with the next lines; until then they are lost.
class JournalLog final : public Log, private LineWriter::Target {
 public:
  // Opens a stream to the journal; returns its descriptor, which then is ours, or a negative number.
  using OpenStream = UniqueFunction<int()>;

  JournalLog(LogLevel leastImportant, const std::string& program);
  JournalLog(LogLevel leastImportant, OpenStream openStream, const LineWriter::Options& options = {});
  ~JournalLog() override;
  void flush() override { _writer.flush(); }

 private:
  // Closes the stream after the writer has ended.
  class Stream {
   public:
    ~Stream() { close(); }
    void close();
    int descriptor = -1;
  };

  void write(LogLevel level, std::string_view message) override;
  int descriptor() override;
  void writingFailed() override { _stream.close(); }
  std::string lineForDropped(uint64_t count) override;

  // Confined to the writer's thread.
  OpenStream _openStream;
  Stream _stream;

  // Synchronised by itself. The last field, so that its thread ends first.
  LineWriter _writer;
};

}  // namespace telvane
