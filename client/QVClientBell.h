#pragma once

#include "platform/linux/QVDescriptor.h"

// Wakes whoever waits on its descriptor, which is readable from a ring on until it is silenced.
//
// Threads: any, at once. Failures: isOpen() is false where the system had no descriptor left.
class QVClientBell {
 public:
  QVClientBell();

  bool isOpen() const noexcept { return event_.isOpen(); }
  int descriptor() const noexcept { return event_.get(); }
  // One system call each.
  void ring() const;
  void silence() const;

 private:
  const QVDescriptor event_;
};
