#pragma once

#include <chrono>
#include <csignal>
#include <optional>
#include <span>

#include <poll.h>

// The end of a command that would go on for ever: when it is interrupted, asked to end or hung up
// (SIGINT, SIGTERM, SIGHUP), or after a time. First the command is asked, and may bring to an end
// what it has begun to print; where it stands still, at a store that is locked or a reader that
// does not read, the process ends a moment later, wherever it is, with status 0.
//
// A signal that is ignored when this is made stays ignored.
//
// Threads: the main one. One in a process, until that ends: what is still to be printed when it
// goes is not waited for any longer either. States: going on, asked, ended; never back. Limits:
// kGrace.
class QVEnding {
 public:
  // From being asked to the end of the process.
  static constexpr std::chrono::seconds kGrace{1};

  // `duration`: until the command is asked to end by itself; without one it is not.
  explicit QVEnding(std::optional<std::chrono::microseconds> duration);

  static bool isAsked();
  // As poll(), -1 without a limit; returns at once where the command is asked to end, also while it
  // waits. A failure is told by errno, EINTR among them.
  int poll(std::span<pollfd> entries, int milliseconds) const;

 private:
  sigset_t taken_;
};
