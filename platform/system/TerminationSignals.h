#pragma once

#include <memory>

#include "foundation/Error.h"
#include "platform/Dispatch.h"
#include "platform/dispatch/Thread.h"
#include "platform/system/FileDescriptor.h"

namespace telvane {

// Turns SIGTERM and SIGINT into calls on a queue. For programs only, never for the library.
//
// Made by main before any other thread, since a signal goes to whatever thread does not block it; the signals stay
// blocked when this object has ended. One that comes between construction and start is not lost.
class TerminationSignals {
 public:
  // ordinal: 1 for the first signal, 2 for the second, and so on. Signals that come faster than they are read may
  // count once.
  using Handler = UniqueFunction<void(int ordinal)>;

  TerminationSignals();
  TerminationSignals(const TerminationSignals&) = delete;
  TerminationSignals& operator=(const TerminationSignals&) = delete;
  ~TerminationSignals();

  // Calls the handler on the queue for each signal. REQUIRES: called once at most. Error: the system gave no
  // descriptor.
  Result<void> start(std::shared_ptr<SerialQueue> queue, Handler handler);

 private:
  FileDescriptor _stop;  // an eventfd that ends the thread
  Thread _thread;
};

}  // namespace telvane
