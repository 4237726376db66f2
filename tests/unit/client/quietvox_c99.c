// A program in plain C99, as far as a test needs one: compiled with all warnings, so that the C
// headers stay C.

#include "client/quietvox.h"

#define CATEGORY (QUIETVOX_COMPONENT_SESSION + QUIETVOX_KIND_PLAYBACK)

int quietvox_c99_fill(QuietVoxPayload* payload);
int quietvox_c99_report(QuietVoxReporter* reporter, QuietVoxRealtimeQueue** queue,
                        QuietVoxSession** session);

int quietvox_c99_fill(QuietVoxPayload* payload) {
  static const int64_t kInts[] = {1, 2};
  static const double kDoubles[] = {0.5, -60};
  quietvox_payload_set_int(payload, "int", -1);
  quietvox_payload_set_uint(payload, "uint", UINT64_MAX);
  quietvox_payload_set_double(payload, "double", 0.5);
  quietvox_payload_set_bool(payload, "bool", 2);
  quietvox_payload_set_string(payload, "string", "speaker");
  quietvox_payload_set_text(payload, "text", "pcm0", 3);
  quietvox_payload_set_ints(payload, "ints", kInts, 2);
  quietvox_payload_set_doubles(payload, "doubles", kDoubles, 2);
  quietvox_payload_begin_dictionary(payload, "device");
  quietvox_payload_set_string(payload, "name", "pcm0");
  quietvox_payload_end_dictionary(payload);
  quietvox_payload_begin_array(payload, "items");
  quietvox_payload_set_int(payload, NULL, 1);
  quietvox_payload_begin_array(payload, NULL);
  quietvox_payload_end_array(payload);
  quietvox_payload_begin_dictionary(payload, NULL);
  quietvox_payload_end_dictionary(payload);
  quietvox_payload_end_array(payload);
  return quietvox_payload_error(payload);
}

static int sendAll(QuietVoxReporter* reporter, QuietVoxSession* session, QuietVoxPayload* payload) {
  int error = quietvox_payload_set_int(payload, "n", 48000);
  if (error == QUIETVOX_OK) error = quietvox_session_configure(session, payload);
  if (error == QUIETVOX_OK) error = quietvox_session_start(session);
  quietvox_payload_clear(payload);
  quietvox_payload_set_int(payload, "n", 480);
  if (error == QUIETVOX_OK) {
    error = quietvox_session_send(session, payload, CATEGORY, QUIETVOX_TYPE_START);
  }
  quietvox_payload_clear(payload);
  quietvox_payload_set_int(payload, "n", 481);
  if (error == QUIETVOX_OK) {
    error =
        quietvox_reporter_send_to_every_session(reporter, payload, CATEGORY, QUIETVOX_TYPE_GENERIC);
  }
  return error;
}

int quietvox_c99_report(QuietVoxReporter* reporter, QuietVoxRealtimeQueue** queue,
                        QuietVoxSession** session) {
  QuietVoxPayload* payload = quietvox_payload_new();
  int error = quietvox_session_open(reporter, 7, QUIETVOX_SERVICE_TELEPHONY, session);
  if (error == QUIETVOX_OK) error = sendAll(reporter, *session, payload);
  quietvox_payload_free(payload);
  if (error == QUIETVOX_OK) error = quietvox_realtime_open(*session, 16, 256, queue);
  if (error != QUIETVOX_OK) return error;
  payload = quietvox_realtime_begin(*queue);
  quietvox_payload_set_int(payload, "n", 482);
  return quietvox_realtime_commit(*queue, CATEGORY, QUIETVOX_TYPE_GENERIC);
}
