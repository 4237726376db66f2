#pragma once

#include "tools/qvctl/QVSummaryFile.h"
#include "tools/qvctl/QVSummaryPlot.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <string>

// qvctl summary list, show, open, plot: the files that sessions leave on an internal build.
//
// Threads: one.
class QVSummaryCommand {
 public:
  enum class Operation { list, show, open, plot };
  struct Options {
    Operation operation = Operation::list;
    std::string file;  // as QVSummaryFile::choose() takes it
    QVSummaryPlot::Options plot;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  static void list(const QVToolContext& context);
  static void show(const QVToolContext& context, const QVSummaryFile& file);
  static void open(const QVToolContext& context, const QVSummaryFile& file);
};
