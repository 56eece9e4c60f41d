/* Opens a session, starts it, sends one message and prints what the daemon answers. */
#include <stdio.h>
#include <veltra/veltra.h>

int main(void) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.client_name = "hello";
  options.has_client_type = true, options.client_type = 7;
  char* error = NULL;
  veltra_session* session = veltra_session_create(&options, NULL, &error);
  if (!session) return fprintf(stderr, "%s\n", error), veltra_free(error), 1;
  veltra_reply* reply = NULL;
  veltra_session_start(session, NULL, NULL);
  veltra_value* payload = veltra_dictionary();
  veltra_dictionary_set(payload, "greeting", veltra_string("Hello, veltrad"));
  veltra_status status = veltra_session_send_wait(session, 5, 1, payload, 0, &reply);
  const char* answer = veltra_reply_text(reply, NULL);
  printf("%s\n", status != VELTRA_OK ? veltra_reply_error_description(reply) : answer ? answer : "(no text)");
  veltra_reply_release(reply), veltra_release(payload), veltra_session_close(session);
  return status == VELTRA_OK ? 0 : 1;
}
