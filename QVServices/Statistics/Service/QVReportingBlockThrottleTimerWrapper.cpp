#include "QVServices/Statistics/Service/QVReportingBlockThrottleTimerWrapper.h"

#include "QVServices/Statistics/QVReportingUtility.h"

void QVReportingBlockThrottleTimerWrapper::sleepFor(double seconds) {
  timer_->fireAfter(QVReportingDurationFromSeconds(seconds));
}
