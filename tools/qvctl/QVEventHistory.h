#pragma once

#include "tools/qvctl/QVEventRowReader.h"
#include "tools/qvctl/QVProgress.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <utility>
#include <vector>

// What the store has kept, in the order of time: the tables' rows, merged.
//
// Only what comes next of each kind is in memory, but for the times of stopped sessions, which lie
// in no order in the store.
//
// Threads: one at a time. The reader outlives it. Failures: as QVReadOnlyStore.
class QVEventHistory {
 public:
  using Receiver = std::function<void(const QVStoredEvent& event)>;
  // Asked before each event and each look into the store: whether that was enough.
  using Enough = std::function<bool()>;

  // When sessions were stopped, and their rows.
  using Stops = std::vector<std::pair<int64_t, int64_t>>;
  // Some of what is there: rows of each kind, and stops, which come from the rows of starts.
  struct Part {
    std::array<QVEventRowReader::Span, QVStoredEvent::kKinds> rows{};
    Stops stops = {};  // in the order of time
  };

  explicit QVEventHistory(
      const QVEventRowReader& reader, Enough enough = [] { return false; })
      : reader_(reader), enough_(std::move(enough)) {}

  // What is wanted of a part, the oldest first.
  void read(Part part, const Receiver& receiver);
  // Everything that is wanted, the oldest first.
  void readAll(const Receiver& receiver);
  // The last `count` of it.
  void readLast(std::size_t count, const Receiver& receiver);

 private:
  // What has not been handed out of one kind.
  struct Source {
    QVStoredEvent::Kind kind;
    QVEventRowReader::Span rows;  // of the kind `stop`, places in the part's stops
    int64_t first = 0;            // what `rows` began after
    std::deque<QVStoredEvent> waiting = {};
  };

  Part all();
  Stops allStops();
  void refill(Source& source, const Stops& stops) const;
  // The last ones, newest first.
  QVEventRowReader::Events lastOf(QVStoredEvent::Kind kind, const Part& part,
                                  std::size_t count) const;
  static double partOf(const Source& source);

  const QVEventRowReader& reader_;
  const Enough enough_;
  QVProgress progress_{"reading events"};
};
