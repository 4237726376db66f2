#include "client/quietvox.h"

#include "client/QVReporter.h"
#include "client/quietvox_handles.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>
#include <utility>

namespace {

using Code = QVClientError::Code;
using std::chrono::milliseconds;

static_assert(QUIETVOX_OK == -static_cast<int>(Code::none));
static_assert(QUIETVOX_ERROR_CANNOT_CONNECT == -static_cast<int>(Code::cannotConnect));
static_assert(QUIETVOX_ERROR_CONNECTION_LOST == -static_cast<int>(Code::connectionLost));
static_assert(QUIETVOX_ERROR_CLOSED == -static_cast<int>(Code::closed));
static_assert(QUIETVOX_ERROR_QUEUE_FULL == -static_cast<int>(Code::queueFull));
static_assert(QUIETVOX_ERROR_TIMED_OUT == -static_cast<int>(Code::timedOut));
static_assert(QUIETVOX_ERROR_WOULD_DEADLOCK == -static_cast<int>(Code::wouldDeadlock));
static_assert(QUIETVOX_ERROR_MESSAGE_TOO_LARGE == -static_cast<int>(Code::messageTooLarge));
static_assert(QUIETVOX_ERROR_INVALID_PAYLOAD == -static_cast<int>(Code::invalidPayload));
static_assert(QUIETVOX_ERROR_OUT_OF_MEMORY == -static_cast<int>(Code::outOfMemory));
static_assert(QUIETVOX_ERROR_REFUSED == -static_cast<int>(Code::refused));
static_assert(QUIETVOX_ERROR_SERVICE_ERROR == -static_cast<int>(Code::serviceError));
static_assert(QUIETVOX_ERROR_INVALID_REPLY == -static_cast<int>(Code::invalidReply));
static_assert(QUIETVOX_ERROR_DISABLED == -static_cast<int>(Code::disabled));
static_assert(QUIETVOX_ERROR_REPORTER_ID_TAKEN == -static_cast<int>(Code::reporterIDTaken));
static_assert(QUIETVOX_ERROR_TOO_MANY_SESSIONS == -static_cast<int>(Code::tooManySessions));
static_assert(QUIETVOX_ERROR_INVALID_ARGUMENT == -static_cast<int>(Code::invalidArgument));

// Nothing is thrown across the interface. What is thrown at all is the lack of memory.
template <class Function>
int guarded(Function&& function) noexcept {
  try {
    return std::forward<Function>(function)();
  } catch (...) {
    return QUIETVOX_ERROR_OUT_OF_MEMORY;
  }
}

void fill(QuietVoxCounters& out, const QVDropCounts& dropped) {
  out.droppedQueueFull = dropped.of(QVDropReason::queueFull);
  out.droppedDisabled = dropped.of(QVDropReason::disabled);
  out.droppedConnectionLost = dropped.of(QVDropReason::connectionLost);
  out.droppedRefused = dropped.of(QVDropReason::refused);
  out.droppedInvalid = dropped.of(QVDropReason::invalid);
}

// Of the structs as they first were: no program has shorter ones.
constexpr std::size_t kLeastOptionsBytes =
    offsetof(QuietVoxReporterOptions, context) + sizeof(QuietVoxReporterOptions::context);
constexpr std::size_t kLeastCountersBytes =
    offsetof(QuietVoxCounters, queuedBytes) + sizeof(QuietVoxCounters::queuedBytes);

constexpr uint32_t kFlags = QUIETVOX_FORGET_SESSIONS | QUIETVOX_END_AT_ONCE;

// The caller's struct may be an older, shorter one or a newer, longer one.
QuietVoxReporterOptions completed(const QuietVoxReporterOptions& given) {
  QuietVoxReporterOptions options{};
  std::memcpy(&options, &given, std::min(given.size, sizeof options));
  return options;
}

QVReporterOptions optionsOf(const QuietVoxReporterOptions& given) {
  QVReporterOptions options;
  const auto takeText = [](std::string& text, const char* value) {
    if (value != nullptr) text = value;
  };
  const auto takeTime = [](milliseconds& time, uint32_t value) {
    if (value != 0) time = milliseconds(value);
  };
  // What is beyond the machine's sizes is beyond the limits as well.
  const auto takeSize = [](std::size_t& size, uint64_t value) {
    if (value != 0) size = static_cast<std::size_t>(std::min<uint64_t>(value, SIZE_MAX));
  };
  takeText(options.socketPath, given.socketPath);
  takeText(options.configurationDirectory, given.configurationDirectory);
  takeText(options.runtimeDirectory, given.runtimeDirectory);
  takeSize(options.maximumQueuedBytes, given.maximumQueuedBytes);
  takeSize(options.maximumQueuedMessages, given.maximumQueuedMessages);
  options.restoreSessions = (given.flags & QUIETVOX_FORGET_SESSIONS) == 0;
  takeTime(options.shortestReconnectDelay, given.shortestReconnectDelay);
  takeTime(options.longestReconnectDelay, given.longestReconnectDelay);
  takeTime(options.endTimeLimit, given.endTimeLimit);
  if ((given.flags & QUIETVOX_END_AT_ONCE) != 0) options.endTimeLimit = milliseconds::zero();
  takeTime(options.realtimePeriod, given.realtimePeriod);
  takeTime(options.dropReportInterval, given.dropReportInterval);
  if (given.dropped != nullptr) {
    options.dropped = [callback = given.dropped,
                       context = given.context](const QVDropCounts& sinceLast) {
      QuietVoxCounters counters{};
      counters.size = sizeof counters;
      fill(counters, sinceLast);
      callback(context, &counters);
    };
  }
  return options;
}

template <class Object, class Handle>
int handOver(QVClientResult<std::unique_ptr<Object>>&& made, Handle** handle) {
  if (!made) return QVToErrorNumber(made.error().code());
  *handle = QVToHandle(made.value().release());
  return QUIETVOX_OK;
}

// What a session is asked for, where there is one.
template <class Function>
int ask(QuietVoxSession* session, Function&& function) noexcept {
  if (session == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return guarded([session, &function] {
    return QVToErrorNumber(std::forward<Function>(function)(*QVFromHandle(session)));
  });
}

}  // namespace

const char* quietvox_error_text(int error) {
  const bool isCode = error <= QUIETVOX_OK && error >= QUIETVOX_ERROR_INVALID_ARGUMENT;
  return isCode ? QVClientError::textOf(static_cast<Code>(-error)) : "unknown error";
}

int quietvox_reporter_open(const QuietVoxReporterOptions* options, QuietVoxReporter** reporter) {
  if (reporter == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  *reporter = nullptr;
  return guarded([options, reporter]() -> int {
    if (options == nullptr) return handOver(QVReporter::open(), reporter);
    if (options->size < kLeastOptionsBytes) return QUIETVOX_ERROR_INVALID_ARGUMENT;
    const QuietVoxReporterOptions given = completed(*options);
    if ((given.flags & ~kFlags) != 0) return QUIETVOX_ERROR_INVALID_ARGUMENT;
    return handOver(QVReporter::open(optionsOf(given)), reporter);
  });
}

void quietvox_reporter_close(QuietVoxReporter* reporter) {
  delete QVFromHandle(reporter);
}

int quietvox_reporter_flush(QuietVoxReporter* reporter, uint32_t limit) {
  if (reporter == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return guarded([reporter, limit] {
    return QVToErrorNumber(QVFromHandle(reporter)->flush(milliseconds(limit)));
  });
}

int quietvox_reporter_counters(QuietVoxReporter* reporter, QuietVoxCounters* counters) {
  if (reporter == nullptr || counters == nullptr || counters->size < kLeastCountersBytes) {
    return QUIETVOX_ERROR_INVALID_ARGUMENT;
  }
  const QVReporterCounters now = QVFromHandle(reporter)->counters();
  QuietVoxCounters all{};
  all.size = counters->size;
  all.sent = now.sent;
  fill(all, now.dropped);
  all.connections = now.connections;
  all.queuedMessages = now.queuedMessages;
  all.queuedBytes = now.queuedBytes;
  std::memcpy(counters, &all, std::min(counters->size, sizeof all));
  return QUIETVOX_OK;
}

int quietvox_reporter_connection_error(const QuietVoxReporter* reporter, char* text, size_t bytes) {
  if (reporter == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  if (text != nullptr && bytes != 0) *text = '\0';
  return guarded([reporter, text, bytes] {
    const QVClientError error = QVFromHandle(reporter)->connectionError();
    if (text != nullptr && bytes != 0) {
      text[error.text().copy(text, bytes - 1)] = '\0';
    }
    return QVToErrorNumber(error.code());
  });
}

int quietvox_reporter_is_reporting_enabled(const QuietVoxReporter* reporter) {
  if (reporter == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return QVFromHandle(reporter)->isReportingEnabled() ? 1 : 0;
}

int quietvox_reporter_send_to_every_session(QuietVoxReporter* reporter,
                                            const QuietVoxPayload* message, uint32_t category,
                                            uint16_t type) {
  if (reporter == nullptr || message == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return guarded([reporter, message, category, type] {
    return QVToErrorNumber(QVFromHandle(reporter)->sendToEverySession(
        *QVFromHandle(message), QVClientCategory(category),
        static_cast<QVClientMessageType>(type)));
  });
}

int quietvox_session_open(QuietVoxReporter* reporter, int64_t reporterID, uint16_t serviceType,
                          QuietVoxSession** session) {
  if (session == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  *session = nullptr;
  if (reporter == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return guarded([reporter, reporterID, serviceType, session] {
    return handOver(QVFromHandle(reporter)->openSession(
                        {.reporterID = reporterID,
                         .serviceType = static_cast<QVClientServiceType>(serviceType)}),
                    session);
  });
}

void quietvox_session_destroy(QuietVoxSession* session) {
  delete QVFromHandle(session);
}

int64_t quietvox_session_reporter_id(const QuietVoxSession* session) {
  return session != nullptr ? QVFromHandle(session)->reporterID() : 0;
}

int quietvox_session_set_service_type(QuietVoxSession* session, uint16_t serviceType) {
  return ask(session, [serviceType](QVReporterSession& asked) {
    return asked.setServiceType(static_cast<QVClientServiceType>(serviceType));
  });
}

int quietvox_session_configure(QuietVoxSession* session, const QuietVoxPayload* configuration) {
  if (configuration == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return ask(session, [configuration](QVReporterSession& asked) {
    return asked.setConfiguration(*QVFromHandle(configuration));
  });
}

int quietvox_session_start(QuietVoxSession* session) {
  return ask(session, [](QVReporterSession& asked) { return asked.start(); });
}

int quietvox_session_send(QuietVoxSession* session, const QuietVoxPayload* message,
                          uint32_t category, uint16_t type) {
  if (message == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return ask(session, [message, category, type](QVReporterSession& asked) {
    return asked.sendMessage(*QVFromHandle(message), QVClientCategory(category),
                             static_cast<QVClientMessageType>(type));
  });
}

int quietvox_session_stop(QuietVoxSession* session) {
  return ask(session, [](QVReporterSession& asked) { return asked.stop(); });
}

int quietvox_realtime_open(QuietVoxSession* session, size_t messages, size_t bytesPerMessage,
                           QuietVoxRealtimeQueue** queue) {
  if (queue == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  *queue = nullptr;
  if (session == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  return guarded([session, messages, bytesPerMessage, queue] {
    return handOver(QVFromHandle(session)->makeRealtimeQueue(
                        {.messages = messages, .bytesPerMessage = bytesPerMessage}),
                    queue);
  });
}

void quietvox_realtime_close(QuietVoxRealtimeQueue* queue) {
  delete QVFromHandle(queue);
}

QuietVoxPayload* quietvox_realtime_begin(QuietVoxRealtimeQueue* queue) {
  return queue != nullptr ? QVToHandle(QVFromHandle(queue)->begin()) : nullptr;
}

int quietvox_realtime_commit(QuietVoxRealtimeQueue* queue, uint32_t category, uint16_t type) {
  if (queue == nullptr) return QUIETVOX_ERROR_INVALID_ARGUMENT;
  const bool taken = QVFromHandle(queue)->commit(QVClientCategory(category),
                                                 static_cast<QVClientMessageType>(type));
  if (taken) return QUIETVOX_OK;
  return QVFromHandle(queue)->isClosed() ? QUIETVOX_ERROR_CLOSED : QUIETVOX_ERROR_INVALID_PAYLOAD;
}
