#include "QVServices/Statistics/Service/QVReportingBlockThrottleTimerWrapper.h"

#include <algorithm>
#include <chrono>
#include <cmath>

void QVReportingBlockThrottleTimerWrapper::sleepFor(double seconds) {
  timer_->fireAfter(durationFromSeconds(seconds));
}

QVDuration QVReportingBlockThrottleTimerWrapper::durationFromSeconds(double seconds) {
  using Seconds = std::chrono::duration<double>;
  if (std::isnan(seconds)) return QVDuration::zero();
  constexpr double kLongest = Seconds(QVRunLoopTimer::kLongestDelay).count();
  return std::chrono::duration_cast<QVDuration>(Seconds(std::clamp(seconds, -kLongest, kLongest)));
}
