#pragma once

#include "platform/linux/QVDescriptor.h"

#include <initializer_list>
#include <optional>

#include <signal.h>
#include <sys/signalfd.h>

// Takes signals as something to wait for, in place of what they would do. Made before any thread
// is: threads inherit the blocking. A signal that the process ignores, as nohup has it and as
// shells have it for what runs in the background of a script, stays ignored: blocked, it would
// come.
//
// Threads: the main one. The signals stay blocked when it goes, which is when the process ends.
class QVSignals {
 public:
  explicit QVSignals(std::initializer_list<int> signals);

  static bool isIgnored(int number);

  // Readable when there is one.
  int descriptor() const { return descriptor_.get(); }
  // The next one that has come, if any.
  std::optional<signalfd_siginfo> next() const;
  // Which signals the process blocked before: what a child shall begin with.
  const sigset_t& previous() const { return previous_; }

 private:
  sigset_t previous_;
  QVDescriptor descriptor_;
};
