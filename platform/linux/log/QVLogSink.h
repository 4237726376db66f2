#pragma once

#include "platform/linux/log/QVLogLine.h"

#include <atomic>
#include <span>

// Where a log's lines go.
//
// Threads: write() on the log's writer thread only.
class QVLogSink {
 public:
  virtual ~QVLogSink() = default;
  // Writes the lines in order; may block as long as the destination does, but ends soon after
  // `giveUp` becomes true, with what it has written by then. Lines that the destination refuses
  // are lost.
  virtual void write(std::span<const QVLogLine> lines, const std::atomic<bool>& giveUp) = 0;
};
