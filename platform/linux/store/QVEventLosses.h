#pragma once

#include <cstdint>
#include <map>
#include <string>

// Events that were lost, counted by cause until the counts are stored. A value.
using QVEventLosses = std::map<std::string, int64_t, std::less<>>;

// The store could not be opened when the event came.
inline constexpr const char* kLossUnavailable = "store_unavailable";
// The disk was full, or failed, or another program held the database, for longer than events could
// be kept in memory; the last is any other failure of the database, or the want of a thread.
inline constexpr const char* kLossFull = "store_full";
inline constexpr const char* kLossInputOutput = "store_io_error";
inline constexpr const char* kLossBusy = "store_busy";
inline constexpr const char* kLossFailed = "store_error";
// The oldest rows, removed to keep the file within its limit.
inline constexpr const char* kLossLimit = "store_limit";
// One event that is larger than the whole store may be.
inline constexpr const char* kLossTooLarge = "row_too_large";
