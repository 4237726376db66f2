#pragma once

#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

// qvctl kill: has the service end at once, with status 2; what it has not stored is lost. A service
// that does not run is not started for that.
//
// Threads: one.
class QVKillCommand {
 public:
  struct Options {};

  static QVToolStatus run(const QVToolContext& context, const Options& options);
};
