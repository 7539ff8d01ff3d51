#ifndef TELVANE_SESSION_H
#define TELVANE_SESSION_H

/*
 * Opening sessions in C. The functions here carry the symbol version TELVANE_PRIVATE: programs that are released
 * together with the library may use them, and a later version may change them.
 */

#include <telvane/TelvaneAPI.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Opens a session. sessionInfo: a dictionary with the client type under kTelvaneSessionInfoClientType (5 to 30) and
 * more as the constants name; 0 under kTelvaneSessionInfoEnableFlag switches the session off. userInfo: a dictionary,
 * may be null. frameworksToCheck: an array of names, may be null. Returns null when the session info is null or its
 * client type is not valid, one of the three cannot be carried, the session is switched off, this process may not reach
 * the daemon, or there are no resources for a connection; that the daemon does not run is no reason. The result belongs
 * to the caller (TelvaneRelease). */
TELVANE_API TelvaneRef TelvaneCreateSession(plist_t sessionInfo, plist_t userInfo, plist_t frameworksToCheck);

/* The same, for a session that takes the messages of the sessions below it in its hierarchy. A null callback gives a
 * session that takes none. */
TELVANE_API TelvaneRef TelvaneCreateSessionWithAggregationBlock(plist_t sessionInfo, plist_t userInfo,
                                                                plist_t frameworksToCheck,
                                                                TelvaneAggregationCallback callback, void* context);

/* Asks the daemon for the session's configuration and keeps its answer, from when on filtered events do not leave this
 * process. The callback is not called when the daemon cannot be reached. */
TELVANE_API void TelvaneStartConfiguration(TelvaneRef session, TelvaneBackendsCallback callback, void* context);

#ifdef __cplusplus
}
#endif

#endif
