#pragma once

#include "platform/QVClock.h"

#include <chrono>
#include <cstdint>
#include <string>

// The event store's time: microseconds since the epoch.
inline int64_t QVEventStoreTime(const QVClock& clock) {
  return std::chrono::duration_cast<std::chrono::microseconds>(
             clock.currentDate().time_since_epoch())
      .count();
}

// What the rows of one Beacon session share. Constant but for the writer's own members.
struct QVEventSession {
  int64_t sessionID = 0;
  std::string token{};
  int64_t clientType = 0;
  double clientVersion = 0;
  bool batchEvent = false;
  bool containsRealtimeEvents = false;
  bool single = false;  // stands for one message without a session; gets no row of its own
  std::string clientName{};
  std::string serviceName{};

  // Touched by the writer's thread only: the session's row, and which database it was written to
  // (the writer counts them from 1, since a damaged one is replaced).
  int64_t row = 0;
  uint64_t database = 0;
};
