// Publishes with PCP's own library, as a program that knows nothing of the service does.
//
// usage: qv_pcp_publisher FILE FLAGS
//
// FILE is made in the folder mmv below PCP_TMP_DIR. Writes a line when the values are there, waits
// for its input to end, and leaves the file.

#include <pcp/pmapi.h>

#include <pcp/mmv_stats.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

static mmv_instances_t streams[] = {{0, "pcm0p"}, {7, "pcm1p"}};
static mmv_indom_t domains[] = {{1, 2, streams, (char*)"streams", (char*)"Streams of the card."}};

#define UNITS MMV_UNITS(0, 0, 1, 0, 0, PM_COUNT_ONE)
static mmv_metric_t metrics[] = {
    {"frames", 1, MMV_TYPE_U64, MMV_SEM_COUNTER, UNITS, 1, (char*)"frames", (char*)"All frames."},
    {"underruns", 2, MMV_TYPE_I32, MMV_SEM_COUNTER, UNITS, 1, NULL, NULL},
    {"opens", 3, MMV_TYPE_U32, MMV_SEM_COUNTER, UNITS, (__uint32_t)MMV_INDOM_NULL, NULL, NULL},
    {"drift", 4, MMV_TYPE_I64, MMV_SEM_INSTANT, UNITS, 0, NULL, NULL},
    {"load", 5, MMV_TYPE_DOUBLE, MMV_SEM_INSTANT, UNITS, 0, NULL, NULL},
    {"level", 6, MMV_TYPE_FLOAT, MMV_SEM_INSTANT, UNITS, 0, NULL, NULL},
    {"busy", 7, MMV_TYPE_ELAPSED, MMV_SEM_COUNTER, UNITS, 0, NULL, NULL},
    {"model", 8, MMV_TYPE_STRING, MMV_SEM_DISCRETE, UNITS, 0, NULL, NULL},
    {"untouched", 9, MMV_TYPE_U64, MMV_SEM_COUNTER, UNITS, 0, NULL, NULL},
    {"untouched32", 10, MMV_TYPE_I32, MMV_SEM_COUNTER, UNITS, 0, NULL, NULL},
};

int main(int count, char** arguments) {
  void* file;
  if (count != 3) return 2;
  file = mmv_stats_init(arguments[1], 0, (mmv_stats_flags_t)atoi(arguments[2]), metrics,
                        sizeof metrics / sizeof *metrics, domains, 1);
  if (file == NULL) {
    perror("mmv_stats_init");
    return 1;
  }
  mmv_stats_set(file, "frames", "pcm0p", 480);
  mmv_stats_add(file, "frames", "pcm0p", 20);
  mmv_stats_set(file, "frames", "pcm1p", 48000);
  mmv_stats_set(file, "underruns", "pcm0p", 1);
  mmv_stats_set(file, "underruns", "pcm1p", 2);
  mmv_stats_set(file, "opens", NULL, 4000000000.0);
  mmv_stats_set(file, "drift", NULL, -5);
  mmv_stats_set(file, "load", NULL, 99.5);
  mmv_stats_set(file, "level", NULL, 0.5);
  mmv_stats_set(file, "busy", NULL, 1500);
  mmv_stats_set_string(file, "model", NULL, "speaker");
  puts("published");
  fflush(stdout);
  while (getchar() != EOF) {
  }
  return 0;
}
