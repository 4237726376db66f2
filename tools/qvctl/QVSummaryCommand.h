#pragma once

#include "tools/qvctl/QVSummaryFile.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstddef>
#include <string>
#include <vector>

// qvctl summary list, show, open, plot: the files that sessions leave on an internal build.
//
// Threads: one.
class QVSummaryCommand {
 public:
  // Of a plot.
  static constexpr std::size_t kLargestColumns = 1000;
  static constexpr std::size_t kLargestRows = 200;

  enum class Operation { list, show, open, plot };
  struct Options {
    Operation operation = Operation::list;
    std::string file;               // as QVSummaryFile::choose() takes it
    std::vector<std::string> keys;  // of the plot; patterns; empty: all
    std::size_t width = 0;          // of the plot, in columns; 0: the terminal's
    std::size_t height = 8;         // of each picture, in rows
    bool ascii = false;
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  static void list(const QVToolContext& context);
  static void show(const QVToolContext& context, const QVSummaryFile& file);
  static void open(const QVSummaryFile& file);
  static void plot(const QVToolContext& context, const Options& options, const QVSummaryFile& file);
};
