#pragma once

#include "platform/QVCondition.h"
#include "platform/QVDate.h"
#include "platform/QVLog.h"

#include <string_view>

// Functions that sessions and the throttle need.

// Seconds as a duration: at most a year either way, and none where they are no number.
QVDuration QVReportingDurationFromSeconds(double seconds);

// Waits until `flag` is set: true once it is, false when a wait period of `timeout` seconds passes
// without a signal. Each signal that comes without the flag starts a fresh period, so the total may
// exceed one time-out. The signalling side locks `condition`, sets the flag, signals and unlocks.
//
// Writes `waitingMessage` before each period and `failureMessage` (error) after one without a
// signal to `scope` (null: the default log). Blocks the calling thread, which must not be one that
// the signalling side needs.
bool QVReportingUtilityWait(QVCondition& condition, const bool& flag,
                            std::string_view waitingMessage, std::string_view failureMessage,
                            const QVLogScope* scope, double timeout);

// Does the device run an internal build? Asks the device once per process; no answer means no. Any
// thread.
bool QVReportingIsInternalBuild();
