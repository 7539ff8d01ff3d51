/* A shared object that is no adaptor, though it has some of the functions. */
#include "platform/include/telvane/VDRAdaptor.h"

#ifdef CALLS_NOBODY
uint32_t nobodyHasThisFunction(void);
uint32_t TelvaneVDRAdaptorGetVersion(void) { return nobodyHasThisFunction(); }
#else
uint32_t TelvaneVDRAdaptorGetVersion(void) { return TELVANE_VDR_ADAPTOR_VERSION; }
#endif

TelvaneVDRAdaptorRef TelvaneVDRAdaptorCreate(const char* className) {
  (void)className;
  return 0;
}

void TelvaneVDRAdaptorRelease(TelvaneVDRAdaptorRef adaptor) { (void)adaptor; }
