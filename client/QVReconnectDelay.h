#pragma once

#include <chrono>
#include <cstdint>
#include <random>

// When to connect again: pauses that double from the shortest to the longest, each up to a quarter
// longer by chance. A connection that lasted for at least the longest pause begins anew with the
// shortest.
//
// Pure but for its own state; knows no clock. Threads: one at a time.
class QVReconnectDelay {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;

  QVReconnectDelay(std::chrono::milliseconds shortest, std::chrono::milliseconds longest,
                   uint32_t seed);

  // Not before this; at once at first.
  TimePoint nextAttempt() const { return nextAttempt_; }
  void connected(TimePoint now);
  // The attempt failed, or the connection that was made is lost.
  void failed(TimePoint now);

 private:
  const std::chrono::milliseconds shortest_;
  const std::chrono::milliseconds longest_;
  std::minstd_rand random_;
  std::chrono::milliseconds pause_;
  TimePoint nextAttempt_ = TimePoint::min();
  TimePoint connectedAt_ = TimePoint::max();  // while it is not connected
};
