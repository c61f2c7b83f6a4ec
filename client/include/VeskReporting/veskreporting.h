/* The C API for telemetry reporting, for C99 and later. VeskReporting.h is the same for C++.
 *
 * A session is configured, started and then sends messages. Operations reach the daemon in the order of the
 * calls. The session's own thread connects, sends and receives; only functions whose name ends in _wait
 * block. docs/client-library.md describes the guarantees, docs/abi.md what stays the same in later versions.
 *
 * All functions of a session are thread-safe. None aborts the program or installs a signal handler. Texts
 * are UTF-8 without NUL; `const char *` parameters are NUL-terminated. Arguments are borrowed until the
 * function returns. Times are in milliseconds. A null session is one that could not be made: its calls return
 * VESK_OUT_OF_RESOURCES. Other null handles are invalid arguments, or nothing is done. */
#ifndef VESKREPORTING_VESKREPORTING_H
#define VESKREPORTING_VESKREPORTING_H

#include <VeskReporting/VeskLog.h>
#include <VeskReporting/VeskValues.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define VESK_MUST_CHECK __attribute__((warn_unused_result))

#define VESK_DEFAULT_TIMEOUT_MS 30000

/* ---- Outcomes ------------------------------------------------------------------------------------------ */

/* The outcome of a call. Later versions may add values. */
typedef int32_t vesk_status;
enum {
  VESK_DONE = 0,              /* the daemon has answered */
  VESK_QUEUED = 1,            /* waits to be sent, after everything queued before it */
  VESK_QUEUE_FULL = 2,        /* not sent: the queue is full */
  VESK_NOT_CONNECTED = 3,     /* no daemon in time, or the connection ended before the answer */
  VESK_TIMED_OUT = 4,         /* sent, but not answered in time */
  VESK_REFUSED = 5,           /* the daemon answered with an error */
  VESK_INVALID_ARGUMENT = 6,  /* larger than 1 MiB, nested too deeply, text that is not UTF-8, null handle */
  VESK_FILE_UNAVAILABLE = 7,  /* the file can't be opened or is not a regular file */
  VESK_FORKED_PROCESS = 8,    /* the session belongs to the process that this one was forked from */
  VESK_ON_SESSION_THREAD = 9, /* a waiting call made from a callback would deadlock */
  VESK_CLOSED = 10,           /* the session was freed before the answer */
  VESK_OUT_OF_RESOURCES = 11, /* out of memory, descriptors or threads */
  VESK_TOO_MANY_CONNECTIONS = 12 /* like VESK_NOT_CONNECTED: the daemon's limit on connections is reached */
};

/* A short description for a log line. Static. */
VESK_API const char* vesk_status_text(vesk_status status);

/* The outcome of a call that has an answer. */
typedef struct vesk_result vesk_result;

VESK_API vesk_status vesk_result_status(const vesk_result* result);
/* The cause of a failure, if there is more to say than vesk_status_text does; otherwise "". */
VESK_API const char* vesk_result_detail(const vesk_result* result);
/* The answer's text; null if it has none. Messages and flushes: the backends' answer, if one gave any. */
VESK_API const char* vesk_result_text(const vesk_result* result);
/* Starts and fetched states: 1 if there is a storebag for the client type. Uploads: 1 if a backend accepted
 * the file or data. Otherwise 0. */
VESK_API int vesk_result_accepted(const vesk_result* result);
/* Starts and fetched states: the enabled backends. `index` counts from 0; null beyond the last. */
VESK_API size_t vesk_result_backend_count(const vesk_result* result);
VESK_API const char* vesk_result_backend(const vesk_result* result, size_t index);
VESK_API void vesk_result_free(vesk_result* result);

/* Called exactly once for each call that returned VESK_QUEUED, on the session's thread. May use the session,
 * except for waiting calls and vesk_session_free. `result` is valid until it returns. */
typedef void (*vesk_callback)(void* context, const vesk_result* result);

/* How a call delivers its result. A null pointer to it makes the call one-way. */
typedef struct vesk_completion {
  vesk_callback callback;
  void* context;
  int64_t timeout_ms; /* starts with the call */
} vesk_completion;

/* ---- Dictionaries -------------------------------------------------------------------------------------- */

/* A dictionary under construction, for callers that don't write their views as arrays. Not thread-safe. It
 * copies what is set; keys keep the order of their first setting. */
typedef struct vesk_dictionary vesk_dictionary;

/* Null if memory runs out. */
VESK_API vesk_dictionary* vesk_dictionary_new(void);
VESK_API void vesk_dictionary_free(vesk_dictionary* dictionary);
/* Each replaces the value under `key`, and returns VESK_DONE, VESK_INVALID_ARGUMENT or
 * VESK_OUT_OF_RESOURCES. */
VESK_API vesk_status vesk_dictionary_set(vesk_dictionary* dictionary, const char* key,
                                         const VeskValueView* value);
VESK_API vesk_status vesk_dictionary_set_text(vesk_dictionary* dictionary, const char* key, const char* text);
VESK_API vesk_status vesk_dictionary_set_integer(vesk_dictionary* dictionary, const char* key,
                                                 int64_t number);
VESK_API vesk_status vesk_dictionary_set_double(vesk_dictionary* dictionary, const char* key, double number);
VESK_API vesk_status vesk_dictionary_set_boolean(vesk_dictionary* dictionary, const char* key, int boolean);
VESK_API vesk_status vesk_dictionary_set_dictionary(vesk_dictionary* dictionary, const char* key,
                                                    const vesk_dictionary* value);
/* Its entries, valid until it is changed or freed. Null for a null dictionary. */
VESK_API const VeskDictionaryView* vesk_dictionary_view(const vesk_dictionary* dictionary);

/* ---- Sessions ------------------------------------------------------------------------------------------ */

typedef struct vesk_session vesk_session;

/* How a session behaves. */
typedef struct vesk_options {
  size_t size;                      /* of this structure; set by vesk_options_init */
  const char* socket_path;          /* null: the daemon's own */
  uint64_t maximum_queued_messages; /* 4096; further messages are dropped */
  uint64_t maximum_queued_bytes;    /* 8 MiB, approximate memory */
  int64_t drain_ms;           /* 2000: how long vesk_session_free may take to send the queued messages */
  int64_t first_reconnect_ms; /* 50: delay between connection attempts; it doubles ... */
  int64_t last_reconnect_ms;  /* 5000: ... up to this */
  int64_t refresh_ms;         /* 0, never: how often a started session starts anew, at least 1000 */
} vesk_options;

/* Sets the defaults. `size`: sizeof(vesk_options). */
VESK_API void vesk_options_init(vesk_options* options, size_t size);

/* Starts the session's thread, which connects to the daemon with the first operation. Null options are the
 * defaults. Null if memory, descriptors or threads run out, which is logged. */
VESK_API vesk_session* vesk_session_new(const vesk_options* options);
/* Waits until the daemon has taken and answered what is queued, for at most `drain_ms`, and for a running
 * callback without a limit. Not to be called from a callback. Does nothing in a forked process. */
VESK_API void vesk_session_free(vesk_session* session);

VESK_API int vesk_session_is_connected(const vesk_session* session);

/* Calls that were not sent, since the session was made. */
enum { VESK_DROPPED_QUEUE_FULL = 0, VESK_DROPPED_INVALID = 1, VESK_DROPPED_UNSENT = 2 };
/* 0 for an unknown reason. */
VESK_API uint64_t vesk_session_drops(const vesk_session* session, int32_t reason);

/* Connects now and waits. Not required before other operations. In all functions that wait, `result` may be
 * null; otherwise it is set to a result to be freed, also after a failure (null if memory runs out). They
 * return the result's status. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_connect_wait(vesk_session* session, int64_t timeout_ms,
                                                               vesk_result** result);

/* Who reports. Zero what you don't set: the user's consent and the storebag's rules then apply, and
 * `client_name` must be set, or nothing is reported. */
typedef struct vesk_identity {
  size_t size;              /* sizeof(vesk_identity) */
  int32_t client_type;      /* selects the storebag */
  const char* client_name;  /* finds the client's entry in it */
  const char* service_name; /* may be null */
  uint32_t session_id;      /* the client's own number for the session */
  uint16_t client_version;
  uint8_t batch_events; /* 1: collect events into few posts */
  uint8_t no_user_info; /* 1: report without asking for consent, entry, region, sampling, filters */
} vesk_identity;

VESK_API VESK_MUST_CHECK vesk_status vesk_session_identify(vesk_session* session,
                                                           const vesk_identity* identity);

/* One message of a session that this client aggregates. */
typedef struct vesk_aggregated {
  size_t size;                            /* of this structure */
  const VeskDictionaryView* session_info; /* of the session that sent the message; may be null */
  double timestamp;                       /* seconds since 1970 */
  uint16_t category;
  uint16_t type;
  const VeskDictionaryView* payload; /* may be null */
} vesk_aggregated;

/* Receives aggregated messages on the session's thread. A null `handle`: this client doesn't aggregate.
 * `release`, if not null, is called with the context once it is no longer used, also after a failure. */
typedef struct vesk_aggregation {
  void (*handle)(void* context, const vesk_aggregated* message);
  void (*release)(void* context);
  void* context;
} vesk_aggregation;

/* The same with any keys (VeskReportingKeys.h). `user_info`, `frameworks` and `aggregation` may be null. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_configure(
    vesk_session* session, const VeskDictionaryView* session_info, const VeskDictionaryView* user_info,
    const char* const* frameworks, size_t framework_count, const vesk_aggregation* aggregation);

/* Starts the session: the daemon fetches the storebag of the client type and creates its backends. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_start(vesk_session* session,
                                                        const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_start_wait(vesk_session* session, int64_t timeout_ms,
                                                             vesk_result** result);

/* Replaces the session's user info (null: none) and asks which backends are enabled for it. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_fetch_states(vesk_session* session,
                                                               const VeskDictionaryView* user_info,
                                                               const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_fetch_states_wait(vesk_session* session,
                                                                    const VeskDictionaryView* user_info,
                                                                    int64_t timeout_ms, vesk_result** result);

/* Asks where the session's messages can be viewed. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_fetch_display_url(vesk_session* session,
                                                                    const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_fetch_display_url_wait(vesk_session* session,
                                                                         int64_t timeout_ms,
                                                                         vesk_result** result);

/* Sends a message. `payload` may be null. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send(vesk_session* session, uint16_t category,
                                                       uint16_t type, const VeskDictionaryView* payload,
                                                       const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send_wait(vesk_session* session, uint16_t category,
                                                            uint16_t type, const VeskDictionaryView* payload,
                                                            int64_t timeout_ms, vesk_result** result);

/* Sends a message given by the keys "category", "type", "payload" and "flag" (1 realtime, 2 override
 * sampling, 3 both). */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send_parameters(vesk_session* session,
                                                                  const VeskDictionaryView* parameters,
                                                                  const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send_parameters_wait(vesk_session* session,
                                                                       const VeskDictionaryView* parameters,
                                                                       int64_t timeout_ms,
                                                                       vesk_result** result);

/* Makes the backends send what they hold back. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_flush(vesk_session* session,
                                                        const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_flush_wait(vesk_session* session, int64_t timeout_ms,
                                                             vesk_result** result);

/* Uploads a file, which the calling thread opens: only the caller needs read access. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_upload_file(vesk_session* session, const char* path,
                                                              const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_upload_file_wait(vesk_session* session, const char* path,
                                                                   int64_t timeout_ms, vesk_result** result);

/* Uploads log data. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_upload_log_data(vesk_session* session,
                                                                  const VeskListView* log_data,
                                                                  const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_upload_log_data_wait(vesk_session* session,
                                                                       const VeskListView* log_data,
                                                                       int64_t timeout_ms,
                                                                       vesk_result** result);

/* Sends a single message under its own identity, for a client that needs no session. `session_info` must
 * contain a client type and a session ID. `user_info` and `payload` may be null. */
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send_once(
    vesk_session* session, const VeskDictionaryView* session_info, const VeskDictionaryView* user_info,
    uint16_t category, uint16_t type, const VeskDictionaryView* payload, const vesk_completion* completion);
VESK_API VESK_MUST_CHECK vesk_status vesk_session_send_once_wait(vesk_session* session,
                                                                 const VeskDictionaryView* session_info,
                                                                 const VeskDictionaryView* user_info,
                                                                 uint16_t category, uint16_t type,
                                                                 const VeskDictionaryView* payload,
                                                                 int64_t timeout_ms, vesk_result** result);

/* ---- The installation ---------------------------------------------------------------------------------- */

/* Each writes at most `size` bytes to `buffer` and returns the whole length, without writing a NUL; 0 if
 * there is nothing. */

/* A stable identifier of this device (UUID text): the one that respects the user's diagnostics consent, or
 * the one that overrides it. A process that runs as neither the daemon's user nor root gets its own. */
VESK_API size_t vesk_persistent_identifier(int respects_consent, char* buffer, size_t size);
/* The version that the installed library declares; "7.0" if it declares none. */
VESK_API size_t vesk_version(char* buffer, size_t size);
/* The RSA public key (DER) that verifies storebags. */
VESK_API size_t vesk_public_key(char* buffer, size_t size);

/* ---- Testing ------------------------------------------------------------------------------------------- */

/* Replaces the daemon in a program's unit tests. While a recorder exists, new sessions without a
 * `socket_path` connect to the newest recorder of this process instead of a daemon. Their one-way calls
 * return after they were recorded, so a test can check them at once. A recorder may serve many sessions. Free
 * it after them. Thread-safe. */
typedef struct vesk_recorder vesk_recorder;

/* What was called, in the order of the calls. */
enum {
  VESK_RECORDED_CONFIGURE = 1,
  VESK_RECORDED_START = 2,
  VESK_RECORDED_STATES = 3,
  VESK_RECORDED_DISPLAY_URL = 4,
  VESK_RECORDED_MESSAGE = 5,
  VESK_RECORDED_FLUSH = 6,
  VESK_RECORDED_FILE = 7,
  VESK_RECORDED_LOG_DATA = 8
};

/* Members that the call doesn't have are null or 0. */
typedef struct vesk_recorded {
  size_t size; /* of this structure */
  int32_t call;
  uint16_t category;
  uint16_t type;
  int32_t flag;
  const VeskDictionaryView* payload;
  const VeskDictionaryView* session_info; /* of the session at the time of the call */
  const VeskDictionaryView* user_info;    /* likewise */
  const VeskListView* log_data;
  const char* path; /* of an uploaded file */
} vesk_recorded;

/* Null if it can't listen, which is logged. */
VESK_API vesk_recorder* vesk_recorder_new(void);
VESK_API void vesk_recorder_free(vesk_recorder* recorder);
/* The number of calls of a kind; 0 counts all kinds. */
VESK_API size_t vesk_recorder_count(const vesk_recorder* recorder, int32_t call);
/* The call with that index, from 0, among those of the kind; null beyond the last. Valid until the recorder
 * is cleared or freed. */
VESK_API const vesk_recorded* vesk_recorder_at(const vesk_recorder* recorder, int32_t call, size_t index);
VESK_API void vesk_recorder_clear(vesk_recorder* recorder);
/* Sets the enabled backends that the recorder reports for later starts and state queries; null means that
 * there is no storebag. The default is "httpPost". */
VESK_API void vesk_recorder_set_backends(vesk_recorder* recorder, const char* const* backends, size_t count);

#ifdef __cplusplus
}
#endif

#endif
