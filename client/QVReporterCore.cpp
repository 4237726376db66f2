#include "client/QVReporterCore.h"

#include <cstdlib>
#include <utility>

namespace {

std::string directory(const std::string& given, const char* variable, const char* usual) {
  if (!given.empty()) return given;
  // A program with more rights than its caller does not let the caller choose.
  const char* fromEnvironment = secure_getenv(variable);
  const bool named = fromEnvironment != nullptr && *fromEnvironment != '\0';
  return named ? fromEnvironment : usual;
}

}  // namespace

QVReporterCore::QVReporterCore(QVReporterOptions given)
    : options(std::move(given)),
      reportingSwitch(directory(options.configurationDirectory, kQVReporterConfigurationVariable,
                                kQVReporterDefaultConfiguration),
                      directory(options.runtimeDirectory, kQVReporterRuntimeVariable,
                                kQVReporterDefaultRuntime)),
      queue(options.maximumQueuedBytes, options.maximumQueuedMessages),
      ledger(options.dropped, options.dropReportInterval) {}

QVClientError::Code QVReporterCore::send(QVReporterSessionState* session,
                                         const QVClientPayload& message, QVClientCategory category,
                                         QVClientMessageType type) {
  using Code = QVClientError::Code;
  if (isReportingOff()) {
    countDrop(QVDropReason::disabled);
    return Code::disabled;
  }
  Code code = message.errorCode();
  if (code == Code::none) {
    code = take({.kind = QVReporterRecord::Kind::message,
                 .type = static_cast<uint16_t>(type),
                 .category = category.word,
                 .session = session,
                 .payload = message.entries()});
    if (code == Code::none) return code;
  }
  const bool isInvalid = code != Code::queueFull && code != Code::outOfMemory;
  countDrop(code == Code::closed ? QVDropReason::connectionLost
            : isInvalid          ? QVDropReason::invalid
                                 : QVDropReason::queueFull);
  return code;
}

QVClientError::Code QVReporterCore::take(const QVReporterRecord& record) {
  bool mustWake = false;
  const QVClientError::Code code = queue.push(record, mustWake);
  if (mustWake) bell.ring();
  return code;
}

void QVReporterCore::countDrop(QVDropReason reason, uint64_t count) {
  if (ledger.countDrop(reason, count)) bell.ring();
}
