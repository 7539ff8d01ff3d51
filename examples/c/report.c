/*
 * Reports a few events from a C program: opens a session, asks for its configuration, sends, flushes, lets go.
 *
 *   report-c [CLIENT-TYPE]        a number from 5 to 30, 7 when it is left out
 *
 * Exits with 0 when the daemon has taken everything, with 1 when it could not be reached, with 2 on wrong usage.
 */

#include <plist/plist.h>
#include <pthread.h>
#include <stdio.h>
#include <stdlib.h>
#include <telvane/TelvaneAPI.h>
#include <telvane/TelvaneConstants.h>
#include <telvane/TelvaneSession.h>
#include <time.h>

enum { kEventCount = 5, kPatienceSeconds = 30 };

/* What the callbacks, which run on threads of the library, tell the main thread. */
struct Progress {
  pthread_mutex_t mutex;
  pthread_cond_t changed;
  bool is_configured;
  bool is_flushed;
  bool has_failed;
};

static struct Progress progress = {PTHREAD_MUTEX_INITIALIZER, PTHREAD_COND_INITIALIZER, false, false, false};

static void note(bool* what) {
  pthread_mutex_lock(&progress.mutex);
  *what = true;
  pthread_cond_broadcast(&progress.changed);
  pthread_mutex_unlock(&progress.mutex);
}

/* Returns false when it has not happened within kPatienceSeconds. */
static bool wait_for(const bool* what) {
  struct timespec deadline;
  clock_gettime(CLOCK_REALTIME, &deadline);
  deadline.tv_sec += kPatienceSeconds;
  pthread_mutex_lock(&progress.mutex);
  int status = 0;
  while (!*what && status == 0) status = pthread_cond_timedwait(&progress.changed, &progress.mutex, &deadline);
  const bool has_happened = *what;
  pthread_mutex_unlock(&progress.mutex);
  return has_happened;
}

static void did_configure(plist_t backend_names, void* context) {
  (void)context;
  const uint32_t count = backend_names != NULL ? plist_array_get_size(backend_names) : 0;
  printf("configured: %u enabled backends\n", count);
  for (uint32_t i = 0; i < count; ++i) {
    char* name = NULL;
    plist_get_string_val(plist_array_get_item(backend_names, i), &name);
    printf("  %s\n", name);
    free(name);
  }
  note(&progress.is_configured);
}

static void did_answer(const char* text, void* context) {
  (void)context;
  printf("the daemon says: %s\n", text);
}

static void did_flush(TelvaneErrorRef error, void* context) {
  (void)context;
  if (error != NULL) {
    printf("flush failed: %s\n", TelvaneErrorGetDescription(error));
    progress.has_failed = true; /* read only after is_flushed */
  } else {
    printf("flushed\n");
  }
  note(&progress.is_flushed);
}

static TelvaneRef open_session(uint64_t client_type) {
  plist_t session_info = plist_new_dict();
  plist_dict_set_item(session_info, kTelvaneSessionInfoClientType, plist_new_uint(client_type));
  plist_dict_set_item(session_info, kTelvaneSessionInfoSessionID, plist_new_uint(1));
  plist_dict_set_item(session_info, kTelvaneSessionInfoClientVersion, plist_new_uint(3));
  plist_dict_set_item(session_info, kTelvaneSessionInfoBatchEvent, plist_new_bool(1));
  plist_t user_info = plist_new_dict();
  plist_dict_set_item(user_info, kTelvaneUserInfoClientName, plist_new_string("example-c"));
  plist_dict_set_item(user_info, kTelvaneUserInfoServiceName, plist_new_string("demo"));
  TelvaneRef session = TelvaneCreateSession(session_info, user_info, NULL);
  plist_free(user_info);
  plist_free(session_info);
  return session;
}

static bool send_event(TelvaneRef session, unsigned number) {
  plist_t payload = plist_new_dict();
  plist_dict_set_item(payload, "frame", plist_new_uint(number));
  plist_dict_set_item(payload, "quality", plist_new_real(0.25 * number));
  plist_dict_set_item(payload, "codec", plist_new_string("opus"));
  plist_dict_set_item(payload, "muted", plist_new_bool(number % 2));
  TelvaneErrorRef error = NULL;
  const bool is_sent = TelvaneSendMessageWithError(session, 12, 1, payload, &error);
  plist_free(payload);
  if (!is_sent) printf("event %u was refused: %s\n", number, TelvaneErrorGetDescription(error));
  TelvaneErrorRelease(error);
  return is_sent;
}

int main(int argc, char** argv) {
  const unsigned long client_type = argc > 1 ? strtoul(argv[1], NULL, 10) : 7;
  if (argc > 2) {
    fprintf(stderr, "usage: %s [CLIENT-TYPE]\n", argv[0]);
    return 2;
  }

  TelvaneRef session = open_session(client_type);
  if (session == NULL) {
    fprintf(stderr, "no session: the client type must be 5 to 30, and the daemon within reach\n");
    return 1;
  }
  TelvaneSetMessageBlock(session, did_answer, NULL);
  TelvaneStartConfiguration(session, did_configure, NULL);
  if (!wait_for(&progress.is_configured)) {
    fprintf(stderr, "no configuration: is telvaned running?\n");
    TelvaneRelease(session);
    return 1;
  }

  unsigned sent = 0;
  for (unsigned number = 1; number <= kEventCount; ++number) sent += send_event(session, number) ? 1 : 0;
  printf("sent %u events\n", sent);

  TelvaneFlushMessagesWithCompletion(session, did_flush, NULL);
  const bool is_flushed = wait_for(&progress.is_flushed);
  TelvaneRelease(session);
  printf("released\n");
  return is_flushed && !progress.has_failed && sent == kEventCount ? 0 : 1;
}
