/* SPDX-License-Identifier: Apache-2.0 */
/* libveltra-testing: a daemon for tests of programs that report, in the test's own process. It takes in every
 * message and sends nothing anywhere. See testing.hpp for C++20.
 *
 * It speaks the real daemon's protocol on a socket under a directory of its own. The program under test is
 * pointed there by veltra_session_options.root or, if it cannot be given a root, by VELTRA_ROOT in its
 * environment. Every session may report, each start is answered with the back end "testing", and each message
 * with the outcome "delivered".
 *
 * Any thread may call these functions; after veltra_testing_stop no other call may start. No function throws.
 */
#ifndef VELTRA_TESTING_H
#define VELTRA_TESTING_H

#include <veltra/veltra.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct veltra_testing_daemon veltra_testing_daemon;

/* Starts a daemon, and returns when it can be reached. NULL on failure; then `*error`, unless `error` is
 * NULL, is a text that says why, to be freed with veltra_free. */
VELTRA_API veltra_testing_daemon* veltra_testing_start(char** error);
/* The directory that sessions are to be given as their root, below TMPDIR or /tmp. Valid until the stop,
 * which removes it. */
VELTRA_API const char* veltra_testing_root(veltra_testing_daemon*);

/* Waits until at least `count` messages have come. False: they have not come in time. */
VELTRA_API bool veltra_testing_wait(veltra_testing_daemon*, size_t count, uint32_t timeout_ms);
/* The number of messages that have come so far, restarts included. */
VELTRA_API size_t veltra_testing_count(veltra_testing_daemon*);
/* One message, by the order of arrival, from 0: a dictionary with "category", "type", "flag" (0 if none was
 * given) and, as far as they were given, the dictionaries "payload", "sessionInfo" and "userInfo" of the
 * session. Not to be released; valid until the stop, also over a restart. NULL if there is none. */
VELTRA_API const veltra_value* veltra_testing_message(veltra_testing_daemon*, size_t index);

/* From now on, new connections are refused with this text, and calls end with it as their error
 * (VELTRA_REFUSED); their messages are not taken in. NULL: no more. */
VELTRA_API void veltra_testing_refuse(veltra_testing_daemon*, const char* text);
/* From now on, answers to calls go out this much later, and in their order; messages are taken in at once. */
VELTRA_API void veltra_testing_delay(veltra_testing_daemon*, uint32_t ms);
/* Stops in order, as the real daemon does: runs what has arrived, and ends all connections. Then it serves
 * again. False if it could not; then nothing can connect. */
VELTRA_API bool veltra_testing_restart(veltra_testing_daemon*);
/* Ends all connections and frees everything. NULL does nothing. */
VELTRA_API void veltra_testing_stop(veltra_testing_daemon*);

#ifdef __cplusplus
}
#endif

#endif
