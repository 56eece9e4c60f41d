/* libveltra: report to veltrad from C. See veltra.hpp for the same in C++20.
 *
 * Threads: every function may be called from any thread; calls on one session are carried out in the order in
 * which they were made. Callbacks run on a thread of the session's own, one at a time; a waiting call inside
 * a callback is refused with VELTRA_WOULD_DEADLOCK.
 *
 * Nothing here throws, and no function but those that end in _wait, veltra_session_close and
 * veltra_session_create waits for anything.
 *
 * Processes: the descriptors are closed by exec. After a fork the session belongs to the parent: the child
 * must not use it, close included, and opens one of its own. No signal handler runs on a session's thread.
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
  VELTRA_NO_DAEMON = 1,      /* nobody listens on the socket, or the connection has ended */
  VELTRA_REFUSED = 2,        /* the daemon refused the connection or the call */
  VELTRA_QUEUE_FULL = 3,     /* the session's queue is full; the call was dropped and counted */
  VELTRA_INVALID = 4,        /* an argument is not what it must be; nothing was done */
  VELTRA_NO_REPLY = 5,       /* the call ended without an answer */
  VELTRA_WOULD_DEADLOCK = 6, /* a waiting call inside a callback */
  VELTRA_TOO_LARGE = 7,      /* over 1 MiB (log data 16 MiB), 100,000 keys and values, 60 levels; not sent */
} veltra_status;

/* A short English text for a status; static. */
VELTRA_API const char* veltra_status_text(veltra_status status);
/* The library's package version, "8.0"; static. */
VELTRA_API const char* veltra_version(void);

/* ---- Values: booleans, integers, reals, texts (UTF-8), dates, data, arrays, dictionaries ----
 *
 * Counted references: each create returns one reference, which the caller releases, or hands over where a
 * function says that it takes it. A value that is part of another cannot be changed any more
 * (VELTRA_INVALID); containers nest at most 64 deep. Bytes of a text that are no UTF-8 become U+FFFD. NULL is
 * "no value" and every function takes it as such.
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

/* Both take over the reference to `value`, also when they fail (VELTRA_INVALID: wrong kind of container, no
 * key, no value, nested too deep). A key that is there already gets the new value. */
VELTRA_API veltra_status veltra_array_append(veltra_value* array, veltra_value* value);
VELTRA_API veltra_status veltra_dictionary_set(veltra_value* dictionary, const char* key,
                                               veltra_value* value);

VELTRA_API veltra_value* veltra_retain(const veltra_value* value);
VELTRA_API void veltra_release(const veltra_value* value);

VELTRA_API veltra_type veltra_type_of(const veltra_value* value);
/* The value by its type; false, 0 or NULL for another type. The pointers live as long as the value. */
VELTRA_API bool veltra_get_boolean(const veltra_value* value);
VELTRA_API int64_t veltra_get_signed(const veltra_value* value); /* also of an unsigned one that fits */
VELTRA_API uint64_t
veltra_get_unsigned(const veltra_value* value);               /* also of a signed one that is not negative */
VELTRA_API double veltra_get_real(const veltra_value* value); /* also of an integer, and of a date */
VELTRA_API const char* veltra_get_string(const veltra_value* value, size_t* length); /* NUL-terminated too */
VELTRA_API const void* veltra_get_data(const veltra_value* value, size_t* length);
/* Items of an array, entries of a dictionary (in ascending order of the keys' bytes); 0 for anything else. */
VELTRA_API size_t veltra_count(const veltra_value* value);
/* Borrowed, not to be released; NULL where there is none. */
VELTRA_API const veltra_value* veltra_array_item(const veltra_value* array, size_t index);
VELTRA_API const veltra_value* veltra_dictionary_item(const veltra_value* dictionary, const char* key);
VELTRA_API const veltra_value* veltra_dictionary_entry(const veltra_value* dictionary, size_t index,
                                                       const char** key);

/* ---- Replies ---- */

/* What a call was answered. Given to a callback it lives until the callback returns. */
typedef struct veltra_reply veltra_reply;

/* How the call ended. VELTRA_OK: the daemon answered. */
VELTRA_API veltra_status veltra_reply_status(const veltra_reply* reply);
/* The text answered, or NULL for none; `length` may be NULL. */
VELTRA_API const char* veltra_reply_text(const veltra_reply* reply, size_t* length);
/* The backends that report: an array of texts, or NULL when none could be had. */
VELTRA_API const veltra_value* veltra_reply_backends(const veltra_reply* reply);
VELTRA_API bool veltra_reply_uploaded(const veltra_reply* reply);
/* Of an uploaded file: the server has confirmed it, and the library has removed it. */
VELTRA_API bool veltra_reply_removed(const veltra_reply* reply);
/* The error of the answer (of a flush, say) or of the call itself; domain and description are NULL without
 * one. */
VELTRA_API const char* veltra_reply_error_domain(const veltra_reply* reply);
VELTRA_API int64_t veltra_reply_error_code(const veltra_reply* reply);
VELTRA_API const char* veltra_reply_error_description(const veltra_reply* reply);
VELTRA_API void veltra_reply_release(veltra_reply* reply);

typedef void (*veltra_callback)(void* context, const veltra_reply* reply);

/* ---- Sessions ---- */

typedef struct veltra_session veltra_session;

/* A copy of a message of this session or of one below it, for the session that aggregates. `session_info` and
 * `payload` are borrowed and may be NULL; everything empty or zero marks the end of aggregation. */
typedef void (*veltra_aggregation_callback)(void* context, const veltra_value* session_info, double timestamp,
                                            uint16_t category, uint16_t type, const veltra_value* payload);

typedef struct veltra_session_options {
  size_t size;      /* sizeof(veltra_session_options): lets the library tell old callers from new */
  const char* root; /* directory that holds run/veltrad; NULL: VELTRA_ROOT, else "/" */
  /* Session info. A has_… that is false leaves its key out. */
  bool has_client_type;
  int32_t client_type; /* 0 to 17 */
  bool has_session_id;
  uint32_t session_id;
  bool has_client_version;
  uint16_t client_version;
  bool require_user_info;
  bool batch_events;
  /* User info: the dictionary given, with the two names added where they are not NULL. All three NULL: no
   * user info. Borrowed for the call. */
  const veltra_value* user_info;
  const char* client_name;
  const char* service_name;
  /* Not NULL: this session aggregates. */
  veltra_aggregation_callback aggregated;
  void* aggregated_context;
  /* Bytes of calls that may wait to be written, 1 MiB where 0. A call beyond it is dropped; one that has the
   * queue for itself may be larger. */
  size_t queue_bytes;
  /* Says nothing of the session on connecting: for one-shot messages, which say it themselves. */
  bool undescribed;
} veltra_session_options;

/* Fills in the defaults and `size`. */
VELTRA_API void veltra_session_options_init(veltra_session_options* options);

/* Connects and describes the session (unless undescribed). NULL on failure; then `*error`, when `error` is
 * not NULL, is a text that says what is wrong and what to do, to be freed with veltra_free, and `*status`,
 * when not NULL, the status. */
VELTRA_API veltra_session* veltra_session_create(const veltra_session_options* options, veltra_status* status,
                                                 char** error);
VELTRA_API void veltra_free(char* text);

/* Without _wait: VELTRA_OK means that the call is on its way and `callback` (when not NULL) will run exactly
 * once; anything else means that nothing was sent and the callback will not run. With _wait: waits for the
 * answer; `*reply` (when `reply` is not NULL) is set in every case and is to be released; the result is the
 * reply's status. */
VELTRA_API veltra_status veltra_session_start(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_start_wait(veltra_session*, veltra_reply** reply);

/* `payload` is a dictionary or NULL, borrowed. flag: 1 and 3 realtime, 2 and 3 override sampling, 0 neither.
 */
VELTRA_API veltra_status veltra_session_send(veltra_session*, uint16_t category, uint16_t type,
                                             const veltra_value* payload, uint32_t flag, veltra_callback,
                                             void* context);
VELTRA_API veltra_status veltra_session_send_wait(veltra_session*, uint16_t category, uint16_t type,
                                                  const veltra_value* payload, uint32_t flag,
                                                  veltra_reply** reply);
/* A message dictionary as it is: "category", "type", "payload", "flag"; the daemon checks it. */
VELTRA_API veltra_status veltra_session_send_dictionary(veltra_session*, const veltra_value* message,
                                                        veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_send_dictionary_wait(veltra_session*, const veltra_value* message,
                                                             veltra_reply** reply);

/* One message with all that the daemon must know about its sender, who need not have started: `who` as for
 * veltra_session_create (its user info and names, all up to batch_events; client type and session ID are
 * needed, or there is no answer). The reply's text is "finished", whatever became of the message, or
 * "storebag not available". The session is `who` from then on. */
VELTRA_API veltra_status veltra_session_send_one_shot(veltra_session*, const veltra_session_options* who,
                                                      uint16_t category, uint16_t type,
                                                      const veltra_value* payload, veltra_callback,
                                                      void* context);
VELTRA_API veltra_status veltra_session_send_one_shot_wait(veltra_session*, const veltra_session_options* who,
                                                           uint16_t category, uint16_t type,
                                                           const veltra_value* payload, veltra_reply** reply);

VELTRA_API veltra_status veltra_session_flush(veltra_session*, veltra_callback, void* context);
VELTRA_API veltra_status veltra_session_flush_wait(veltra_session*, veltra_reply** reply);
/* Uploads a regular file of at most 2,147,483,647 bytes. The library opens it, without waiting for it and
 * without following a link, and lends it to the daemon, which has no other way to it; it is named by the last
 * component of `path`. Of a file that others serve (FUSE, a network) it lends a copy, which it makes before
 * the call goes, however long that takes. The answer comes when the servers have answered.
 * veltra_reply_uploaded: a request was carried out. Where the server has confirmed it, the library removes
 * the file, if its path still names the same one (veltra_reply_removed): it renames it to a hidden name
 * beside it first, so that no other file is removed that somebody puts there. A file that has changed
 * meanwhile stays. The answer's error is the library's: why nobody takes such a file, or why one that was
 * stored could not be removed. */
VELTRA_API veltra_status veltra_session_upload_file(veltra_session*, const char* path, veltra_callback,
                                                    void* context);
VELTRA_API veltra_status veltra_session_upload_file_wait(veltra_session*, const char* path,
                                                         veltra_reply** reply);
/* `data` is an array, borrowed, of at most 16 MiB and 100,000 keys and values. The answer, which comes when
 * the servers have answered, says with veltra_reply_uploaded whether anybody took it; it has no error of its
 * own.
 */
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
  uint64_t sent;       /* calls handed to the daemon */
  uint64_t dropped;    /* calls refused, or given up in the queue, because it was full or nobody listened */
  uint64_t queued;     /* calls that wait to be written, now */
  uint64_t replies;    /* answers received */
  uint64_t unanswered; /* calls that ended without an answer */
  uint64_t
      dropped_events; /* aggregated copies lost because their callbacks did not keep up (4,096 may wait) */
} veltra_statistics;
VELTRA_API void veltra_session_statistics(veltra_session*, veltra_statistics* statistics);

/* Writes out what waits, for at most 2 s, closes the connection, ends calls without an answer with
 * VELTRA_NO_REPLY (their callbacks run before this returns), frees the session. Returns how many calls were
 * lost unwritten. Inside a callback it does nothing and returns 0. No call may start any more once this has
 * been called; waiting calls that are under way end. NULL does nothing. */
VELTRA_API uint64_t veltra_session_close(veltra_session*);

#ifdef __cplusplus
}
#endif

#endif
