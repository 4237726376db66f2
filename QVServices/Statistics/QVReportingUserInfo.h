#pragma once

#include "platform/QVValue.h"

#include <cstddef>
#include <mutex>
#include <utility>

// A session's user information: its client's configuration and the service's defaults, merged.
// Shared between the session and the set-up of its framework session, which reads the contents
// only when it runs.
//
// Threads: any; locked inside. The contents are an immutable dictionary that is replaced as a
// whole, so a reader keeps what it got.
class QVReportingUserInfo {
 public:
  QVDictionary contents() const {
    const std::lock_guard lock(mutex_);
    return contents_;
  }

  // Bytes: a configuration is names and numbers. It goes into every analytics event's making and
  // into each start's row, so it must not be what fills the memory.
  static constexpr std::size_t kMaximumBytes = std::size_t{64} << 10;

  // Adds all entries; those of keys that are there already are replaced. False, with nothing
  // added, where the contents would become larger than kMaximumBytes.
  [[nodiscard]] bool addEntries(const QVDictionary& entries) {
    if (entries.empty()) return true;
    if (entries.footprint() > kMaximumBytes) return false;
    const std::lock_guard lock(mutex_);
    QVDictionary merged = contents_.merging(entries);
    if (merged.footprint() > kMaximumBytes) return false;
    contents_ = std::move(merged);
    return true;
  }

 private:
  mutable std::mutex mutex_;
  QVDictionary contents_;  // guarded by mutex_
};
