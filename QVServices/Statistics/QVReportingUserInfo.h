#pragma once

#include "platform/QVValue.h"

#include <mutex>

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

  // Adds all entries; those of keys that are there already are replaced.
  void addEntries(const QVDictionary& entries) {
    if (entries.empty()) return;
    const std::lock_guard lock(mutex_);
    contents_ = contents_.merging(entries);
  }

 private:
  mutable std::mutex mutex_;
  QVDictionary contents_;  // guarded by mutex_
};
