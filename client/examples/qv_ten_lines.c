#include <quietvox/quietvox.h>

int main(void) {
  QuietVoxReporter* reporter = NULL;
  QuietVoxSession* session = NULL;
  const int error = quietvox_reporter_open(NULL, &reporter);
  if (error != QUIETVOX_OK) return 1;  // quietvox_error_text(error) says why
  quietvox_session_open(reporter, 0, QUIETVOX_SERVICE_LONGFORMAUDIO, &session);
  quietvox_session_start(session);
  QuietVoxPayload* const message = quietvox_payload_new();
  quietvox_payload_set_int(message, "frames", 480);
  quietvox_payload_set_string(message, "route", "speaker");
  quietvox_session_send(session, message, QUIETVOX_COMPONENT_SESSION | QUIETVOX_KIND_PLAYBACK,
                        QUIETVOX_TYPE_START);
  quietvox_payload_free(message);
  quietvox_session_destroy(session);
  quietvox_reporter_close(reporter);
  return 0;
}
