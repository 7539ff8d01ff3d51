#include "platform/log/LineWriter.h"

#include <fmt/format.h>
#include <limits.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "platform/dispatch/Deadline.h"

namespace telvane {

namespace {

// A pipe that is writable takes this much without blocking, and in one piece.
constexpr size_t kPipeChunk = PIPE_BUF;
constexpr size_t kFileChunk = 64u << 10;

size_t chunkSizeFor(int descriptor) {
  struct stat status;
  return fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode) ? kFileChunk : kPipeChunk;
}

constexpr unsigned char kFirstOfTwoByteControl = 0xC2;

bool mayBeControl(char byte) {
  const auto value = static_cast<unsigned char>(byte);
  return value < 0x20 || value == 0x7F || value == kFirstOfTwoByteControl;
}

// The number of bytes of the control character that the text begins with; 0 when it begins with none. U+0080 to U+009F
// are controls too, of two bytes in UTF-8.
size_t controlAtStart(std::string_view text) {
  if (!mayBeControl(text.front())) return 0;
  if (static_cast<unsigned char>(text.front()) != kFirstOfTwoByteControl) return 1;
  const auto second = text.size() > 1 ? static_cast<unsigned char>(text[1]) : 0;
  return second >= 0x80 && second < 0xA0 ? 2 : 0;
}

std::string withoutControls(std::string_view text) {
  std::string escaped;
  while (!text.empty()) {
    const size_t control = controlAtStart(text);
    if (text.front() == '\n') {
      escaped.append("\\n");
    } else if (control != 0) {
      escaped += fmt::format("\\x{:02x}", static_cast<unsigned char>(text[control - 1]));
    } else {
      escaped.push_back(text.front());
    }
    text.remove_prefix(std::max<size_t>(control, 1));
  }
  return escaped;
}

// Returns the size of the first piece to write: whole lines if one fits.
size_t firstPiece(std::string_view lines, size_t chunk) {
  if (lines.size() <= chunk) return lines.size();
  const size_t lastLineFeed = lines.rfind('\n', chunk - 1);
  return lastLineFeed == std::string_view::npos ? chunk : lastLineFeed + 1;
}

}  // namespace

LineWriter::LineWriter(Target& target, const Options& options) : _target(target), _options(options) {}

LineWriter::~LineWriter() {
  Thread thread;
  {
    MutexLock lock(_mutex);
    _isStopping = true;
    _stopDeadline = deadlineAfter(_options.flushTime);
    thread = std::move(_thread);
    _changed.notifyAll();
  }
  thread.join();
}

void LineWriter::append(std::string_view prefix, std::string_view text) {
  std::string escaped;
  if (std::any_of(text.begin(), text.end(), mayBeControl)) {
    text = escaped = withoutControls(text.substr(0, _options.maximumBytes));
  }
  bool mustWake;
  {
    MutexLock lock(_mutex);
    addLine(prefix, text);
    startThread();
    mustWake = _isAsleep;
    _isAsleep = false;
  }
  if (mustWake) _changed.notifyOne();
}

void LineWriter::addLine(std::string_view prefix, std::string_view text) {
  const size_t roomForText = _options.maximumBytes - std::min(_options.maximumBytes, prefix.size() + 1);
  if (text.size() > roomForText) text = text.substr(0, roomForText);
  makeRoom(prefix.size() + text.size() + 1);
  _lines.append(prefix).append(text).push_back('\n');
}

void LineWriter::makeRoom(size_t bytes) {
  while (_start < _lines.size() && _lines.size() - _start + bytes > _options.maximumBytes) {
    _start = _lines.find('\n', _start) + 1;
    ++_droppedLines;
  }
  // What has been dropped is removed once it is half of the buffer, so that each byte moves at most once.
  if (_start * 2 < _lines.size()) return;
  _lines.erase(0, _start);
  _start = 0;
}

void LineWriter::startThread() {
  if (_thread.isStarted()) return;
  try {
    _thread = Thread("telvane-log", [this] { run(); });
  } catch (const std::system_error&) {
    // No thread left now: the next line tries again, this one waits in the buffer.
  }
}

void LineWriter::run() {
  std::string batch;
  MutexLock lock(_mutex);
  while (waitForLines()) {
    batch.clear();
    batch.swap(_lines);
    const std::string_view lines = std::string_view(batch).substr(_start);
    _start = 0;
    const uint64_t dropped = std::exchange(_droppedLines, 0);
    _isWriting = true;
    _mutex.unlock();
    if (dropped != 0) write(_target.lineForDropped(dropped));
    write(lines);
    _mutex.lock();
    _isWriting = false;
    _changed.notifyAll();
  }
}

void LineWriter::flush() {
  const auto deadline = deadlineAfter(_options.flushTime);
  MutexLock lock(_mutex);
  while ((_isWriting || !_lines.empty()) && std::chrono::steady_clock::now() < deadline) {
    _changed.waitUntil(_mutex, deadline);
  }
}

// Returns false when nothing is left and nothing more will come.
bool LineWriter::waitForLines() {
  while (_lines.empty() && !_isStopping) {
    _isAsleep = true;
    _changed.wait(_mutex);
  }
  _isAsleep = false;
  const auto gathered = deadlineAfter(_options.gatherTime);
  while (!_isStopping && _changed.waitUntil(_mutex, gathered)) {
  }
  return !_lines.empty();
}

void LineWriter::write(std::string_view lines) {
  const int descriptor = _target.descriptor();
  if (descriptor < 0) return;
  const size_t chunk = chunkSizeFor(descriptor);
  while (!lines.empty()) {
    if (hasToGiveUp() || !waitUntilWritable(descriptor)) return;
    const ssize_t written = ::write(descriptor, lines.data(), firstPiece(lines, chunk));
    if (written >= 0) {
      lines.remove_prefix(static_cast<size_t>(written));
    } else if (errno != EINTR && errno != EAGAIN) {
      return _target.writingFailed();
    }
  }
}

// Returns false when the process must not wait any longer.
bool LineWriter::waitUntilWritable(int descriptor) {
  constexpr int kStepMilliseconds = 50;  // how long a blocked target can hold up noticing the end
  pollfd writable{descriptor, POLLOUT, 0};
  while (poll(&writable, 1, kStepMilliseconds) <= 0) {
    if (hasToGiveUp()) return false;
  }
  return true;
}

bool LineWriter::hasToGiveUp() {
  MutexLock lock(_mutex);
  return _isStopping && std::chrono::steady_clock::now() >= _stopDeadline;
}

}  // namespace telvane
