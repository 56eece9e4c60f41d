/* SPDX-License-Identifier: Apache-2.0 */
/* libveltra: report to veltrad from C. See veltra.hpp for C++20.
 *
 * Threads: every function may be called from any thread; calls on one session are carried out in the order in
 * which they were made. Callbacks run one at a time on a thread of the session, which the first call that
 * needs it starts. In a callback every function may be called, but a waiting call is refused with
 * VELTRA_WOULD_DEADLOCK, and veltra_session_close does nothing.
 *
 * No function throws. Only the functions that end in _wait, veltra_session_close and veltra_session_create
 * wait.
 *
 * The daemon's end: when the connection has ended, the session connects again by itself, 0.1 to 30 s after
 * each attempt, and is described and started anew, with the user info that was last given. Calls that no
 * connection has taken a byte of wait until then. Calls that were written and have no answer end with
 * VELTRA_NO_REPLY and are never repeated. After veltra_session_finish there is no further connection.
 *
 * Processes: a session belongs to the process that made it. In a forked child every call returns
 * VELTRA_FORKED; veltra_session_close returns at once, frees what is the child's and leaves the connection to
 * the parent. The child may make sessions of its own. A child that a callback has forked ends when the
 * callback returns. exec closes the descriptors; vfork and posix_spawn need nothing. No signal handler runs
 * on a session's thread, and no function may be called in one.
 */
#ifndef VELTRA_VELTRA_H
#define VELTRA_VELTRA_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#define VELTRA_API __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

typedef enum veltra_status {
  VELTRA_OK = 0,
  VELTRA_NO_DAEMON = 1,      /* no daemon listens on the socket, or no further connection is made */
  VELTRA_REFUSED = 2,        /* the daemon refused the connection or the call */
  VELTRA_QUEUE_FULL = 3,     /* the session's queue is full; the call was dropped and counted */
  VELTRA_INVALID = 4,        /* an argument is invalid; nothing was done */
  VELTRA_NO_REPLY = 5,       /* the call ended without an answer */
  VELTRA_WOULD_DEADLOCK = 6, /* a waiting call inside a callback */
  VELTRA_TOO_LARGE = 7,      /* over 1 MiB (log data 16 MiB), 100,000 keys and values, 60 levels; not sent */
  VELTRA_FORKED = 8,         /* the session belongs to the process that this one was forked from */
} veltra_status;

/* A short English text for a status, valid for ever. */
VELTRA_API const char* veltra_status_text(veltra_status status);
/* The version of the library, "8.0", valid for ever. */
VELTRA_API const char* veltra_version(void);

/* ---- Values: booleans, integers, reals, texts (UTF-8), dates, data, arrays, dictionaries ----
 *
 * Values are reference-counted: each function that makes one returns one reference, which the caller releases
 * or passes to a function that takes it over. A value that is part of another cannot be changed
 * (VELTRA_INVALID). Containers nest at most 64 levels deep. Bytes of a text that are not valid UTF-8 become
 * U+FFFD. Every function accepts NULL as "no value".
 */
typedef struct veltra_value veltra_value;

typedef enum veltra_type {
  VELTRA_TYPE_NONE = 0,
  VELTRA_TYPE_BOOLEAN,
  VELTRA_TYPE_SIGNED,
  VELTRA_TYPE_UNSIGNED,
  VELTRA_TYPE_REAL,
  VELTRA_TYPE_STRING,
  VELTRA_TYPE_DATE,
  VELTRA_TYPE_DATA,
  VELTRA_TYPE_ARRAY,
  VELTRA_TYPE_DICTIONARY,
} veltra_type;

VELTRA_API veltra_value* veltra_boolean(bool value);
VELTRA_API veltra_value* veltra_signed(int64_t value);
VELTRA_API veltra_value* veltra_unsigned(uint64_t value);
VELTRA_API veltra_value* veltra_real(double value);
VELTRA_API veltra_value* veltra_string(const char* text); /* NUL-terminated; NULL gives NULL */
VELTRA_API veltra_value* veltra_string_with_length(const char* text, size_t length);
VELTRA_API veltra_value* veltra_date(double seconds_since_1970);
VELTRA_API veltra_value* veltra_data(const void* bytes, size_t length);
VELTRA_API veltra_value* veltra_array(void);
VELTRA_API veltra_value* veltra_dictionary(void);

/* Both take over the reference to `value`, even if they fail (VELTRA_INVALID: wrong kind of container, no
 * key, no value, nested too deep). An existing key gets the new value. */
VELTRA_API veltra_status veltra_array_append(veltra_value* array, veltra_value* value);
VELTRA_API veltra_status veltra_dictionary_set(veltra_value* dictionary, const char* key,
                                               veltra_value* value);

VELTRA_API veltra_value* veltra_retain(const veltra_value* value);
VELTRA_API void veltra_release(const veltra_value* value);

VELTRA_API veltra_type veltra_type_of(const veltra_value* value);
/* The content of a value; false, 0 or NULL for any other type. The pointers are valid as long as the value.
 * Integers of the other kind are returned if they fit, veltra_get_real also converts integers and dates, and
 * strings have a terminating NUL. */
VELTRA_API bool veltra_get_boolean(const veltra_value* value);
VELTRA_API int64_t veltra_get_signed(const veltra_value* value);
VELTRA_API uint64_t veltra_get_unsigned(const veltra_value* value);
VELTRA_API double veltra_get_real(const veltra_value* value);
VELTRA_API const char* veltra_get_string(const veltra_value* value, size_t* length);
VELTRA_API const void* veltra_get_data(const veltra_value* value, size_t* length);
/* The number of items of an array or entries of a dictionary, which are in ascending order of the keys'
 * bytes; 0 for any other type. */
VELTRA_API size_t veltra_count(const veltra_value* value);
/* Not to be released; NULL if there is none. */
VELTRA_API const veltra_value* veltra_array_item(const veltra_value* array, size_t index);
VELTRA_API const veltra_value* veltra_dictionary_item(const veltra_value* dictionary, const char* key);
VELTRA_API const veltra_value* veltra_dictionary_entry(const veltra_value* dictionary, size_t index,
                                                       const char** key);

/* ---- Replies ---- */

/* The answer to a call. In a callback it is valid until the callback returns. */
typedef struct veltra_reply veltra_reply;

/* How the call ended; VELTRA_OK if the daemon answered. */
VELTRA_API veltra_status veltra_reply_status(const veltra_reply* reply);
/* The text of the answer, or NULL; `length` may be NULL. */
VELTRA_API const char* veltra_reply_text(const veltra_reply* reply, size_t* length);
/* The back ends that report: an array of texts, or NULL if there are none. */
VELTRA_API const veltra_value* veltra_reply_backends(const veltra_reply* reply);
/* What has become of a message in each back end when the answer was written: an array of dictionaries with
 * the texts "backend"; "outcome", which is posted, batched, held, dropped, waiting, sent, written, delivered
 * or none; "reason", a name for programs; "text", the same for people. Empty if the session has no back ends,
 * NULL if the call sent no message or the daemon is older. */
VELTRA_API const veltra_value* veltra_reply_outcomes(const veltra_reply* reply);
VELTRA_API bool veltra_reply_uploaded(const veltra_reply* reply);
/* True if the server has confirmed an uploaded file and the library has removed it. */
VELTRA_API bool veltra_reply_removed(const veltra_reply* reply);
/* The error in the answer or of the call; domain and description are NULL if there is none. */
VELTRA_API const char* veltra_reply_error_domain(const veltra_reply* reply);
VELTRA_API int64_t veltra_reply_error_code(const veltra_reply* reply);
VELTRA_API const char* veltra_reply_error_description(const veltra_reply* reply);
VELTRA_API void veltra_reply_release(veltra_reply* reply);

typedef void (*veltra_callback)(void* context, const veltra_reply* reply);

/* ---- Sessions ---- */

typedef struct veltra_session veltra_session;

/* Receives a copy of a message of this session or of one below it. `session_info` and `payload` are valid
 * until it returns, and may be NULL. If everything is empty or zero, aggregation has ended. */
typedef void (*veltra_aggregation_callback)(void* context, const veltra_value* session_info, double timestamp,
                                            uint16_t category, uint16_t type, const veltra_value* payload);

/* The state of a session's connection. */
typedef enum veltra_connection_state {
  VELTRA_STATE_CONNECTING, /* it will connect; said again, with the reason, after each attempt that failed */
  VELTRA_STATE_CONNECTED,  /* the daemon has accepted the connection */
  VELTRA_STATE_STARTED,    /* the daemon has answered a start, also one that the library has made again */
  VELTRA_STATE_LOST,       /* the connection has ended; calls under way end with VELTRA_NO_REPLY */
  VELTRA_STATE_CLOSED,     /* there will be no further connection */
} veltra_connection_state;

/* Learns of each change. `backends`: those that report, an array of texts, or NULL; only with
 * VELTRA_STATE_STARTED. `why`: a text, or NULL. Both are valid until it returns. */
typedef void (*veltra_state_callback)(void* context, veltra_connection_state, const veltra_value* backends,
                                      const char* why);

/* The kinds of clients. Each is named after the code that identifies it in reports. */
typedef enum veltra_client_type {
  VELTRA_CLIENT_TYPE_PV = 0,
  VELTRA_CLIENT_TYPE_DR = 1,
  VELTRA_CLIENT_TYPE_XLN = 2,
  VELTRA_CLIENT_TYPE_BQ = 3,
  VELTRA_CLIENT_TYPE_HW = 4,
  VELTRA_CLIENT_TYPE_ZE = 5,
  VELTRA_CLIENT_TYPE_FU = 6,
  VELTRA_CLIENT_TYPE_JY = 7,
  VELTRA_CLIENT_TYPE_KO = 8,
  VELTRA_CLIENT_TYPE_WA = 9,
  VELTRA_CLIENT_TYPE_UT = 10,
  VELTRA_CLIENT_TYPE_EB = 11,
  VELTRA_CLIENT_TYPE_MYRT = 12,
  VELTRA_CLIENT_TYPE_QOLIN = 13,
  VELTRA_CLIENT_TYPE_FU_GLP = 14,
  VELTRA_CLIENT_TYPE_FU_TOLMS = 15,
  VELTRA_CLIENT_TYPE_GARNOVE = 16,
  VELTRA_CLIENT_TYPE_LIMBET = 17,
} veltra_client_type;

/* How a message is treated; REALTIME | OVERRIDE_SAMPLING is both. */
typedef enum veltra_flag {
  VELTRA_FLAG_NONE = 0,
  VELTRA_FLAG_REALTIME = 1,          /* posted at once, and what is batched before it */
  VELTRA_FLAG_OVERRIDE_SAMPLING = 2, /* a back end that sampling holds back reports from now on */
} veltra_flag;

/* The types of messages of category 0, which are about the session itself. Daemon and library send them. */
typedef enum veltra_message_kind {
  VELTRA_MESSAGE_START = 0,
  VELTRA_MESSAGE_STOP = 1,
  VELTRA_MESSAGE_FINISH = 2,
} veltra_message_kind;

/* Its 22 fields are what the daemon is told about the session, and how the library serves it. A program that
 * was built with an earlier version of the struct goes on. */
typedef struct veltra_session_options {
  size_t size;      /* sizeof(veltra_session_options), which identifies the version of the struct */
  const char* root; /* the directory that contains run/veltrad; NULL: VELTRA_ROOT, else "/" */
  /* Session info. A key is left out if its has_… is false. */
  bool has_client_type;
  int32_t client_type; /* 0 to 17: a veltra_client_type */
  bool has_session_id;
  uint32_t session_id;
  bool has_client_version;
  uint16_t client_version;
  bool require_user_info;
  bool batch_events;
  /* User info: the dictionary, with the two names added. There is none if all three are NULL. */
  const veltra_value* user_info;
  const char* client_name;
  const char* service_name;
  /* If not NULL, this session aggregates. */
  veltra_aggregation_callback aggregated;
  void* aggregated_context;
  /* Bytes of calls that may wait to be written; 0 means 1 MiB. Further calls are dropped. A single waiting
   * call may be larger. */
  size_t queue_bytes;
  /* Does not describe the session on connecting: for one-shot messages, which contain a description. */
  bool undescribed;
  /* Neither waits for a daemon nor fails for want of one, a stuck one included: the session connects on its
   * thread, and its calls wait. */
  bool connect_later;
  /* How long the daemon has to accept a connection, and how long a waiting call waits for one; 0: 5,000. */
  uint32_t connect_timeout_ms;
  /* If not NULL, learns of each change of the connection's state, on a thread of the session. */
  veltra_state_callback state_changed;
  void* state_context;
  /* An array of names that the daemon is told with the description, or NULL. */
  const veltra_value* frameworks_to_check;
} veltra_session_options;

/* Fills in the defaults and `size`. */
VELTRA_API void veltra_session_options_init(veltra_session_options* options);

/* Connects to the daemon and describes the session. NULL on failure; then `*error` is a text that says what
 * is wrong and what to do, to be freed with veltra_free, and `*status` is the status. Both pointers may be
 * NULL. */
VELTRA_API veltra_session* veltra_session_create(const veltra_session_options* options, veltra_status* status,
                                                 char** error);
VELTRA_API void veltra_free(char* text);

/* Describes a live session anew: session info, user info and frameworks replace the former ones, and the back
 * ends follow at the next start. If `aggregated` is NULL, the session ends its aggregation; one that was made
 * without it cannot begin any. The other options stay as the session was made with. Does not wait. */
VELTRA_API veltra_status veltra_session_describe(veltra_session*, const veltra_session_options* options);

/* Without _wait: does not wait. VELTRA_OK means that the call was accepted and `callback` (unless NULL) will
 * run exactly once; otherwise nothing was sent and the callback will not run. With _wait: waits for the
 * answer and returns its status; without a connection, for at most connect_timeout_ms, and then the call is
 * not sent.
 * `*reply` (unless `reply` is NULL) is always set and must be released. */
VELTRA_API veltra_status veltra_session_start(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_start_wait(veltra_session*, veltra_reply** reply);

/* `payload` is a dictionary or NULL. flag: 0 to 3, see veltra_flag. */
VELTRA_API veltra_status veltra_session_send(veltra_session*, uint16_t category, uint16_t type,
                                             const veltra_value* payload, uint32_t flag, veltra_callback,
                                             void* context);
VELTRA_API veltra_status veltra_session_send_wait(veltra_session*, uint16_t category, uint16_t type,
                                                  const veltra_value* payload, uint32_t flag,
                                                  veltra_reply** reply);
/* Sends a dictionary with "category", "type", "payload" and "flag" unchanged; the daemon checks it. */
VELTRA_API veltra_status veltra_session_send_dictionary(veltra_session*, const veltra_value* message,
                                                        veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_send_dictionary_wait(veltra_session*, const veltra_value* message,
                                                             veltra_reply** reply);

/* Sends one message with a description of its sender; the session need not be started. Of `who`, the session
 * info and the user info are used; client type and session ID are required, or there is no answer. The text
 * of the reply is "finished", whether or not the message was reported, or "storebag not available".
 * Afterwards the session has the description `who`. */
VELTRA_API veltra_status veltra_session_send_one_shot(veltra_session*, const veltra_session_options* who,
                                                      uint16_t category, uint16_t type,
                                                      const veltra_value* payload, veltra_callback,
                                                      void* context);
VELTRA_API veltra_status veltra_session_send_one_shot_wait(veltra_session*, const veltra_session_options* who,
                                                           uint16_t category, uint16_t type,
                                                           const veltra_value* payload, veltra_reply** reply);

VELTRA_API veltra_status veltra_session_flush(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_flush_wait(veltra_session*, veltra_reply** reply);
/* Uploads a regular file of at most 2,147,483,647 bytes. The library opens it, without following a link, and
 * lends it to the daemon; the server gets the last component of `path` as its name. Of a file on a FUSE or
 * network file system the library lends a copy, and this function returns only when the copy is made. The
 * answer arrives after those of the servers. veltra_reply_uploaded: a request was carried out.
 * veltra_reply_removed: the server has confirmed the file, and the library has removed it. It does so only if
 * the path still names the same file, which it first renames to a hidden name in the same directory so that
 * no other file can be removed by mistake. A file that was changed stays. The error of the answer says why
 * the file was not taken, or why a file that was stored was not removed. */
VELTRA_API veltra_status veltra_session_upload_file(veltra_session*, const char* path, veltra_callback,
                                                    void* context);
VELTRA_API veltra_status veltra_session_upload_file_wait(veltra_session*, const char* path,
                                                         veltra_reply** reply);
/* `data` is an array of at most 16 MiB and 100,000 keys and values. The answer arrives after those of the
 * servers; veltra_reply_uploaded says whether any of them accepted the data. It has no error. */
VELTRA_API veltra_status veltra_session_upload_log_data(veltra_session*, const veltra_value* data,
                                                        veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_upload_log_data_wait(veltra_session*, const veltra_value* data,
                                                             veltra_reply** reply);
/* `user_info` is a dictionary or NULL: the session's new user info. */
VELTRA_API veltra_status veltra_session_states(veltra_session*, const veltra_value* user_info,
                                               veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_states_wait(veltra_session*, const veltra_value* user_info,
                                                    veltra_reply** reply);
VELTRA_API veltra_status veltra_session_display_url(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_display_url_wait(veltra_session*, veltra_reply** reply);
VELTRA_API veltra_status veltra_session_finish(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_finish_wait(veltra_session*, veltra_reply** reply);

typedef struct veltra_statistics {
  uint64_t sent;           /* calls written to the daemon */
  uint64_t dropped;        /* calls that were refused because the queue was full, and those that were lost */
  uint64_t queued;         /* calls that now wait to be written */
  uint64_t replies;        /* answers received */
  uint64_t unanswered;     /* calls that ended without an answer */
  uint64_t dropped_events; /* aggregated copies lost because more than 4,096 waited for the callback */
} veltra_statistics;
VELTRA_API void veltra_session_statistics(veltra_session*, veltra_statistics* statistics);

typedef enum veltra_counter {
  VELTRA_COUNTER_LOST,        /* messages, files and log data that were accepted and then lost */
  VELTRA_COUNTER_CONNECTIONS, /* connections to the daemon that the session has had */
} veltra_counter;
/* A message that was accepted (VELTRA_OK, or VELTRA_NO_REPLY of a waiting call) is counted once: by the
 * daemon, which has run it, by VELTRA_COUNTER_LOST, or by what veltra_session_close returns. After the
 * daemon's orderly stop this is exact. After it was killed, what nobody can know counts as lost; of messages
 * without a callback these may be up to 64 more than were under way. 0 for an unknown counter. */
VELTRA_API uint64_t veltra_session_counter(veltra_session*, veltra_counter);

/* Takes at most 2 s to write the waiting calls, on a further connection if need be, and to learn which were
 * run. Then closes the connection, ends open calls with VELTRA_NO_REPLY (their callbacks run before this
 * returns) and frees the session. Returns the number of messages, files and log data that were lost and that
 * VELTRA_COUNTER_LOST has not told. Inside a callback, or with NULL, it does nothing and returns 0. No other
 * call on the session may start after this one; waiting calls end. */
VELTRA_API uint64_t veltra_session_close(veltra_session*);

#ifdef __cplusplus
}
#endif

#endif
