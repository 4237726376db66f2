#pragma once

#include "tools/qvctl/QVEventFilter.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstddef>
#include <optional>

// qvctl events: what the store has kept. The service need not run.
//
// Threads: one.
class QVEventsCommand {
 public:
  struct Options {
    QVEventFilter::Words filter;
    std::optional<std::size_t> last;
    bool full = false;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);
};
