/* Opens a session, starts it, sends one message and prints what the daemon answers. */
#include <stdio.h>
#include <veltra/veltra.h>

int main(void) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = true, options.client_type = 7, options.client_name = "hello";
  char* error = NULL;
  veltra_session* session = veltra_session_create(&options, NULL, &error);
  if (!session) return fprintf(stderr, "%s\n", error), veltra_free(error), 1;
  veltra_reply* reply = NULL;
  veltra_session_start(session, NULL, NULL);
  veltra_status status = veltra_session_send_wait(session, 5, 10, NULL, 0, &reply);
  const char* text =
      status == VELTRA_OK ? veltra_reply_text(reply, NULL) : veltra_reply_error_description(reply);
  puts(text ? text : "The daemon took the message.");
  return veltra_reply_release(reply), (int)veltra_session_close(session) + (status != VELTRA_OK);
}
