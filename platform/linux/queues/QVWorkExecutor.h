#pragma once

#include "platform/QVWorkQueue.h"

// Threads that run tasks. Stands behind the queues: a serial queue submits itself once for each
// batch of its items.
//
// Threads: any may submit. Tasks that have been taken are run, in the order of submission where
// there is one thread, else in any.
class QVWorkExecutor {
 public:
  virtual ~QVWorkExecutor() = default;
  // Moves from `task` and answers true; answers false and leaves it once the executor is closed.
  // Throws std::bad_alloc where there is no memory for it: then it is not run.
  [[nodiscard]] virtual bool submit(QVWorkItem& task) = 0;
  // Takes no more tasks, runs those taken, ends the threads. Not from one of its own tasks.
  virtual void close() = 0;
};
