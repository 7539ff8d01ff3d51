#ifndef TELVANE_SESSION_H
#define TELVANE_SESSION_H

/*
 * Opening sessions in C, and periodic metrics. The functions here carry the symbol version TELVANE_PRIVATE: programs
 * that are released together with the library may use them, and a later version may change them.
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

/* Asks a module of this process for its metrics, on a thread of the library: with an empty dictionary, which it fills
 * before it returns and does not free, or with null when it is only to update its state. A tick of the log timer waits
 * for the callbacks that it has called, at most four at a time, and what was called of the session meanwhile waits for
 * the tick. So a callback should be quick, and must not wait for anything that the session brings; it may call every
 * function of this library. What it fills in is a payload: arrays and dictionaries are posted for client type 28
 * only. */
typedef void (*TelvanePeriodicTaskCallback)(plist_t metrics, void* context);

/* Registers a module, behind what was called before, and instead of an earlier one of that number. needToUpdate: call
 * it at ticks that are no report; needToReport: call it for reports. A report goes without a module whose metrics
 * cannot be carried, and an error line tells of it. The context must stay usable until the module is unregistered or
 * replaced, or the session released, and a tick that is then under way is over; see
 * TelvaneUnregisterPeriodTaskForModule. Returns false for a null callback, else true. */
TELVANE_API bool TelvaneRegisterPeriodicTaskForModule(TelvaneRef session, uint32_t module, bool needToUpdate,
                                                      bool needToReport, TelvanePeriodicTaskCallback callback,
                                                      void* context);

/* Takes a module away, behind what was called before, and waits until that is done, if need be for the end of a tick:
 * then its callback does not run and is not called any more, and its context may go (but with a timer whose interval is
 * 0, which does not wait for callbacks). Called inside a module's callback, of whichever session, it returns at once,
 * and the module goes when the tick is over. Returns true, whether there was such a module or not. */
TELVANE_API bool TelvaneUnregisterPeriodTaskForModule(TelvaneRef session, uint32_t module);

/* Starts the log timer, which ticks at once and then every interval, in seconds (0 is a millisecond, and of no use but
 * in tests). A tick that is late for the next one takes its place. Every reportingMultiplier-th tick is a report, all
 * others are updates: with 1 every one, with 0 none. A report in which a module has filled in something is sent as an
 * event with that category and type, real-time, and is filtered like any other. Equal keys of several modules come
 * together: entries of dictionaries in one dictionary, elements of arrays in one array, and of other values the last
 * one stays. Does nothing while there is a timer. */
TELVANE_API void TelvaneStartLogTimerWithInterval(TelvaneRef session, uint32_t interval, uint32_t reportingMultiplier,
                                                  uint16_t category, uint16_t type);

/* Stops the log timer, behind what was called before; no callback is called behind it. A timer is to be stopped before
 * its session is released. One that is not ends then, too, with the tick that is under way. */
TELVANE_API void TelvaneStopLogTimer(TelvaneRef session);

#ifdef __cplusplus
}
#endif

#endif
