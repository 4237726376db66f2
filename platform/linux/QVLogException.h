#pragma once

#include "platform/QVLog.h"

#include <string_view>

// Logs the exception that is being handled as one error line of the default log: "exception in
// PLACE NAME: REASON". To be called by a thread's last catch.
//
// Never throws: where there is no memory for the line either, it is lost, and the thread goes on.
void QVLogException(QVLog& log, const QVLogSite& site, std::string_view place,
                    std::string_view name = {}) noexcept;
