#pragma once

#include "platform/QVLog.h"
#include "platform/QVWorkQueue.h"

#include <string_view>

// Runs an item of the queue with this label and destroys it. An exception that escapes from it is
// logged, once, and goes no further.
void QVRunWorkItem(QVWorkItem& item, std::string_view label, QVLog& log) noexcept;
