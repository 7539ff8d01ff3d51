#ifndef TELVANE_CONSTANTS_H
#define TELVANE_CONSTANTS_H

/*
 * The texts by which Telvane's dictionaries, backends and errors are known. Each is a NUL-terminated constant that
 * lives as long as the process.
 */

#ifdef __cplusplus
extern "C" {
#endif

#define TELVANE_CONSTANT __attribute__((visibility("default")))

/* The session info, given when a session is opened. */
/* number: 0 switches the session off */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoEnableFlag[];
/* number, 5 to 30: what kind of client this is; required */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoClientType[];
/* number: the client's version */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoClientVersion[];
/* number, unsigned 32-bit: the client's number of the session */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoSessionID[];
/* boolean: whether events may be gathered before they are posted */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoBatchEvent[];
/* boolean: report nothing before user info has come */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoRequireUserInfo[];
/* dictionary: a hierarchy token; one whose identifier has more than 1024 bytes counts as none */
TELVANE_CONSTANT extern const char kTelvaneSessionInfoHierarchyToken[];

/* A hierarchy token, which ties sessions together. Made by TelvaneNewHierarchyTokenFromParentToken. */
/* string: the hierarchy's identifier */
TELVANE_CONSTANT extern const char kTelvaneHierarchyTokenTokenID[];
/* number: 0 at the root, 1 more at each level below */
TELVANE_CONSTANT extern const char kTelvaneHierarchyTokenLevel[];

/* The user info. It is valid with at least one of the two; other entries ride along. */
/* string: the reporting client */
TELVANE_CONSTANT extern const char kTelvaneUserInfoClientName[];
/* string: the service within the client */
TELVANE_CONSTANT extern const char kTelvaneUserInfoServiceName[];

/* A message. */
/* number, unsigned 16-bit, not 0: the event's category; required */
TELVANE_CONSTANT extern const char kTelvaneMessageParametersCategory[];
/* number, unsigned 16-bit: the event's type; required */
TELVANE_CONSTANT extern const char kTelvaneMessageParametersType[];
/* dictionary: the event's fields. Arrays and dictionaries among them are posted for client type 28 only (on internal
 * builds for 7, too); for the others they are left out. */
TELVANE_CONSTANT extern const char kTelvaneMessageParametersPayload[];
/* number: 0 ordinary, 1 real-time, 2 promoting, 3 both, 4 periodic report */
TELVANE_CONSTANT extern const char kTelvaneMessageParametersFlag[];

/* The two parts of a message as the daemon hands it to its backends. */
/* dictionary: the message's payload */
TELVANE_CONSTANT extern const char kTelvaneMessageBlobClientData[];
/* dictionary: the shared data of the session's hierarchy */
TELVANE_CONSTANT extern const char kTelvaneMessageBlobSharedData[];

/* Log data, an element of the array that TelvaneUploadLogWithArray takes. */
/* data or string: what to upload */
TELVANE_CONSTANT extern const char kTelvaneLogDataData[];
/* start of the time that the log covers */
TELVANE_CONSTANT extern const char kTelvaneLogDataStartTime[];
/* its end */
TELVANE_CONSTANT extern const char kTelvaneLogDataEndTime[];

/* The names of backends, as callbacks receive them. */
TELVANE_CONSTANT extern const char kTelvaneBackendDashboard[];
TELVANE_CONSTANT extern const char kTelvaneBackendUploadServer[];
TELVANE_CONSTANT extern const char kTelvaneBackendHTTPPost[];
TELVANE_CONSTANT extern const char kTelvaneBackendHTTPPost2[];
TELVANE_CONSTANT extern const char kTelvaneBackendWattbook[];
TELVANE_CONSTANT extern const char kTelvaneBackendQRS[];
TELVANE_CONSTANT extern const char kTelvaneBackendVDR[];

/* The domain of Telvane's errors. */
TELVANE_CONSTANT extern const char kTelvaneErrorDomain[];

#undef TELVANE_CONSTANT

#ifdef __cplusplus
}
#endif

#endif
