/* Reports one message and prints what the daemon answered. */
#include <stdio.h>
#include <veltra/veltra.h>

int main(void) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = true, options.client_type = 7, options.client_name = "hello";
  char* error = NULL;
  veltra_session* session = veltra_session_create(&options, NULL, &error);
  if (!session) return fprintf(stderr, "hello: %s\n", error), veltra_free(error), 1;
  veltra_session_start_wait(session, NULL);
  veltra_value* payload = veltra_dictionary();
  veltra_dictionary_set(payload, "greeting", veltra_string("hello"));
  veltra_reply* reply = NULL;
  veltra_session_send_wait(session, 5, 1, payload, 0, &reply);
  const char* text = veltra_reply_text(reply, NULL);
  printf("%s\n", text ? text : "no answer");
  veltra_reply_release(reply), veltra_release(payload);
  return (int)veltra_session_close(session);
}
