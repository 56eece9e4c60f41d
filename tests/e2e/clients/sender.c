/* SPDX-License-Identifier: Apache-2.0 */
/* The same as sender.cpp, in C, without the times. */
#include <poll.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include "veltra/veltra.h"

static void ignore(void* context, const veltra_reply* reply) {
  (void)context, (void)reply;
}

int main(int count, char** arguments) {
  if (count != 4) return 2;
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = options.require_user_info = options.batch_events = options.connect_later = true;
  options.client_type = VELTRA_CLIENT_TYPE_JY;
  options.client_name = arguments[1];
  options.service_name = "ringer";
  veltra_session* session = veltra_session_create(&options, NULL, NULL);
  veltra_session_start(session, NULL, NULL);
  struct pollfd input = {STDIN_FILENO, POLLIN, 0};
  unsigned long long sent = 0, refused = 0;
  for (unsigned round = 0; round % 16 != 0 || poll(&input, 1, 0) == 0; ++round) {
    veltra_value* payload = veltra_dictionary();
    veltra_dictionary_set(payload, "sender", veltra_string(arguments[1]));
    veltra_dictionary_set(payload, "number", veltra_unsigned(sent));
    veltra_callback callback = *arguments[3] == 'r' ? ignore : NULL;
    ++*(veltra_session_send(session, 5, 1, payload, 0, callback, NULL) == VELTRA_OK ? &sent : &refused);
    veltra_release(payload);
    if (round == 16) puts("sending"), fflush(stdout);
    if (round % 16 == 0) usleep(16 * (unsigned)atol(arguments[2]));
  }
  const unsigned long long lost = veltra_session_counter(session, VELTRA_COUNTER_LOST);
  const unsigned long long connections = veltra_session_counter(session, VELTRA_COUNTER_CONNECTIONS);
  const unsigned long long closed = veltra_session_close(session);
  printf("{\"sender\": \"%s\", \"sent\": %llu, \"refused\": %llu, \"lost\": %llu, \"closed\": %llu, ",
         arguments[1], sent, refused, lost, closed);
  printf("\"connections\": %llu}\n", connections);
  return 0;
}
