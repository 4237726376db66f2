#pragma once

#include "platform/QVLog.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <utility>

// Steps of what has to be finished whatever goes wrong on the way, such as the end of a session or
// a pass of the throttle's thread.

// Logs the exception that is being handled as one error line: "failed to WHAT NUMBER: REASON", or
// without the number where there is none. Where there is no memory for the line either, it is lost.
void QVReportingLogFailure(const QVLogScope* scope, const QVLogSite& site, std::string_view what,
                           std::optional<int64_t> number) noexcept;

// Runs one step; what it throws is logged as above, and whoever called goes on.
template <class Step>
void QVReportingRunStep(const QVLogScope* scope, const QVLogSite& site, std::string_view what,
                        std::optional<int64_t> number, Step&& step) noexcept {
  try {
    std::forward<Step>(step)();
  } catch (...) {
    QVReportingLogFailure(scope, site, what, number);
  }
}
