#ifndef TELVANE_VDR_ADAPTOR_H
#define TELVANE_VDR_ADAPTOR_H

/*
 * What a shared object exports to take events to the wireless-diagnostics service of a device, in C.
 *
 * telvaned hands the events of a session to an adaptor when the session's storebag names the backend "vdr" and its
 * client type is 7, 11 or 13. It looks for the adaptor's shared object at
 *
 *   /System/Library/PrivateFrameworks/Confluxa.framework/Frameworks/ZPHPerformance.framework/ZPHPerformance
 *
 * (with $TELVANE_ROOT in front of it) and asks it for an instance of the class "VDRAdaptor". Export all five functions
 * below; without one of them the object is not used. Each failure is an error line in the daemon's log, and the events
 * are lost; the daemon goes on.
 *
 *   cc -shared -fPIC -o ZPHPerformance adaptor.c $(pkg-config --cflags --libs libplist-2.0)
 *
 * Threads: each session has an instance of its own. Calls for one instance come one at a time, though not always from
 * the same thread; calls for different instances, and of the functions that take none, may come at the same time. A
 * call that does not return holds up its session, and a session that is held up holds up its client's events.
 *
 * Life: the object is loaded with the first session that needs it and stays until the daemon ends, so it may have
 * threads. It runs with the daemon's rights: who may write it, or a folder above it, has these.
 *
 * Failure: no function may end the process, nor the thread that calls it (pthread_exit, pthread_cancel), which ends
 * the process, too: the daemon's threads serve others behind the call. A C++ exception that leaves one of them is
 * caught and logged, and the call counts as refused (no instance, no such selector, event lost). That cannot help where
 * the runtime ends the process before: when an exception leaves a function that is declared noexcept, a thread of the
 * object's own, or the constructor of a static object.
 */

#include <plist/plist.h>
#include <stdbool.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define TELVANE_VDR_EXPORT __attribute__((visibility("default")))

/* The version of what this header describes. It changes when an adaptor that was built before could not be called any
 * more; the daemon takes adaptors of its own version only. */
#define TELVANE_VDR_ADAPTOR_VERSION 1u

/* An instance; what it points to is the adaptor's own affair. */
typedef struct TelvaneVDRAdaptorOpaque* TelvaneVDRAdaptorRef;

/* Returns TELVANE_VDR_ADAPTOR_VERSION. Called first; nothing else is called when the version is another. */
TELVANE_VDR_EXPORT uint32_t TelvaneVDRAdaptorGetVersion(void);

/* Makes an instance of the named class (UTF-8, borrowed). Returns null when there is no such class. The instance is the
 * daemon's until it is given to TelvaneVDRAdaptorRelease. */
TELVANE_VDR_EXPORT TelvaneVDRAdaptorRef TelvaneVDRAdaptorCreate(const char* className);

/* Returns whether the instance takes this kind of message (UTF-8, borrowed). Asked before each message; the only kind
 * today is "sendMessageWithMethod:respCode:dict:", which is TelvaneVDRAdaptorSendMessage. */
TELVANE_VDR_EXPORT bool TelvaneVDRAdaptorRespondsToSelector(TelvaneVDRAdaptorRef adaptor, const char* selector);

/* Takes one event. method and respCode: its category and type. dict: a dictionary with what the client sent, borrowed
 * for the length of the call; copy what is to be kept. */
TELVANE_VDR_EXPORT void TelvaneVDRAdaptorSendMessage(TelvaneVDRAdaptorRef adaptor, uint16_t method, uint16_t respCode,
                                                     plist_t dict);

/* Takes the instance back. Called once for each; nothing is called for it afterwards. */
TELVANE_VDR_EXPORT void TelvaneVDRAdaptorRelease(TelvaneVDRAdaptorRef adaptor);

#ifdef __cplusplus
}
#endif

#endif
