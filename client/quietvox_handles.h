#pragma once

#include "client/QVClientError.h"
#include "client/quietvox_types.h"

class QVClientPayload;
class QVRealtimeQueue;
class QVReporter;
class QVReporterSession;

// Between the C interface's handles and errors and the objects and codes that they stand for. Pure;
// any thread.

inline QVClientPayload* QVFromHandle(QuietVoxPayload* handle) {
  return reinterpret_cast<QVClientPayload*>(handle);
}
inline const QVClientPayload* QVFromHandle(const QuietVoxPayload* handle) {
  return reinterpret_cast<const QVClientPayload*>(handle);
}
inline QVReporter* QVFromHandle(QuietVoxReporter* handle) {
  return reinterpret_cast<QVReporter*>(handle);
}
inline const QVReporter* QVFromHandle(const QuietVoxReporter* handle) {
  return reinterpret_cast<const QVReporter*>(handle);
}
inline QVReporterSession* QVFromHandle(QuietVoxSession* handle) {
  return reinterpret_cast<QVReporterSession*>(handle);
}
inline const QVReporterSession* QVFromHandle(const QuietVoxSession* handle) {
  return reinterpret_cast<const QVReporterSession*>(handle);
}
inline QVRealtimeQueue* QVFromHandle(QuietVoxRealtimeQueue* handle) {
  return reinterpret_cast<QVRealtimeQueue*>(handle);
}

inline QuietVoxPayload* QVToHandle(QVClientPayload* payload) {
  return reinterpret_cast<QuietVoxPayload*>(payload);
}
inline QuietVoxReporter* QVToHandle(QVReporter* reporter) {
  return reinterpret_cast<QuietVoxReporter*>(reporter);
}
inline QuietVoxSession* QVToHandle(QVReporterSession* session) {
  return reinterpret_cast<QuietVoxSession*>(session);
}
inline QuietVoxRealtimeQueue* QVToHandle(QVRealtimeQueue* queue) {
  return reinterpret_cast<QuietVoxRealtimeQueue*>(queue);
}

inline int QVToErrorNumber(QVClientError::Code code) {
  return -static_cast<int>(code);
}
