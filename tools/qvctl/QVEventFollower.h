#pragma once

#include "tools/qvctl/QVEventRowReader.h"

#include <array>
#include <cstdint>
#include <functional>
#include <set>

#include <sys/types.h>

// What has come into the store since it was asked last.
//
// Rows are known by their numbers, which grow; a session's stop is written into the row of its
// start, so the latest sessions that run are remembered. Another store in the place of the first
// one, after damage, is read from its beginning, and so is a table that was emptied, to keep the
// store within its limit: its rows are numbered anew.
//
// Threads: one at a time. The reader outlives it. Failures: as QVReadOnlyStore.
class QVEventFollower {
 public:
  // Sessions whose stop is waited for; those that were left behind by a killed service never stop.
  static constexpr std::size_t kMaximumOpen = 4096;

  using Receiver = std::function<void(const QVStoredEvent& event)>;

  explicit QVEventFollower(const QVEventRowReader& reader) : reader_(reader) {}

  // Leaves out what is there.
  void skip();
  // What has come, the oldest first.
  void readNew(const Receiver& receiver);

 private:
  void noticeOtherStore();
  void noticeEmptiedSessions();
  void addSessionRows(QVEventRowReader::Sessions which);
  void addStops(QVEventRowReader::Events& events);

  const QVEventRowReader& reader_;
  std::array<int64_t, QVStoredEvent::kKinds> after_{};  // the last row that was read of each kind
  std::set<int64_t> open_;                              // rows of sessions that have not stopped
  int64_t openAfter_ = 0;
  ino_t inode_ = 0;  // of the store
};
