#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace telvane::ipc {

// What bounds a local connection. The defaults are those of a real process; tests take smaller ones.
struct Limits {
  // One batch of calls, and how many batches may be under way: two, so that the receiver has the next one at hand while
  // it answers the last.
  size_t maximumBatchCalls = 64;
  size_t maximumBatchBytes = 256u << 10;
  size_t maximumBatchDescriptors = 8;
  size_t maximumBatchesUnderWay = 2;
  // Calls waiting in this process for the other one; above it the newest is dropped. With the 8 MiB that may wait in
  // the reporting queue of a client's session, a session's events take 32 MiB at most.
  size_t maximumWaitingBytes = 24u << 20;

  // What a peer may do before its connection is ended.
  size_t maximumMessageBytes = 64u << 20;
  size_t maximumValuesPerMessage = 1u << 20;
  size_t maximumIncomingBatches = 16;
  size_t maximumUnansweredCalls = 256u << 10;
  size_t maximumUnreadBytes = 16u << 20;
  // Calls received but not executed; above it the socket is left unread. One batch is always taken.
  size_t maximumUnexecutedBytes = 1u << 20;
  std::chrono::milliseconds openTime{30'000};

  // How long a connection that was let go may take to deliver what was sent; and all of them when the service goes.
  std::chrono::milliseconds lingerTime{30'000};
  std::chrono::milliseconds serviceLingerTime{5'000};
  // Pauses of a listener that has no descriptor left, and of a connect that finds the listener's backlog full.
  std::chrono::milliseconds acceptPause{100};
  std::chrono::milliseconds connectPause{10};
};

// Nesting of values: what the other coders of values admit too.
inline constexpr size_t kMaximumNesting = 64;

}  // namespace telvane::ipc
