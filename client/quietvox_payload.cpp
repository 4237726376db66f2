#include "client/quietvox_payload.h"

#include "client/QVClientPayload.h"
#include "client/quietvox_handles.h"

#include <new>
#include <span>
#include <string_view>

namespace {

// Sets an entry, or adds an item where there is no key.
template <class Value>
int put(QuietVoxPayload* handle, const char* key, const Value& value) {
  QVClientPayload* payload = QVFromHandle(handle);
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  if (key != nullptr) {
    payload->set(key, value);
  } else {
    payload->add(value);
  }
  return QVToErrorNumber(payload->failureCode());
}

}  // namespace

QuietVoxPayload* quietvox_payload_new(void) {
  return QVToHandle(new (std::nothrow) QVClientPayload());
}

void quietvox_payload_free(QuietVoxPayload* payload) {
  delete QVFromHandle(payload);
}

int quietvox_payload_clear(QuietVoxPayload* payload) {
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  QVFromHandle(payload)->clear();
  return QUIETVOX_OK;
}

int quietvox_payload_error(const QuietVoxPayload* payload) {
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVToErrorNumber(QVFromHandle(payload)->errorCode());
}

int quietvox_payload_set_int(QuietVoxPayload* payload, const char* key, int64_t value) {
  return put(payload, key, value);
}

int quietvox_payload_set_uint(QuietVoxPayload* payload, const char* key, uint64_t value) {
  return put(payload, key, value);
}

int quietvox_payload_set_double(QuietVoxPayload* payload, const char* key, double value) {
  return put(payload, key, value);
}

int quietvox_payload_set_bool(QuietVoxPayload* payload, const char* key, int value) {
  return put(payload, key, value != 0);
}

int quietvox_payload_set_string(QuietVoxPayload* payload, const char* key, const char* value) {
  if (value == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return put(payload, key, std::string_view(value));
}

int quietvox_payload_set_text(QuietVoxPayload* payload, const char* key, const char* bytes,
                              size_t length) {
  if (bytes == nullptr && length != 0) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return put(payload, key, std::string_view(bytes, length));
}

int quietvox_payload_set_ints(QuietVoxPayload* payload, const char* key, const int64_t* values,
                              size_t count) {
  if (values == nullptr && count != 0) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return put(payload, key, std::span<const int64_t>(values, count));
}

int quietvox_payload_set_doubles(QuietVoxPayload* payload, const char* key, const double* values,
                                 size_t count) {
  if (values == nullptr && count != 0) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return put(payload, key, std::span<const double>(values, count));
}

int quietvox_payload_begin_dictionary(QuietVoxPayload* handle, const char* key) {
  QVClientPayload* payload = QVFromHandle(handle);
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVToErrorNumber(
      (key != nullptr ? payload->beginDictionary(key) : payload->beginDictionary()).failureCode());
}

int quietvox_payload_end_dictionary(QuietVoxPayload* payload) {
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVToErrorNumber(QVFromHandle(payload)->endDictionary().failureCode());
}

int quietvox_payload_begin_array(QuietVoxPayload* handle, const char* key) {
  QVClientPayload* payload = QVFromHandle(handle);
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVToErrorNumber(
      (key != nullptr ? payload->beginArray(key) : payload->beginArray()).failureCode());
}

int quietvox_payload_end_array(QuietVoxPayload* payload) {
  if (payload == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVToErrorNumber(QVFromHandle(payload)->endArray().failureCode());
}
