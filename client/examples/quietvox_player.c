// A player without sound, in plain C: reports a session, and every tenth period of its audio
// callback through a real-time queue.

#include "client/quietvox.h"

#include <stdio.h>
#include <stdlib.h>

#define PERIOD_FRAMES 480
#define PERIODS_A_MESSAGE 10
#define MAXIMUM_PERIODS 1000000
#define PATIENCE_MS 5000
#define CATEGORY(kind) (QUIETVOX_COMPONENT_SESSION + (kind))

// What an audio system calls, on a thread that must never wait, for the next period's samples.
static void playPeriod(QuietVoxRealtimeQueue* queue, long period) {
  QuietVoxPayload* message;
  if (period % PERIODS_A_MESSAGE != 0) return;
  message = quietvox_realtime_begin(queue);
  if (message == NULL) return;
  quietvox_payload_set_int(message, "frames", (int64_t)period * PERIOD_FRAMES);
  quietvox_payload_set_int(message, "xruns", 0);
  quietvox_payload_set_double(message, "volume", 0.8);
  quietvox_realtime_commit(queue, CATEGORY(QUIETVOX_KIND_PERFORMANCE), QUIETVOX_TYPE_GENERIC);
}

static int configure(QuietVoxSession* session) {
  QuietVoxPayload* configuration = quietvox_payload_new();
  int error;
  quietvox_payload_set_string(configuration, "HostApplicationDisplayID", "net.example.player");
  quietvox_payload_set_int(configuration, "sample_rate", 48000);
  quietvox_payload_begin_array(configuration, "channels");
  quietvox_payload_set_string(configuration, NULL, "left");
  quietvox_payload_set_string(configuration, NULL, "right");
  quietvox_payload_end_array(configuration);
  error = quietvox_session_configure(session, configuration);
  quietvox_payload_free(configuration);
  return error;
}

static int sendPlayback(QuietVoxSession* session, uint16_t type, long periods) {
  QuietVoxPayload* message = quietvox_payload_new();
  int error;
  quietvox_payload_set_int(message, "frames", (int64_t)periods * PERIOD_FRAMES);
  error = quietvox_session_send(session, message, CATEGORY(QUIETVOX_KIND_PLAYBACK), type);
  quietvox_payload_free(message);
  return error;
}

static int play(QuietVoxSession* session, QuietVoxRealtimeQueue* queue, long periods) {
  int error = configure(session);
  long period;
  if (error == QUIETVOX_OK) error = quietvox_session_start(session);
  if (error == QUIETVOX_OK) error = sendPlayback(session, QUIETVOX_TYPE_START, 0);
  for (period = 1; error == QUIETVOX_OK && period <= periods; ++period) playPeriod(queue, period);
  if (error == QUIETVOX_OK) error = sendPlayback(session, QUIETVOX_TYPE_STOP, periods);
  if (error == QUIETVOX_OK) error = quietvox_session_stop(session);
  return error;
}

static int report(QuietVoxReporter* reporter, long periods) {
  QuietVoxSession* session = NULL;
  QuietVoxRealtimeQueue* queue = NULL;
  int error = quietvox_session_open(reporter, 0, QUIETVOX_SERVICE_LONGFORMAUDIO, &session);
  if (error == QUIETVOX_OK) error = quietvox_realtime_open(session, 1024, 512, &queue);
  if (error == QUIETVOX_OK) error = play(session, queue, periods);
  quietvox_realtime_close(queue);
  quietvox_session_destroy(session);
  if (error == QUIETVOX_OK) error = quietvox_reporter_flush(reporter, PATIENCE_MS);
  return error;
}

static void printCounters(QuietVoxReporter* reporter) {
  QuietVoxCounters counters;
  uint64_t dropped;
  counters.size = sizeof counters;
  if (quietvox_reporter_counters(reporter, &counters) != QUIETVOX_OK) return;
  dropped = counters.droppedQueueFull + counters.droppedDisabled + counters.droppedConnectionLost +
            counters.droppedRefused + counters.droppedInvalid;
  printf("sent %llu, dropped %llu\n", (unsigned long long)counters.sent,
         (unsigned long long)dropped);
}

int main(int argumentCount, char** arguments) {
  QuietVoxReporter* reporter = NULL;
  char* rest = NULL;
  const long periods = argumentCount > 1 ? strtol(arguments[1], &rest, 10) : 100;
  int error;
  if (periods < 1 || periods > MAXIMUM_PERIODS || (rest != NULL && *rest != '\0')) {
    fprintf(stderr, "usage: quietvox-player [PERIODS]   (1 to %d, usually 100)\n", MAXIMUM_PERIODS);
    return 2;
  }
  error = quietvox_reporter_open(NULL, &reporter);
  if (error == QUIETVOX_OK) {
    error = report(reporter, periods);
    printCounters(reporter);
  }
  quietvox_reporter_close(reporter);
  if (error == QUIETVOX_OK) return 0;
  fprintf(stderr, "quietvox-player: %s\n", quietvox_error_text(error));
  return 1;
}
