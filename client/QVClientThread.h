#pragma once

#include "client/QVClientError.h"

#include <functional>
#include <thread>

// Starts a thread of the library's in `thread`, with all signals blocked: the program's handlers
// run on the program's threads. Answers cannotConnect where the system has none,
// outOfMemory. Any thread.
QVClientError QVClientStartThread(std::thread& thread, std::function<void()> body);
