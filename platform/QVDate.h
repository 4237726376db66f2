#pragma once

#include <chrono>

// A moment of wall-clock time, and a span of steady time.
using QVDate = std::chrono::system_clock::time_point;
using QVDuration = std::chrono::nanoseconds;
