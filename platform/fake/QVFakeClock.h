#pragma once

#include "platform/QVClock.h"

#include <atomic>

// A clock that moves when told. It carries the virtual steady time that QVFakeWorkQueues and
// QVFakeConditions count on, and a wall-clock date that moves along and can be set apart.
//
// Threads: any.
class QVFakeClock final : public QVClock {
 public:
  // 2024-01-02 03:04:05 UTC.
  static constexpr QVDate kStart{std::chrono::seconds{1'704'164'645}};

  QVDate currentDate() const override { return QVDate{QVDate::duration{wall_.load()}}; }

  std::chrono::seconds offsetFromUTC(QVDate) const override {
    return std::chrono::seconds{offset_.load()};
  }
  // The same at all dates; 0 until set.
  void setOffsetFromUTC(std::chrono::seconds offset) { offset_.store(offset.count()); }

  // Changes the date as a user or a time server would; steady time does not notice.
  void setCurrentDate(QVDate date) { wall_.store(date.time_since_epoch().count()); }

  // Steady time since the clock was made.
  QVDuration steadyTime() const { return QVDuration{steady_.load()}; }

  // Moves both. Runs no timers: that is QVFakeWorkQueues' advance().
  void advance(QVDuration duration) {
    steady_.fetch_add(duration.count());
    wall_.fetch_add(std::chrono::duration_cast<QVDate::duration>(duration).count());
  }
  // As advance(), up to a steady time; never back.
  void advanceTo(QVDuration steadyTime) {
    const QVDuration missing = steadyTime - this->steadyTime();
    if (missing > QVDuration::zero()) advance(missing);
  }

 private:
  std::atomic<QVDate::rep> wall_{kStart.time_since_epoch().count()};
  std::atomic<QVDuration::rep> steady_{0};
  std::atomic<std::chrono::seconds::rep> offset_{0};
};
