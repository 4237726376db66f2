#pragma once

// Messages and configurations of the C interface, put together entry by entry:
//
//   quietvox_payload_set_int(payload, "frames", 480);
//   quietvox_payload_begin_array(payload, "levels");
//   quietvox_payload_set_double(payload, NULL, -3.5);
//   quietvox_payload_end_array(payload);
//
// In a dictionary, the outermost one included, every entry has a key; an item of an array has none,
// which is a null pointer. Texts are UTF-8. Of entries with the same key the last one counts.
//
// Every function that changes a payload answers QUIETVOX_OK or the payload's first error, which
// sticks: after it nothing more is taken in until the payload is cleared, and sending it answers
// the same error. So a whole payload is written without looking.
//
// Threads: a payload is used by one thread at a time. Sending copies it; it may be changed then.
// Real-time safe are the functions so marked [rt] with a payload of quietvox_realtime_begin(), and
// with one of quietvox_payload_new() that has held as much before.
// Limits: 8 MiB; 20 dictionaries or 30 arrays within each other.

#include "QVClientExport.h"
#include "quietvox_types.h"

#ifdef __cplusplus
extern "C" {
#endif

// A new, empty payload, which the caller frees; null where there is no memory.
QV_CLIENT_API QuietVoxPayload* quietvox_payload_new(void);
// Frees a payload of quietvox_payload_new(), or nothing where it is null.
QV_CLIENT_API void quietvox_payload_free(QuietVoxPayload* payload);

// [rt] Empty again and without error; keeps its memory.
QV_CLIENT_API int quietvox_payload_clear(QuietVoxPayload* payload);
// [rt] Why it cannot be sent: its first error, or that something is still open.
QV_CLIENT_API int quietvox_payload_error(const QuietVoxPayload* payload);

// [rt] An entry of the innermost dictionary, or an item of the innermost array.
QV_CLIENT_API int quietvox_payload_set_int(QuietVoxPayload* payload, const char* key,
                                           int64_t value);
QV_CLIENT_API int quietvox_payload_set_uint(QuietVoxPayload* payload, const char* key,
                                            uint64_t value);
QV_CLIENT_API int quietvox_payload_set_double(QuietVoxPayload* payload, const char* key,
                                              double value);
// [rt] Everything but 0 is true.
QV_CLIENT_API int quietvox_payload_set_bool(QuietVoxPayload* payload, const char* key, int value);
// [rt] A text that ends with NUL.
QV_CLIENT_API int quietvox_payload_set_string(QuietVoxPayload* payload, const char* key,
                                              const char* value);
// [rt] A text of that many bytes, none of them NUL.
QV_CLIENT_API int quietvox_payload_set_text(QuietVoxPayload* payload, const char* key,
                                            const char* bytes, size_t length);
// [rt] Arrays of numbers.
QV_CLIENT_API int quietvox_payload_set_ints(QuietVoxPayload* payload, const char* key,
                                            const int64_t* values, size_t count);
QV_CLIENT_API int quietvox_payload_set_doubles(QuietVoxPayload* payload, const char* key,
                                               const double* values, size_t count);

// [rt] A dictionary or an array within, open until it is ended.
QV_CLIENT_API int quietvox_payload_begin_dictionary(QuietVoxPayload* payload, const char* key);
QV_CLIENT_API int quietvox_payload_end_dictionary(QuietVoxPayload* payload);
QV_CLIENT_API int quietvox_payload_begin_array(QuietVoxPayload* payload, const char* key);
QV_CLIENT_API int quietvox_payload_end_array(QuietVoxPayload* payload);

#ifdef __cplusplus
}
#endif
