// An adaptor whose author did not think of exceptions: every function throws, the first ones only when asked for
// something of their own. A message of method 2 ends the thread that brings it.
#include <pthread.h>

#include <cstring>
#include <stdexcept>

#include "platform/include/telvane/VDRAdaptor.h"

namespace {

struct OwnKind {};

int theInstance = 0;

}  // namespace

uint32_t TelvaneVDRAdaptorGetVersion(void) {
#ifdef THROWS_AT_ONCE
  throw std::runtime_error("no version today");
#else
  return TELVANE_VDR_ADAPTOR_VERSION;
#endif
}

TelvaneVDRAdaptorRef TelvaneVDRAdaptorCreate(const char* className) {
  if (std::strcmp(className, "Impossible") == 0) throw std::runtime_error("cannot be made");
  return reinterpret_cast<TelvaneVDRAdaptorRef>(&theInstance);
}

bool TelvaneVDRAdaptorRespondsToSelector(TelvaneVDRAdaptorRef, const char* selector) {
  if (std::strcmp(selector, "unknown") == 0) throw OwnKind();
  return true;
}

void TelvaneVDRAdaptorSendMessage(TelvaneVDRAdaptorRef, uint16_t method, uint16_t, plist_t) {
  if (method == 1) throw OwnKind();
  if (method == 2) ::pthread_exit(nullptr);
  throw std::runtime_error("no service");
}

void TelvaneVDRAdaptorRelease(TelvaneVDRAdaptorRef) { throw std::logic_error("released too often"); }
