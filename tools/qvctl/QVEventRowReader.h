#pragma once

#include "tools/qvctl/QVEventFilter.h"
#include "tools/qvctl/QVReadOnlyStore.h"
#include "tools/qvctl/QVStoredEvent.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <utility>
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
  // Appends what is wanted of the rows above `after` up to `last`, kRowsAtATime of them at the
  // most.
  void read(Kind kind, int64_t after, int64_t last, Events& events) const;

  // When and of which rows sessions were stopped, in the order of time.
  using Stops = std::vector<std::pair<int64_t, int64_t>>;
  Stops stops(const std::function<void(double part)>& progress) const;
  // The stops of these rows, as far as they are wanted and have come.
  void readStops(const std::vector<int64_t>& rows, Events& events) const;
  // The latest `maximum` rows of sessions above `after`, in ascending order.
  enum class Sessions { all, running };
  std::vector<int64_t> sessionRows(Sessions which, int64_t after, int64_t maximum) const;

 private:
  void take(Kind kind, const QVStoreQuery& row, Events& events) const;

  const std::filesystem::path path_;
  const QVEventFilter filter_;
};
