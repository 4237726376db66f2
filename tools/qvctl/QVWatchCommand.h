#pragma once

#include "tools/qvctl/QVEventFilter.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstddef>
#include <optional>
#include <string>

// qvctl watch: what reaches the store, as it does. Waits for changes of the store's files; between
// them nothing wakes up. Ends after so many events, after so long, when it is interrupted or asked
// to end, and when nobody reads its output any more, each in good order; the first three also while
// it reads or writes (QVEnding).
//
// Threads: one.
class QVWatchCommand {
 public:
  struct Options {
    QVEventFilter::Words filter;
    std::optional<std::size_t> count;
    std::string duration;  // empty: without end
    bool full = false;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);
};
