/* A program that reports, in C99, as one is built against the installed library. */

#include <quietvox/quietvox.h>
#include <stdio.h>

/* The service may have to start first. */
#define ANSWER_WITHIN_MS 60000

int main(void) {
  QuietVoxReporter* reporter = NULL;
  QuietVoxSession* session = NULL;
  QuietVoxPayload* message = quietvox_payload_new();
  int error = quietvox_reporter_open(NULL, &reporter);
  if (error == QUIETVOX_OK) {
    error = quietvox_session_open(reporter, 4711, QUIETVOX_SERVICE_NONLONGFORMAUDIO, &session);
  }
  quietvox_payload_set_int(message, "frames", 480);
  quietvox_payload_set_string(message, "language", "C");
  if (error == QUIETVOX_OK) error = quietvox_session_start(session);
  if (error == QUIETVOX_OK) {
    error = quietvox_session_send(
        session, message, QUIETVOX_COMPONENT_SESSION + QUIETVOX_KIND_PLAYBACK, QUIETVOX_TYPE_START);
  }
  if (error == QUIETVOX_OK) error = quietvox_session_stop(session);
  if (error == QUIETVOX_OK) error = quietvox_reporter_flush(reporter, ANSWER_WITHIN_MS);
  quietvox_session_destroy(session);
  quietvox_reporter_close(reporter);
  quietvox_payload_free(message);
  if (error != QUIETVOX_OK) fprintf(stderr, "%s\n", quietvox_error_text(error));
  return error == QUIETVOX_OK ? 0 : 1;
}
