// How a QVReportingSession numbers, records and sends messages.

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingBeaconClient.h"
#include "QVServices/Statistics/Service/QVReportingPayloads.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "QVServices/Statistics/Service/QVReportingSessionLog.h"
#include "platform/QVPlatform.h"

#include <chrono>
#include <utility>

namespace {

constexpr uint32_t kTraceMessageSent = 0x21042838;

// Alarms go off at the same moment on every device; their messages are spread over a minute.
constexpr uint32_t kAlarmsDelayBoundSeconds = 60;

constexpr const char* kSendFunction = "-[QVReportingSession sendMessage:category:type:sync:reply:]";
constexpr const char* kSendSingleFunction =
    "+[QVReportingSession sendSingleMessage:category:type:serviceType:userInfo:reply:]";

QVPlatform& platform() {
  return QVPlatform::shared();
}
QVLog& log() {
  return *platform().log;
}
const QVLogScope* scope() {
  return QVReportingSessionLog::scope();
}

// The part of a category that the framework gets to see.
uint16_t kindOf(uint32_t category) {
  return static_cast<uint16_t>(category & kQVReportingCategoryKindMask);
}

// Log lines print the category as a signed number.
int32_t signedReading(uint32_t category) {
  return static_cast<int32_t>(category);
}

void sendSingleMessageNow(const QVDictionary& message, uint32_t category, uint16_t type,
                          uint16_t serviceType, QVReportingSession::SendReply& reply) {
  platform().tracePoints->mark(kTraceMessageSent);
  log().verbose(scope(), kSendSingleFunction, "sending single message");
  const QVDictionary sessionInfo{
      {kBeaconSessionInfoClientType, QVReportingBeaconClient::kType},
      {kBeaconSessionInfoClientVersion, QVReportingBeaconClient::version()},
      {kBeaconSessionInfoSessionID, QVReportingBeaconClient::kNoSessionID}};
  const QVDictionary userInfo{
      {kBeaconUserInfoClientName, QVReportingBeaconClient::kName},
      {kBeaconUserInfoServiceName, QVText(QVReportingServiceTypeName(serviceType))}};
  std::optional<QVError> error;
  if (platform().beacon->sendOneMessageWithSessionInfo(sessionInfo, userInfo, kindOf(category),
                                                       type, QVReportingNormalisedPayload(message),
                                                       error)) {
    error.reset();
    log().verbose(scope(), kSendSingleFunction, "message ", message, " : category ",
                  signedReading(category), " : type ", type);
  } else if (error) {
    log().error(scope(), kSendSingleFunction, "sendOneMessageWithSessionInfo ",
                error->description());
  }
  if (reply) reply(std::move(error));
}

// Of a message of this identifier, BASE_COUNT.
void record(const QVReportingSession& session, const QVDictionary& payload, std::string_view base,
            uint32_t count) {
  const auto aggregated = session.aggregatedPayloadData();
  const auto nested = session.nestedAggregatedPayloadData();
  // Both are there or, after a stop, neither.
  if (aggregated == nullptr || nested == nullptr) return;
  if (const auto position = aggregated->append(payload)) {
    nested->append(base, count, *position);
  }
}

}  // namespace

// What a message is called in the session's file: BASE_COUNT.
struct QVReportingSession::MessageIdentifier {
  std::string base;  // CATEGORY_TYPE
  uint32_t count;
};

// One message on its way to the framework session.
struct QVReportingSession::Message {
  QVDictionary payload;   // normalised
  QVDictionary original;  // as received
  uint32_t category;
  uint16_t type;
  bool started;  // was the session, when the message was sent?
};

void QVReportingSession::sendMessage(const QVDictionary& message, uint32_t category, uint16_t type,
                                     SendReply reply) {
  sendMessage(message, category, type, false, std::move(reply));
}

void QVReportingSession::sendMessage(const QVDictionary& message, uint32_t category, uint16_t type,
                                     [[maybe_unused]] bool sync, SendReply reply) {
  sendMessage(message, QVReportingNormalisedPayload(message), category, type);
  if (reply) reply(std::nullopt);
}

void QVReportingSession::sendMessage(const QVDictionary& message, const QVDictionary& payload,
                                     uint32_t category, uint16_t type) {
  log().verbose(scope(), kSendFunction, "sending message for session owned by ", reporterID_);
  Message outgoing{payload, message, category, type, false};
  const MessageIdentifier identifier = nextIdentifier(category, type);
  record(*this, outgoing.payload, identifier.base, identifier.count);
  platform().tracePoints->mark(kTraceMessageSent);
  outgoing.started = started_;
  beaconQueue_->async([self = shared_from_this(), outgoing = std::move(outgoing)] {
    self->sendOnBeaconQueue(outgoing);
  });
}

void QVReportingSession::makeEmptyPayloadArrays() {
  const auto store = std::make_shared<QVReportingPayloadStore>(
      maximumBytes_, [reporterID = reporterID_, maximumBytes = maximumBytes_] {
        log().error(scope(), kSendFunction, "messages of reporter ", reporterID, " take ",
                    maximumBytes, " bytes, no more are collected");
      });
  replacePayloadArrays(std::make_shared<QVReportingPayloadArray>(store),
                       std::make_shared<QVReportingPayloadArray>(store));
}

void QVReportingSession::sendOnBeaconQueue(const Message& message) {
  if (!message.started) {
    log().verbose(scope(), kSendFunction, "session not started, will send as a single message");
    sendSingleMessage(message.payload, message.category, message.type, serviceType(), userInfo(),
                      {});
    return;
  }
  if (serviceType() == kQVReportingServiceTypeTest) {
    log().info(scope(), kSendFunction, "transactions aren't allowed on this platform");
    return;
  }
  if (beaconSession_ == nullptr) {
    const QVError missing{
        "net.quillon.platform", -1, {{QVError::kFailureReason, "No valid BeaconSession"}}};
    log().error(scope(), kSendFunction, missing.description());
    return;
  }
  std::optional<QVError> frameworkError;
  if (beaconSession_->sendMessageWithCategory(kindOf(message.category), message.type,
                                              message.payload, frameworkError)) {
    log().verbose(scope(), kSendFunction, "BeaconAgent ", beaconSession_->description(),
                  " : message ", message.original, " : category ", signedReading(message.category),
                  " : type ", message.type);
  }
  // A refused message is neither retried nor logged: the service's clients are not told either,
  // and the framework accounts for what it refuses.
}

void QVReportingSession::sendSingleMessage(const QVDictionary& message, uint32_t category,
                                           uint16_t type, uint16_t serviceType,
                                           [[maybe_unused]] const QVDictionary& userInfo,
                                           SendReply reply) {
  const int64_t delay = serviceType == kQVReportingServiceTypeAlarms
                            ? platform().random->uniform(kAlarmsDelayBoundSeconds)
                            : 0;
  log().verbose(scope(), kSendSingleFunction, "sending single message after delta ", delay,
                " for service ", serviceType);
  platform().queues->backgroundQueue()->asyncAfter(
      std::chrono::seconds(delay),
      [message, category, type, serviceType, reply = std::move(reply)]() mutable {
        sendSingleMessageNow(message, category, type, serviceType, reply);
      });
}

QVReportingSession::MessageIdentifier QVReportingSession::nextIdentifier(uint32_t category,
                                                                         uint16_t type) {
  std::string base = QVReportingCategoryName(category);
  base += '_';
  base += QVReportingMessageTypeName(type);
  const uint32_t count = ++messageTypeCounts_[base];
  return {std::move(base), count};
}

std::string QVReportingSession::messageIdForCategory(uint32_t category, uint16_t type) {
  const MessageIdentifier identifier = nextIdentifier(category, type);
  return QVText(identifier.base, '_', identifier.count);
}
