#pragma once

// Reports to the QuietVox service, from C99 and from everything that can call C:
//
//   QuietVoxReporter* reporter = NULL;
//   QuietVoxSession* session = NULL;
//   quietvox_reporter_open(NULL, &reporter);
//   quietvox_session_open(reporter, 0, QUIETVOX_SERVICE_LONGFORMAUDIO, &session);
//   quietvox_session_start(session);
//   quietvox_session_send(session, payload, category, type);
//   quietvox_session_destroy(session);
//   quietvox_reporter_close(reporter);
//
// Nothing that is sent waits for the service: it goes through a bounded queue, which a thread of
// the library's works off. It connects when there is first something to send, and again after the
// service has ended; sessions are then made anew. What does not reach the service is counted.
// client/README.md says more.
//
// Handles are made by functions that answer them through a pointer, which is null where they fail,
// and belong to the caller. Null handles are answered with QUIETVOX_ERROR_INVALID_ARGUMENT, by what
// frees with nothing. No exception and no signal comes out of here.
//
// Threads: every function may be called on any thread, with the same handle at once, but those that
// free a handle, which come last, and those of a payload. Real-time safe, without a lock, memory,
// a system call or waiting, are the functions so marked [rt].

#include "QVClientExport.h"
#include "quietvox_payload.h"
#include "quietvox_types.h"
#include "quietvox_vocabulary.h"

#ifdef __cplusplus
extern "C" {
#endif

// [rt] What an error means, in a few words that are never freed; also for numbers that are none.
QV_CLIENT_API const char* quietvox_error_text(int error);

// Opens a reporter, with the defaults where `options` is null. Connects to nothing yet. Answers
// INVALID_ARGUMENT for options out of their limits, without a size or with flags that there are
// not; CANNOT_CONNECT without descriptors or threads, OUT_OF_MEMORY. After a fork, only the parent
// may use it.
QV_CLIENT_API int quietvox_reporter_open(const QuietVoxReporterOptions* options,
                                         QuietVoxReporter** reporter);
// Waits up to `endTimeLimit` for what is still to be sent, and frees the reporter. Its sessions
// stop. Handles of sessions and real-time queues stay valid; what they are asked for answers
// CLOSED.
QV_CLIENT_API void quietvox_reporter_close(QuietVoxReporter* reporter);
// Waits until everything that was sent before has been taken by the service or dropped. Answers
// TIMED_OUT, WOULD_DEADLOCK in a drop callback.
QV_CLIENT_API int quietvox_reporter_flush(QuietVoxReporter* reporter, uint32_t milliseconds);
// Fills in what `counters->size` has room for. Answers INVALID_ARGUMENT for a size that was
// not set.
QV_CLIENT_API int quietvox_reporter_counters(QuietVoxReporter* reporter,
                                             QuietVoxCounters* counters);
// What keeps the reporter from the service, as a socket that this program may not open: what the
// last attempt to connect said, or the loss of the connection; OK while there is a connection, and
// before one was needed. Writes what happened, for people, into `text` where it is not null: ended
// by NUL, cut to `bytes`.
QV_CLIENT_API int quietvox_reporter_connection_error(const QuietVoxReporter* reporter, char* text,
                                                     size_t bytes);
// [rt] 1 or 0: what the reporting switch says, as it was last read; an error for a null handle.
QV_CLIENT_API int quietvox_reporter_is_reporting_enabled(const QuietVoxReporter* reporter);
// Sends a message to every started session of every program, as quietvox_session_send().
QV_CLIENT_API int quietvox_reporter_send_to_every_session(QuietVoxReporter* reporter,
                                                          const QuietVoxPayload* message,
                                                          uint32_t category, uint16_t type);

// Opens a session, which is not started yet. `reporterID` 0 lets the library pick one. Answers
// REPORTER_ID_TAKEN, TOO_MANY_SESSIONS, QUEUE_FULL, OUT_OF_MEMORY.
QV_CLIENT_API int quietvox_session_open(QuietVoxReporter* reporter, int64_t reporterID,
                                        uint16_t serviceType, QuietVoxSession** session);
// Destroys the session, which stops it, and frees the handle.
QV_CLIENT_API void quietvox_session_destroy(QuietVoxSession* session);
// [rt] 0 for a null handle.
QV_CLIENT_API int64_t quietvox_session_reporter_id(const QuietVoxSession* session);

// The steps of a session's life, and its messages: worked off in the order in which they come. They
// answer QUEUE_FULL, OUT_OF_MEMORY, CLOSED, MESSAGE_TOO_LARGE or INVALID_PAYLOAD where they were
// not taken in; messages also DISABLED while reporting is switched off. A message that is not taken
// in is counted as dropped.
QV_CLIENT_API int quietvox_session_set_service_type(QuietVoxSession* session, uint16_t serviceType);
// Adds entries to the session's configuration; at most 64 KiB.
QV_CLIENT_API int quietvox_session_configure(QuietVoxSession* session,
                                             const QuietVoxPayload* configuration);
QV_CLIENT_API int quietvox_session_start(QuietVoxSession* session);
QV_CLIENT_API int quietvox_session_send(QuietVoxSession* session, const QuietVoxPayload* message,
                                        uint32_t category, uint16_t type);
QV_CLIENT_API int quietvox_session_stop(QuietVoxSession* session);

// Opens a queue for one thread that must never wait: of 1 to 65,536 messages (rounded up to a power
// of 2) with payloads of 64 to 65,536 bytes, 64 MiB in all. Answers INVALID_ARGUMENT,
// OUT_OF_MEMORY, CLOSED, or QUEUE_FULL beyond 1,024 queues or 128 MiB of one reporter, those closed
// and not sent yet included.
QV_CLIENT_API int quietvox_realtime_open(QuietVoxSession* session, size_t messages,
                                         size_t bytesPerMessage, QuietVoxRealtimeQueue** queue);
// Frees the queue; what was committed is still sent.
QV_CLIENT_API void quietvox_realtime_close(QuietVoxRealtimeQueue* queue);
// [rt] The next message's payload, empty, which is the queue's own. Null where the message would be
// dropped: reporting is off, the queue is full, or its session or reporter is gone. One thread at a
// time, as the next.
QV_CLIENT_API QuietVoxPayload* quietvox_realtime_begin(QuietVoxRealtimeQueue* queue);
// [rt] Hands over what was begun. Answers INVALID_PAYLOAD where it is not in order or did not fit,
// or nothing was begun; CLOSED where its session or reporter is gone.
QV_CLIENT_API int quietvox_realtime_commit(QuietVoxRealtimeQueue* queue, uint32_t category,
                                           uint16_t type);

#ifdef __cplusplus
}
#endif
