#pragma once

#include "QVServices/Statistics/QVReportingUserInfoAccount.h"
#include "platform/QVValue.h"

#include <cstddef>
#include <cstdint>
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
  enum class Addition : uint8_t { done, tooLargeForOne, tooLargeForAll };

  // The account outlives it and everybody who has the contents.
  explicit QVReportingUserInfo(
      QVReportingUserInfoAccount& account = QVReportingUserInfoAccount::shared())
      : account_(account) {}

  QVDictionary contents() const {
    const std::lock_guard lock(mutex_);
    return contents_;
  }

  // Bytes: a configuration is names and numbers, far smaller than this. It goes into each start's
  // row, and a session's share of what all have must not be the whole.
  static constexpr std::size_t kMaximumBytes = std::size_t{64} << 10;

  // Adds all entries; those of keys that are there already are replaced. Nothing is added where
  // the contents would become larger than kMaximumBytes, or those of all sessions than the
  // account's maximum, but for what `mayOverdraw`. The entries themselves are not kept.
  [[nodiscard]] Addition addEntries(const QVDictionary& entries, bool mayOverdraw = false) {
    if (entries.empty()) return Addition::done;
    if (entries.footprint() > kMaximumBytes) return Addition::tooLargeForOne;
    const std::lock_guard lock(mutex_);
    QVDictionary merged = contents_.merging(entries, &account_);
    if (merged.footprint() > kMaximumBytes) return Addition::tooLargeForOne;
    if (!mayOverdraw && account_.isOverdrawn()) return Addition::tooLargeForAll;
    contents_ = std::move(merged);
    return Addition::done;
  }

 private:
  QVReportingUserInfoAccount& account_;
  mutable std::mutex mutex_;
  QVDictionary contents_;  // guarded by mutex_
};
