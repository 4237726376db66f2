#pragma once

#include <string>

// Ends the test program with a message: a fake was used in a way that no adapter would bear.
[[noreturn]] void QVFakeAbort(const std::string& message);
