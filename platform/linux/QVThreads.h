#pragma once

#include "platform/QVWorkQueue.h"

#include <string_view>

// The niceness, relative to the process's, of threads that serve work of this quality;
// `relativePriority` (0 or negative) makes it nicer.
int QVNicenessForQuality(QVQualityOfService quality, int32_t relativePriority) noexcept;

// Makes the calling thread one of the service's own: gives it a name (the kernel keeps 15 bytes), a
// niceness (relative to the process's) where the process may set it, and keeps asynchronous signals
// away from it, so that they reach the thread that handles them and no system call of this one is
// interrupted or, by SIGPIPE, fatal. Never fails visibly.
void QVPrepareThread(std::string_view name, int niceness) noexcept;
