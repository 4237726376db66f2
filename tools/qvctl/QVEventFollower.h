#pragma once

#include "tools/qvctl/QVEventHistory.h"

#include <array>
#include <cstdint>
#include <optional>
#include <set>
#include <utility>

#include <sys/types.h>

// What has come into the store since it was asked last; the first time, everything.
//
// Rows are known by their numbers, which grow; a session's stop is written into the row of its
// start, so the latest sessions that run are remembered. Another store in the place of the first
// one, after damage, is read from its beginning, and so is a table that was emptied, to keep the
// store within its limit: its rows are numbered anew. That is seen by the last row that was read,
// which is not there any more or has another time.
//
// Threads: one at a time. The reader outlives it. Failures: as QVReadOnlyStore.
class QVEventFollower {
 public:
  // Sessions whose stop is waited for; those that were left behind by a killed service never stop.
  static constexpr std::size_t kMaximumOpen = 4096;

  QVEventFollower(const QVEventRowReader& reader, QVEventHistory::Enough enough)
      : reader_(reader), enough_(std::move(enough)) {}

  // Leaves out what is there.
  void skip();
  // What has come, the oldest first.
  void readNew(const QVEventHistory::Receiver& receiver);
  // Whether rows may have come and gone unread since this was asked last.
  bool mayHaveMissed() { return std::exchange(mayHaveMissed_, false); }

 private:
  using Kind = QVStoredEvent::Kind;
  // The last row that was read, and when it came; no row where the table was empty.
  struct Mark {
    std::optional<int64_t> row;
    std::optional<int64_t> time;
  };

  void noticeOtherStore();
  Mark markAt(Kind kind, const QVEventRowReader::Range& range) const;
  // Whether the table is the one that was read up to the mark, with more rows at the most.
  bool goesOn(Kind kind, const QVEventRowReader::Range& range) const;
  // The rows that have come.
  QVEventRowReader::Span advance(Kind kind);
  QVEventHistory::Stops newStops();
  void take(const QVEventRowReader::Sessions& sessions, QVEventHistory::Stops& stops);

  const QVEventRowReader& reader_;
  const QVEventHistory::Enough enough_;
  std::array<Mark, QVStoredEvent::kKinds> marks_{};  // of stops, in the table of starts
  std::set<int64_t> open_;                           // rows of sessions that have not stopped
  ino_t inode_ = 0;                                  // of the store
  bool mayHaveMissed_ = false;
};
