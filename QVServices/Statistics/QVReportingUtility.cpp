#include "QVServices/Statistics/QVReportingUtility.h"

#include "platform/QVPlatform.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <mutex>

QVDuration QVReportingDurationFromSeconds(double seconds) {
  using Seconds = std::chrono::duration<double>;
  constexpr double kLongest = Seconds(std::chrono::hours{24 * 365}).count();
  if (std::isnan(seconds)) return QVDuration::zero();
  return std::chrono::duration_cast<QVDuration>(Seconds(std::clamp(seconds, -kLongest, kLongest)));
}

bool QVReportingUtilityWait(QVCondition& condition, const bool& flag,
                            std::string_view waitingMessage, std::string_view failureMessage,
                            const QVLogScope* scope, double timeout) {
  constexpr const char* kFunction = "QVReportingUtilityWait";
  QVLog& log = *QVPlatform::shared().log;
  const QVDuration period = QVReportingDurationFromSeconds(timeout);
  const std::lock_guard lock(condition);
  while (!flag) {
    log.standard(scope, kFunction, waitingMessage);
    if (!condition.waitForTimeout(period)) {
      log.error(scope, kFunction, failureMessage);
      return false;
    }
    log.standard(scope, kFunction, "continuing");
  }
  return true;
}

bool QVReportingIsInternalBuild() {
  static QVOncePerPlatform<bool> isInternalBuild;
  return isInternalBuild.get([] {
    return QVPlatform::shared().deviceInformation->booleanAnswer("InternalBuild").value_or(false);
  });
}
