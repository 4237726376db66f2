#include <quietvox/quietvox.h>

int main(void) {
  QuietVoxReporter* reporter = NULL;
  QuietVoxSession* session = NULL;
  if (quietvox_reporter_open(NULL, &reporter) != QUIETVOX_OK) return 1;
  quietvox_session_open(reporter, 0, QUIETVOX_SERVICE_LONGFORMAUDIO, &session);
  quietvox_session_start(session);
  QuietVoxPayload* const message = quietvox_payload_new();
  quietvox_payload_set_int(message, "frames", 480);
  quietvox_payload_set_string(message, "route", "speaker");
  quietvox_session_send(session, message, QUIETVOX_COMPONENT_SESSION | QUIETVOX_KIND_PLAYBACK,
                        QUIETVOX_TYPE_START);
  quietvox_payload_free(message);
  quietvox_session_destroy(session);
  // Where it is not OK, quietvox_reporter_connection_error() says why.
  const int error = quietvox_reporter_flush(reporter, 5000);
  quietvox_reporter_close(reporter);
  return error == QUIETVOX_OK ? 0 : 1;
}
