/* SPDX-License-Identifier: Apache-2.0 */
/* The same as sender.cpp, in C. */
#include <poll.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include "veltra/veltra.h"

static void ignore(void* context, const veltra_reply* reply) {
  (void)context;
  (void)reply;
}

int main(int count, char** arguments) {
  if (count != 4) return 2;
  const unsigned burst = 16, pause = (unsigned)atol(arguments[2]);
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = true;
  options.client_type = VELTRA_CLIENT_TYPE_JY;
  options.client_name = arguments[1];
  options.service_name = "ringer";
  options.require_user_info = options.batch_events = options.connect_later = true;
  veltra_session* session = veltra_session_create(&options, NULL, NULL);
  veltra_callback answered = strcmp(arguments[3], "reply") == 0 ? ignore : NULL;
  veltra_session_start(session, NULL, NULL);
  struct pollfd input = {STDIN_FILENO, POLLIN, 0};
  unsigned long sent = 0, refused = 0;
  for (unsigned long round = 0; round % burst != 0 || poll(&input, 1, 0) == 0; ++round) {
    veltra_value* payload = veltra_dictionary();
    veltra_dictionary_set(payload, "sender", veltra_string(arguments[1]));
    veltra_dictionary_set(payload, "number", veltra_unsigned(sent));
    ++*(veltra_session_send(session, 5, 1, payload, 0, answered, NULL) == VELTRA_OK ? &sent : &refused);
    veltra_release(payload);
    if (round == burst) puts("sending"), fflush(stdout);
    if (round % burst == 0) usleep(burst * pause);
  }
  const unsigned long lost = veltra_session_counter(session, VELTRA_COUNTER_LOST);
  const unsigned long connections = veltra_session_counter(session, VELTRA_COUNTER_CONNECTIONS);
  const unsigned long closed = veltra_session_close(session);
  printf(
      "{\"sender\": \"%s\", \"sent\": %lu, \"refused\": %lu, \"lost\": %lu, \"closed\": %lu, "
      "\"connections\": %lu}\n",
      arguments[1], sent, refused, lost, closed, connections);
  return 0;
}
