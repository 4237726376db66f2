#pragma once

#include "tools/qvctl/QVStoredEvent.h"
#include "tools/qvctl/QVTable.h"
#include "tools/qvctl/QVToolOutput.h"

#include <string>

// Shows events: a table for people, whose rows come one by one, or a line of JSON each.
//
// Threads: one at a time. The output outlives it.
class QVEventPrinter {
 public:
  // `isInFull`: nothing is cut where a terminal's line ends.
  QVEventPrinter(QVToolOutput& output, bool isInFull);

  void showTitles();
  void show(const QVStoredEvent& event);

 private:
  QVToolOutput& output_;
  const bool isNarrow_;
  const bool hasService_;
  const bool hasCategory_;
  QVTable table_;
  std::string date_;  // of the last event, where lines have none
};
