#include "platform/Dispatch.h"

#include <cstdio>
#include <cstdlib>

namespace telvane {

void SerialQueue::assertOnQueue() const {
  if (isCurrent()) return;
  std::fprintf(stderr, "assertOnQueue: the caller does not run on the queue \"%s\"\n", label().c_str());
  std::abort();
}

}  // namespace telvane
