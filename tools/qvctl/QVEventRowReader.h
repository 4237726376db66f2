#pragma once

#include "tools/qvctl/QVEventFilter.h"
#include "tools/qvctl/QVReadOnlyStore.h"
#include "tools/qvctl/QVStoredEvent.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

// Reads rows of the store's tables as events, some at a time: the store is opened anew for each
// part, so that the service is never in the way of a reader, nor a reader in its.
//
// Threads: one at a time. Failures: as QVReadOnlyStore.
class QVEventRowReader {
 public:
  // Rows that are looked at in one transaction, a few milliseconds.
  static constexpr int64_t kRowsAtATime = 2000;

  using Kind = QVStoredEvent::Kind;
  using Events = std::vector<QVStoredEvent>;
  // The smallest and the largest number of a table's rows; 0 and 0 where there are none.
  struct Range {
    int64_t first = 0;
    int64_t last = 0;
  };

  QVEventRowReader(std::filesystem::path store, QVEventFilter filter);

  const QVEventFilter& filter() const { return filter_; }
  const std::filesystem::path& path() const { return path_; }

  Range range(Kind kind) const;
  // Rows above `after` up to `last`. There may be any gaps between their numbers.
  struct Span {
    int64_t after = 0;
    int64_t last = 0;
    bool isEmpty() const { return after >= last; }
  };
  // Of all rows that a table can have.
  static Span spanOf(const Range& range);
  // Appends what is wanted of the first kRowsAtATime rows of the span, which is left with the rest.
  void read(Kind kind, Span& span, Events& events) const;
  // The same of the last ones, the last one first.
  void readBackwards(Kind kind, Span& span, Events& events) const;
  // When something came that is still in its row.
  std::optional<int64_t> timeOf(Kind kind, int64_t row) const;

  // A session's row and, where it was stopped, when.
  struct Session {
    int64_t row = 0;
    std::optional<int64_t> stopped;
  };
  using Sessions = std::vector<Session>;
  // The first kRowsAtATime sessions of the span, which is left with the rest.
  Sessions sessions(Span& span) const;
  // Those of these rows that are there.
  Sessions sessions(const std::vector<int64_t>& rows) const;
  // The latest `maximum` sessions that run, in ascending order.
  std::vector<int64_t> running(int64_t maximum) const;
  // The stops of these rows, as far as they are wanted and have come.
  void readStops(const std::vector<int64_t>& rows, Events& events) const;

 private:
  enum class Direction { forwards, backwards };
  void read(Kind kind, Direction direction, Span& span, Events& events) const;
  void take(Kind kind, const QVStoreQuery& row, Events& events) const;

  const std::filesystem::path path_;
  const QVEventFilter filter_;
};
