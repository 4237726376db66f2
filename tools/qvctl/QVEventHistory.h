#pragma once

#include "tools/qvctl/QVEventRowReader.h"
#include "tools/qvctl/QVProgress.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <vector>

// What the store has kept so far, in the order of time: the tables' rows, merged.
//
// Only what comes next of each kind is in memory, but for the times of stopped sessions, which lie
// in no order in the store.
//
// Threads: one at a time. The reader outlives it. Failures: as QVReadOnlyStore.
class QVEventHistory {
 public:
  using Receiver = std::function<void(const QVStoredEvent& event)>;

  explicit QVEventHistory(const QVEventRowReader& reader) : reader_(reader) {}

  // Everything that is wanted, the oldest first.
  void readAll(const Receiver& receiver);
  // The last `count` of it.
  void readLast(std::size_t count, const Receiver& receiver);

 private:
  // The rows of one kind that have not been handed out.
  struct Source {
    QVStoredEvent::Kind kind;
    int64_t first = 0;
    int64_t after = 0;
    int64_t last = 0;
    QVEventRowReader::Stops stops = {};  // of the kind `stop`, in place of the numbers
    std::deque<QVStoredEvent> waiting = {};
  };

  Source sourceOf(QVStoredEvent::Kind kind);
  // What is wanted of the rows above `after` up to `last`, kRowsAtATime at the most.
  QVEventRowReader::Events read(const Source& source, int64_t after, int64_t last) const;
  void refill(Source& source) const;
  // The last ones, newest first.
  std::vector<QVStoredEvent> lastOf(QVStoredEvent::Kind kind, std::size_t count);
  static double partOf(const Source& source);

  const QVEventRowReader& reader_;
  QVProgress progress_{"reading events"};
};
