// How a QVReportingSession follows the orientation of device and user interface.

#include "QVServices/Statistics/QVReportingUtility.h"
#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingRunStep.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "QVServices/Statistics/Service/QVReportingSessionLog.h"
#include "platform/QVPlatform.h"

#include <chrono>
#include <cmath>

namespace {

// Device class on which orientation means nothing.
constexpr int32_t kDeviceClassWithoutOrientation = 6;

constexpr std::string_view kDeviceMode = "device";
constexpr std::string_view kUIMode = "ui";

QVPlatform& platform() {
  return QVPlatform::shared();
}

std::string callbackIDOf(int64_t reporterID) {
  return QVText("QVReportingService ", reporterID);
}

// Seconds between the two, to the nearest millisecond, halves away from zero. A date that was set
// back makes no negative time.
double secondsSince(QVDate start, QVDate now) {
  const std::chrono::duration<double> elapsed = now - start;
  return std::round(std::fabs(elapsed.count()) * 1000) / 1000;
}

// On the orientation service's thread, maybe while the session is being stopped or started again.
void recordOrientation(const QVReportingSession& session, std::string_view mode,
                       int32_t orientation) {
  const QVDate now = platform().clock->currentDate();
  const double time = secondsSince(session.startDate().value_or(now), now);
  const std::string_view text = QVOrientation::textOfOrientation(orientation);
  if (QVLog::logEnabled(QVLog::kVerbose, QVReportingSessionLog::scope())) {
    const QVDictionary information = session.userInfo();
    const QVValue* application = information.find(kQVReportingHostApplicationKey);
    platform().log->verbose(QVReportingSessionLog::scope(), "-[QVReportingSession start]",
                            "Orientation handler callback mode=", mode, " orientation=\"", text,
                            "\" app=\"", application == nullptr ? QVValue() : *application,
                            "\", time=", time, ", id=\"", callbackIDOf(session.reporterID()), '"');
  }
  // Gone once the session is stopped: nothing is recorded any more.
  if (const auto recorded = session.aggregatedPayloadData()) {
    const std::string key = QVText(mode, "_orientation");
    recorded->append({{key, text}, {QVText(key, "_time"), time}});
  }
}

}  // namespace

bool QVReportingSession::shouldReportOrientation() const {
  const uint16_t type = serviceType();
  return QVReportingIsInternalBuild() &&
         (type == kQVReportingServiceTypeLongFormAudio ||
          type == kQVReportingServiceTypeTelephony) &&
         platform().deviceInformation->integerAnswer("DeviceClassNumber").value_or(0) !=
             kDeviceClassWithoutOrientation;
}

std::optional<std::string> QVReportingSession::orientationCallbackID() const {
  const std::lock_guard lock(propertiesMutex_);
  return orientationCallbackID_;
}

std::optional<QVDate> QVReportingSession::startDate() const {
  const std::lock_guard lock(propertiesMutex_);
  return startDate_;
}

void QVReportingSession::registerForOrientation() {
  // Callbacks that the last stop left, as the session did not report then, would record twice.
  unregisterFromOrientation("-[QVReportingSession start]");
  const std::string callbackID = callbackIDOf(reporterID_);
  {
    const std::lock_guard lock(propertiesMutex_);
    orientationCallbackID_ = callbackID;
    startDate_ = platform().clock->currentDate();
  }
  // The callbacks hold the session until it is stopped, also when its client has let it go.
  const auto callback = [self = shared_from_this()](std::string_view mode) {
    return [self, mode](int32_t orientation) { recordOrientation(*self, mode, orientation); };
  };
  platform().orientation->QVRegisterDeviceOrientation(callbackID, callback(kDeviceMode));
  platform().orientation->QVRegisterUIOrientation(callbackID, callback(kUIMode));
}

void QVReportingSession::unregisterFromOrientation(const QVLogSite& site) {
  std::optional<std::string> callbackID;
  {
    const std::lock_guard lock(propertiesMutex_);
    callbackID.swap(orientationCallbackID_);
  }
  if (!callbackID) return;
  const QVLogScope* const scope = QVReportingSessionLog::scope();
  QVReportingRunStep(
      scope, site, "unregister the device callback of reporter", reporterID_,
      [&callbackID] { platform().orientation->QVUnregisterDeviceOrientation(*callbackID); });
  QVReportingRunStep(
      scope, site, "unregister the UI callback of reporter", reporterID_,
      [&callbackID] { platform().orientation->QVUnregisterUIOrientation(*callbackID); });
}
