#pragma once

#include "client/QVReporterCounters.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>

// What became of a reporter's messages, and when its program is told of those that were dropped:
// folded, at most once in an interval.
//
// Threads: counting and reading any, at once; reporting the reporter's.
class QVReporterLedger {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;
  using Callback = std::function<void(const QVDropCounts& sinceLast)>;

  QVReporterLedger(Callback callback, std::chrono::milliseconds interval);

  void countConnection() noexcept { connections_.fetch_add(1, std::memory_order_relaxed); }
  void countSent() noexcept { sent_.fetch_add(1, std::memory_order_relaxed); }
  // True where the reporter's thread has to be told that a report is due: for the first drop since
  // the last report. A drop of the switch makes none due, so that it costs no more than the count.
  bool countDrop(QVDropReason reason, uint64_t count = 1) noexcept;
  // The same where nobody may be told: for threads that must never wait. It is told of when the
  // reporter's thread next runs.
  void countDropSilently(QVDropReason reason) noexcept {
    drops_[static_cast<std::size_t>(reason)].fetch_add(1, std::memory_order_relaxed);
  }
  // All but what lies in the queue.
  QVReporterCounters counters() const noexcept;

  // When report() has something to tell; nothing where there is nothing.
  std::optional<TimePoint> nextReport() const noexcept;
  // Tells what has been dropped, where it is time.
  void report(TimePoint now);
  // The same at once, whatever was dropped.
  void reportAll(TimePoint now);
  // Never tells again.
  void silence() noexcept { isSilent_ = true; }

 private:
  QVDropCounts drops() const noexcept;
  bool isAnyDue() const noexcept;

  const Callback callback_;
  const std::chrono::milliseconds interval_;
  std::atomic<uint64_t> sent_{0};
  std::atomic<uint64_t> connections_{0};
  std::array<std::atomic<uint64_t>, kQVDropReasonCount> drops_{};
  std::atomic<bool> isDue_{false};
  static_assert(
      decltype(drops_)::value_type::is_always_lock_free,
      "on this target a count of 64 bits takes a lock, on which a real-time thread could wait");

  QVDropCounts reported_;  // the reporter's thread's, as are the next two
  TimePoint notBefore_ = TimePoint::min();
  bool isSilent_ = false;
};
