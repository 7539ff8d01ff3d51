#include "platform/process/ProcessLifetime.h"

#include <pthread.h>

#include <cstdlib>

namespace telvane {

// Neither can fail for any reason but memory, and then the process has no handler: it forks and ends as if it had none.
void callInForkedChild(void (*handler)()) { static_cast<void>(pthread_atfork(nullptr, nullptr, handler)); }

void callAtExit(void (*handler)()) { static_cast<void>(std::atexit(handler)); }

}  // namespace telvane
