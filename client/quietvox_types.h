#pragma once

// The words of the C interface: handles, errors, options and counters. See quietvox.h.

#include <stddef.h>
#include <stdint.h>

// What programs hold of the library's objects. Nothing is to be known of what lies behind.
typedef struct QuietVoxReporter QuietVoxReporter;
typedef struct QuietVoxSession QuietVoxSession;
typedef struct QuietVoxPayload QuietVoxPayload;
typedef struct QuietVoxRealtimeQueue QuietVoxRealtimeQueue;

// What functions of type int answer: QUIETVOX_OK, or one of the errors, which are negative.
#define QUIETVOX_OK 0
#define QUIETVOX_ERROR_CANNOT_CONNECT (-1)
#define QUIETVOX_ERROR_CONNECTION_LOST (-2)
#define QUIETVOX_ERROR_CLOSED (-3)
#define QUIETVOX_ERROR_QUEUE_FULL (-4)
#define QUIETVOX_ERROR_TIMED_OUT (-5)
#define QUIETVOX_ERROR_WOULD_DEADLOCK (-6)
#define QUIETVOX_ERROR_MESSAGE_TOO_LARGE (-7)
#define QUIETVOX_ERROR_INVALID_PAYLOAD (-8)
#define QUIETVOX_ERROR_OUT_OF_MEMORY (-9)
#define QUIETVOX_ERROR_REFUSED (-10)
#define QUIETVOX_ERROR_SERVICE_ERROR (-11)
#define QUIETVOX_ERROR_INVALID_REPLY (-12)
#define QUIETVOX_ERROR_DISABLED (-13)
#define QUIETVOX_ERROR_REPORTER_ID_TAKEN (-14)
#define QUIETVOX_ERROR_TOO_MANY_SESSIONS (-15)
#define QUIETVOX_ERROR_INVALID_ARGUMENT (-16)

// What became of a reporter's messages. The caller sets `size` to the size of the struct as it
// knows it; only so much is filled in. Messages that are neither sent nor dropped are queued, under
// way (at most 256, or 256 KiB), or in real-time queues; of these, the first alone are counted
// here.
typedef struct QuietVoxCounters {
  size_t size;
  uint64_t sent;                   // the service has taken them
  uint64_t droppedQueueFull;       // the service did not keep up
  uint64_t droppedDisabled;        // reporting is switched off
  uint64_t droppedConnectionLost;  // lost with the connection, or at the end
  uint64_t droppedRefused;         // the service answered with an error
  uint64_t droppedInvalid;         // not in order, or too large
  uint64_t connections;            // made to the service
  uint64_t queuedMessages;         // at this moment, steps of sessions included
  uint64_t queuedBytes;
} QuietVoxCounters;

// Told of dropped messages: how many since it was last told; the other counters are 0. Runs on the
// reporter's thread, at most once in an interval. It may call everything but
// quietvox_reporter_flush(), which answers QUIETVOX_ERROR_WOULD_DEADLOCK there.
typedef void (*QuietVoxDropCallback)(void* context, const QuietVoxCounters* dropped);

// Flags of the options. Sessions are not made anew after the service has ended; a start does it.
#define QUIETVOX_FORGET_SESSIONS 1U
// Closing does not wait for what is still to be sent.
#define QUIETVOX_END_AT_ONCE 2U

// How a reporter is to be made. The caller sets `size` to the size of the struct as it knows it.
// Everything that is 0 means the default, which is in brackets. Texts are copied.
typedef struct QuietVoxReporterOptions {
  size_t size;
  const char* socketPath;              // [$QUIETVOX_SOCKET, else /run/quietvox/reporting.socket]
  const char* configurationDirectory;  // [$QUIETVOX_CONFIGURATION_DIRECTORY, else /etc/quietvox]
  const char* runtimeDirectory;        // [$QUIETVOX_RUNTIME_DIRECTORY, else /run/quietvox]
  uint64_t maximumQueuedBytes;         // [1 MiB]
  uint64_t maximumQueuedMessages;      // [16,384]
  uint32_t flags;
  uint32_t shortestReconnectDelay;  // milliseconds, as are all below [250]
  uint32_t longestReconnectDelay;   // [30,000]
  uint32_t endTimeLimit;            // what closing may take [1,000]
  uint32_t realtimePeriod;          // how often real-time queues are looked at [20]
  uint32_t dropReportInterval;      // [1,000]
  QuietVoxDropCallback dropped;     // [none]
  void* context;                    // handed to `dropped`
} QuietVoxReporterOptions;
