#pragma once

#include "tools/qvctl/QVChannelTable.h"
#include "tools/qvctl/QVToolContext.h"
#include "tools/qvctl/QVToolFailure.h"

#include <cstddef>
#include <optional>
#include <string>

// qvctl channels: what drivers publish now, once or again and again with what has grown. The
// service need not run.
//
// Threads: one.
class QVChannelsCommand {
 public:
  struct Options {
    std::string interval;  // empty: once
    std::optional<std::size_t> count;
    std::string group;  // empty: all
  };

  static QVToolStatus run(const QVToolContext& context, const Options& options);

 private:
  // What was said of the last reading is not said again.
  static void complain(const QVChannelTable::Reading& reading,
                       const QVChannelTable::Reading& before);
  static void show(QVToolOutput& output, const QVChannelTable::Reading& reading,
                   std::optional<double> seconds);
  static QVValue json(const QVChannelTable::Reading& reading, std::optional<double> seconds);
  static QVValue json(const QVChannelTable::Channel& channel, std::optional<double> seconds);
};
