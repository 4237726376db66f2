#pragma once

#include "platform/QVDate.h"
#include "platform/QVFunction.h"

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

// One piece of work. Room for what a routed message captures, so that handing it to a queue does
// not allocate for the captures.
using QVWorkItem = QVFunction<void(), 112>;

// How urgent a queue's work is. Adapters map it to the niceness of the threads that serve the
// queue where they are permitted to, silently not where they are not.
enum class QVQualityOfService : uint32_t {
  background = 9,
  utility = 17,
  standard = 21,
  userInitiated = 25,
  userInteractive = 33
};

// A queue of work items. A serial queue runs them one at a time in the order in which they were
// enqueued; a concurrent one runs them in any order, several at once.
//
// Threads: any thread enqueues, at any time, also from an item of the same queue. Enqueueing never
// waits for a work item.
// Ownership: the queue owns an item until it has run and destroys it right after, on the thread
// that ran it. Work that was enqueued is run even when the last handle to the queue goes before:
// the handle may go on a thread of the queue itself, and nothing joins there.
// Failures: an exception that escapes an item is caught, logged once at error level on the default
// log, and the queue goes on. Enqueueing throws where there is no memory for it; a serial queue may
// run the item all the same, with the next one.
class QVWorkQueue {
 public:
  virtual ~QVWorkQueue() = default;
  virtual void async(QVWorkItem item) = 0;
  // Enqueues the item once `delay` of steady time has passed; no thread is held meanwhile.
  virtual void asyncAfter(QVDuration delay, QVWorkItem item) = 0;
  virtual std::string_view label() const = 0;
};

// Makes work queues. Lives as long as the process's work; queues must not be used after it.
//
// Threads: any.
class QVWorkQueues {
 public:
  virtual ~QVWorkQueues() = default;
  // A new serial queue. `relativePriority` is 0 or, within the class, lower (negative). Serial
  // queues below user-initiated quality share threads; an item that waits in a QVCondition does
  // not keep other queues' items from running.
  virtual std::shared_ptr<QVWorkQueue> makeSerialQueue(std::string_view label,
                                                       QVQualityOfService quality,
                                                       int32_t relativePriority) = 0;
  // The process's shared concurrent queue of background quality. The same at every call.
  virtual std::shared_ptr<QVWorkQueue> backgroundQueue() = 0;
};
