#pragma once

#include "client/QVClientDescriptor.h"

#include <atomic>

// Wakes whoever waits on its descriptor, which is readable from a ring on until it is silenced.
//
// Threads: ring() any, at once; silence() one at a time. Failures: isOpen() is false where the
// system had no descriptor left.
class QVClientBell {
 public:
  QVClientBell();

  bool isOpen() const noexcept { return event_.isOpen(); }
  int descriptor() const noexcept { return event_.get(); }
  void ring();
  void silence();

 private:
  const QVClientDescriptor event_;
  std::atomic<bool> rang_{false};
};
