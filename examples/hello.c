/* SPDX-License-Identifier: Apache-2.0 */
/* Opens a session, starts it, sends one message and prints the daemon's answer. */
#include <stdio.h>
#include <veltra/veltra.h>

int main(void) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = true;
  options.client_type = 7;
  options.client_name = "hello";

  char* error = NULL;
  veltra_session* session = veltra_session_create(&options, NULL, &error);
  if (session == NULL) {
    fprintf(stderr, "%s\n", error);
    veltra_free(error);
    return 1;
  }

  veltra_session_start(session, NULL, NULL);

  veltra_reply* reply = NULL;
  veltra_status status = veltra_session_send_wait(session, 5, 10, NULL, 0, &reply);
  if (status == VELTRA_OK) {
    const char* text = veltra_reply_text(reply, NULL);
    puts(text != NULL ? text : "The daemon took the message.");
  } else {
    fprintf(stderr, "%s\n", veltra_reply_error_description(reply));
  }
  veltra_reply_release(reply);

  uint64_t lost = veltra_session_close(session);
  return status == VELTRA_OK && lost == 0 ? 0 : 1;
}
