/* Sends one message with the argument as its text, and waits for the daemon's answer. For C99:
 *
 *     cc -std=c99 main.c $(pkg-config --cflags --libs veskreporting)
 */
#include <VeskReporting/veskreporting.h>
#include <stdio.h>

/* Prints the cause of a failure and frees the result. */
static int failed(const char* what, vesk_status status, vesk_result* result) {
  fprintf(stderr, "c_client: %s: %s %s\n", what, vesk_status_text(status), vesk_result_detail(result));
  vesk_result_free(result);
  return 1;
}

static int report(vesk_session* session, const char* text) {
  /* The user's consent and the storebag's rules for this client apply. */
  const vesk_identity identity = {.size = sizeof identity, .client_type = 5, .client_name = "Camera"};
  vesk_status status = vesk_session_identify(session, &identity);
  if (status != VESK_QUEUED) return failed("not configured", status, NULL);

  /* A service would pass a completion, or null, and not wait. */
  vesk_result* result = NULL;
  status = vesk_session_start_wait(session, 20000, &result);
  if (status != VESK_DONE) return failed("not started", status, result);
  if (!vesk_result_accepted(result)) return failed("no storebag for the client type", status, result);
  vesk_result_free(result);

  vesk_dictionary* payload = vesk_dictionary_new();
  const int isBuilt = vesk_dictionary_set_text(payload, "text", text) == VESK_DONE &&
                      vesk_dictionary_set_integer(payload, "frames", 240) == VESK_DONE;
  status = isBuilt ? vesk_session_send_wait(session, 3, 1, vesk_dictionary_view(payload), 5000, &result)
                   : VESK_OUT_OF_RESOURCES;
  vesk_dictionary_free(payload);
  if (status != VESK_DONE) return failed("not sent", status, isBuilt ? result : NULL);
  puts(vesk_result_text(result) ? vesk_result_text(result) : "accepted");
  vesk_result_free(result);
  return 0;
}

int main(int argc, char** argv) {
  vesk_session* session = vesk_session_new(NULL);
  const int status = report(session, argc > 1 ? argv[1] : "hello");
  vesk_session_free(session); /* waits until the daemon has taken what is queued */
  return status;
}
