#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/Mutex.h"
#include "platform/dispatch/Condition.h"
#include "platform/dispatch/Thread.h"

namespace telvane {

// Carries lines to a file, pipe, socket or terminal without making their writers wait: they only copy into a buffer,
// from which one thread writes many lines at once. A member of a log, which owns it.
//
// Safe from any thread. Lines keep the order in which append was called and are never mixed up with each other; lines
// of up to 4096 bytes also not with those that other processes write to the same pipe. When the target does not keep up
// and the buffer is full, the oldest lines give way; a line that says how many stands where they are missing.
// The thread starts with the first line, blocks all signals, and sleeps while there is nothing to write.
//
// Letting go of it writes what is left, for at most `flushTime`. The child of a fork must leave it alone.
class LineWriter {
 public:
  // Where the lines go. Called on the writer's thread only; outlives the writer.
  class Target {
   public:
    virtual ~Target() = default;
    // Returns the descriptor to write to, which the target keeps, or -1 when there is none now: the lines are dropped.
    virtual int descriptor() = 0;
    // Takes notice that writing to the descriptor failed for good. What is left of the batch is dropped.
    virtual void writingFailed() = 0;
    // Returns the line, with its line feed, which tells that so many lines are missing.
    virtual std::string lineForDropped(uint64_t count) = 0;
  };

  struct Options {
    size_t maximumBytes = 1u << 20;
    // How long a line waits for others to be written with it.
    std::chrono::milliseconds gatherTime{2};
    std::chrono::milliseconds flushTime{1000};
  };

  LineWriter(Target& target, const Options& options);
  ~LineWriter();
  LineWriter(const LineWriter&) = delete;
  LineWriter& operator=(const LineWriter&) = delete;

  // Adds one line: the prefix as it is, the text, a line feed. In the text "\n" stands for a line feed and "\x1b" or
  // the like for any other control character, which a terminal would act on. Text that would fill the whole buffer is
  // cut.
  void append(std::string_view prefix, std::string_view text);
  // Waits until all lines appended so far have been written, for at most `flushTime`.
  void flush();

 private:
  void addLine(std::string_view prefix, std::string_view text) REQUIRES(_mutex);
  void makeRoom(size_t bytes) REQUIRES(_mutex);
  void startThread() REQUIRES(_mutex);
  void run();
  bool waitForLines() REQUIRES(_mutex);
  void write(std::string_view lines);
  bool waitUntilWritable(int descriptor);
  bool hasToGiveUp();

  // Constant after construction.
  Target& _target;
  const Options _options;

  Mutex _mutex;
  std::string _lines GUARDED_BY(_mutex);
  size_t _start GUARDED_BY(_mutex) = 0;  // of the oldest line in _lines that has not been dropped
  uint64_t _droppedLines GUARDED_BY(_mutex) = 0;
  bool _isAsleep GUARDED_BY(_mutex) = false;
  bool _isWriting GUARDED_BY(_mutex) = false;
  bool _isStopping GUARDED_BY(_mutex) = false;
  std::chrono::steady_clock::time_point _stopDeadline GUARDED_BY(_mutex);
  Condition _changed;
  Thread _thread GUARDED_BY(_mutex);
};

}  // namespace telvane
