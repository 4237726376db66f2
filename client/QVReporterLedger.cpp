#include "client/QVReporterLedger.h"

#include <utility>

QVReporterLedger::QVReporterLedger(Callback callback, std::chrono::milliseconds interval)
    : callback_(std::move(callback)), interval_(interval) {}

bool QVReporterLedger::countDrop(QVDropReason reason, uint64_t count) noexcept {
  if (count == 0) return false;
  drops_[static_cast<std::size_t>(reason)].fetch_add(count, std::memory_order_relaxed);
  if (reason == QVDropReason::disabled || !callback_) return false;
  // Looked at first: the line is shared by all threads that send.
  return !isDue_.load(std::memory_order_relaxed) && !isDue_.exchange(true);
}

QVDropCounts QVReporterLedger::drops() const noexcept {
  QVDropCounts drops;
  for (std::size_t i = 0; i < kQVDropReasonCount; ++i) {
    drops.counts[i] = drops_[i].load(std::memory_order_relaxed);
  }
  return drops;
}

QVReporterCounters QVReporterLedger::counters() const noexcept {
  return {.sent = sent_.load(std::memory_order_relaxed),
          .dropped = drops(),
          .connections = connections_.load(std::memory_order_relaxed)};
}

bool QVReporterLedger::isAnyDue() const noexcept {
  if (isDue_.load()) return true;
  if (!callback_ || isSilent_) return false;
  const QVDropCounts all = drops();
  for (std::size_t i = 0; i < kQVDropReasonCount; ++i) {
    const bool isOfSwitch = static_cast<QVDropReason>(i) == QVDropReason::disabled;
    if (!isOfSwitch && all.counts[i] != reported_.counts[i]) return true;
  }
  return false;
}

std::optional<QVReporterLedger::TimePoint> QVReporterLedger::nextReport() const noexcept {
  if (!isAnyDue()) return std::nullopt;
  return notBefore_;
}

void QVReporterLedger::report(TimePoint now) {
  if (now >= notBefore_ && isAnyDue()) reportAll(now);
}

void QVReporterLedger::reportAll(TimePoint now) {
  if (!callback_ || isSilent_) return;
  // First, so that what is dropped from here on is due again.
  isDue_.store(false);
  const QVDropCounts all = drops();
  QVDropCounts news;
  for (std::size_t i = 0; i < kQVDropReasonCount; ++i) {
    news.counts[i] = all.counts[i] - reported_.counts[i];
  }
  if (news.inAll() == 0) return;
  reported_ = all;
  notBefore_ = now + interval_;
  callback_(news);
}
