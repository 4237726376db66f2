#pragma once

#include <cstddef>

// Makes one allocation of the calling thread fail, for tests of what is left behind. A program that
// has this among its sources has its own operator new.
class QVAllocationFailure {
 public:
  // Of the thread's allocations during this object's life, the one after `before` others throws
  // std::bad_alloc. One such object a thread.
  explicit QVAllocationFailure(std::size_t before);
  ~QVAllocationFailure();
  QVAllocationFailure(const QVAllocationFailure&) = delete;
  QVAllocationFailure& operator=(const QVAllocationFailure&) = delete;

  // False where there were fewer allocations.
  static bool hasHappened();
};
