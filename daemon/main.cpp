#include "daemon/TelvanedOptions.h"
#include "daemon/TelvanedProgram.h"
#include "platform/system/Allocator.h"
#include "platform/system/FileSizeSignal.h"
#include "platform/system/TerminationSignals.h"

int main(int argc, char** argv) {
  telvane::keepFreedMemoryForReuse();
  telvane::takeFileSizeLimitAsError();
  telvane::TerminationSignals signals;
  const auto parsed = telvane::parseTelvanedOptions(argc, argv);
  if (const int* status = std::get_if<int>(&parsed)) return *status;
  telvane::runTelvaned(std::get<telvane::TelvanedOptions>(parsed), signals);
}
