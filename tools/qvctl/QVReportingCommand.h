#pragma once

#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

// qvctl reporting on, off, show: the reporting switch. What the preference says is shown to those,
// too, who cannot ask the service; the status says why they could not.
//
// Threads: one.
class QVReportingCommand {
 public:
  enum class Operation { show, on, off };
  struct Options {
    Operation operation = Operation::show;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  static QVToolStatus show(const QVToolContext& context);
};
