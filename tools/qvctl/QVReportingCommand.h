#pragma once

#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

// qvctl reporting on, off, show: the reporting switch.
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
  static void show(const QVToolContext& context);
};
