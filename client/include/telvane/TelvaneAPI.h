#ifndef TELVANE_API_H
#define TELVANE_API_H

/*
 * Telvane for programs in C: plain functions over a reporting session. Sessions are opened with the functions of
 * <telvane/TelvaneSession.h>; the keys of the dictionaries stand in <telvane/TelvaneConstants.h>.
 *
 * What holds for every function:
 * - A dictionary or an array is a plist_t of libplist. One that is given is borrowed and copied before the call
 * returns; one that a function with New, Create or Copy in its name returns belongs to the caller (plist_free).
 * - A dictionary or an array that cannot be carried (containers in each other more than 64 deep, or a kind of node that
 *   no property list has) fails the call: it returns null or false, or does nothing.
 * - A null session does nothing: the function returns false, or nothing, and no callback is called.
 * - No call waits for the daemon. Callbacks run later, on threads of the library, each with the context that was given
 *   with it; what they are given is borrowed and gone when they return. Those of one session may run beside each other:
 *   the callbacks of its modules (<telvane/TelvaneSession.h>) up to four at a time, and beside any other. A null
 *   callback is never called. A callback of one call is called at most once, and not at all when the daemon can no
 *   longer answer, unless the function says otherwise. The context must stay usable until then.
 * - Everything may be called from any thread, and beside each other, but for TelvaneRelease: it must not run beside
 *   another call with the same session, nor may one follow it, inside callbacks neither. The session's memory is gone
 *   then.
 * - A process needs no event loop, may fork (a child opens sessions of its own; those of its parent are dead there),
 *   and keeps its own signal handling. The library never prints or exits. Its error lines go
 *   to the journal under "libtelvane" (the user default "clientLogLevel" asks for more), on a machine without one
 *   nowhere.
 * - When the process ends, what was sent is still handed to the daemon, for which the end is held up by two seconds at
 *   most; what the daemon has not taken by then is lost. No callback is called any more from then on.
 * - What may wait in this process for the daemon is bounded: 8 MiB of a session's messages, log data and shared data in
 *   its own queue and 24 MiB of its calls in its connection, by estimate. Beyond that the newest is dropped, although
 *   the call that handed it over has returned true; no callback hears of it, only an error line, one for each burst. So
 *   a message of more than 24 MiB never goes, and one of more than 8 MiB only when nothing waits before it.
 */

#include <plist/plist.h>
#include <stdbool.h>
#include <stdint.h>

#define TELVANE_API __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

/* One reporting session. Let go with TelvaneRelease. */
typedef struct TelvaneOpaque* TelvaneRef;

/* An error: a domain, a code and a dictionary of particulars. Let go with TelvaneErrorRelease if it came through a
 * TelvaneErrorRef * of yours; one that a callback is given is borrowed. */
typedef struct TelvaneErrorOpaque* TelvaneErrorRef;

/* Takes the names of the enabled backends, an array of strings; null when the daemon cannot tell. */
typedef void (*TelvaneBackendsCallback)(plist_t backendNames, void* context);

/* Takes a text, NUL-terminated UTF-8. */
typedef void (*TelvaneStringCallback)(const char* text, void* context);

/* Takes an error, null on success. */
typedef void (*TelvaneErrorCallback)(TelvaneErrorRef error, void* context);

/* Takes a message of a session below this one in its hierarchy. client: the sender's session info, may be null;
 * timestamp: seconds since 1970; payload: the message's fields, may be null. Called with zeros and nulls when a session
 * below has ended. */
typedef void (*TelvaneAggregationCallback)(plist_t client, double timestamp, uint16_t category, uint16_t type,
                                           plist_t payload, void* context);

/* Lets the session go: once everything sent before has been answered, the daemon is told to finish it. Returns at
 * once, nothing that waits by then is lost, and callbacks of calls made before may still come. The last call with this
 * session, on whichever thread. */
TELVANE_API void TelvaneRelease(TelvaneRef session);

/* Gives the daemon new user info (a dictionary, may be null), asks for the states that follow from it and keeps them.
 * The callback gets null when the daemon cannot be reached, and before the function returns when the user info cannot
 * be carried. */
TELVANE_API void TelvaneFetchStatesWithUserInfo(TelvaneRef session, plist_t userInfo, TelvaneBackendsCallback callback,
                                                void* context);

/* Sets the callback for the texts that the daemon answers to messages, in place of an earlier one. It may be called as
 * long as the session lives, and until its last answer has come. */
TELVANE_API void TelvaneSetMessageBlock(TelvaneRef session, TelvaneStringCallback callback, void* context);

/* Both return the token of a new hierarchy (parentToken null), or of the level below the parent's, for
 * kTelvaneSessionInfoHierarchyToken; null when the parent is no dictionary or has no token. A parent's token is taken
 * as it is, but one of more than 1024 bytes counts as none: the session opened with it belongs to no hierarchy. The
 * result belongs to the caller. */
TELVANE_API plist_t TelvaneNewHierarchyTokenFromParentToken(plist_t parentToken);
TELVANE_API plist_t TelvaneCreateHierarchyTokenFromParentToken(plist_t parentToken);

/* Adds the dictionary's entries to the data that the sessions of the hierarchy share and that accompanies each event.
 * A hierarchy has room for 1 MiB of it, by estimate: an update that would be more is refused as a whole, and what stood
 * there stays. The caller does not hear of that; the daemon writes an error line, one for each burst. Does nothing for
 * anything but a dictionary. */
TELVANE_API void TelvaneUpdateSharedDataWithDictionary(TelvaneRef session, plist_t sharedData);

/* Sets one entry of it, within the same bound; a null value removes the key. */
TELVANE_API void TelvaneUpdateSharedDataForKey(TelvaneRef session, const char* key, plist_t value);

/* Sends one event. payload: a dictionary, may be null. Of its entries, those that are arrays or dictionaries are posted
 * for client type 28 only (on internal builds for 7, too); for the others the daemon leaves each of them out, with an
 * error line in its log. Returns false for a null session, and for category 0 or a payload that cannot be carried (both
 * code 4); else true, also for an event that the configuration filters out, and for one that finds no room (above).
 * *error, if error is not null, is set to null or to an error that belongs to the caller, of the domain
 * kTelvaneErrorDomain. A null session leaves it as it is: let it be null before the call. */
TELVANE_API bool TelvaneSendMessageWithError(TelvaneRef session, uint16_t category, uint16_t type, plist_t payload,
                                             TelvaneErrorRef* error);

/* Sends one message dictionary. Returns true when it was handed on, also when it finds no room; false with an error
 * when the category (code 7) or the type (7) is missing, the category is 0 (4) or the dictionary cannot be carried (4),
 * and false without one when the configuration filters it out. Anything but a dictionary counts as an empty one. *error
 * as above; its domain is kTelvaneErrorDomain for code 7, too. */
TELVANE_API bool TelvaneSendMessageWithDictionary(TelvaneRef session, plist_t message, TelvaneErrorRef* error);

/* Has the daemon send the events that it holds back for batches. */
TELVANE_API void TelvaneFlushMessages(TelvaneRef session);

/* The same; the callback gets the error with which the flush or the way to the daemon failed, or null. */
TELVANE_API void TelvaneFlushMessagesWithCompletion(TelvaneRef session, TelvaneErrorCallback callback, void* context);

/* Uploads an array of log data dictionaries. Returns false for an empty or null array. */
TELVANE_API bool TelvaneUploadLogWithArray(TelvaneRef session, plist_t logData);

/* Lets an error go; null is fine. */
TELVANE_API void TelvaneErrorRelease(TelvaneErrorRef error);

/* Return the error's domain and its description, which live as long as the error; null for a null error. */
TELVANE_API const char* TelvaneErrorGetDomain(TelvaneErrorRef error);
TELVANE_API const char* TelvaneErrorGetDescription(TelvaneErrorRef error);

/* Returns the error's code, 0 for a null error. */
TELVANE_API int64_t TelvaneErrorGetCode(TelvaneErrorRef error);

/* Returns a dictionary of the error's particulars, with the description under "LocalizedDescription" if there is one.
 * It belongs to the caller; null for a null error. */
TELVANE_API plist_t TelvaneErrorCopyUserInfo(TelvaneErrorRef error);

#ifdef __cplusplus
}
#endif

#endif
