#include "platform/system/FileSizeSignal.h"

#include <signal.h>

namespace telvane {

void takeFileSizeLimitAsError() {
  struct sigaction ignoring {};
  ignoring.sa_handler = SIG_IGN;
  ::sigaction(SIGXFSZ, &ignoring, nullptr);
}

}  // namespace telvane
