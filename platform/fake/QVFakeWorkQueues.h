#pragma once

#include "platform/QVLog.h"
#include "platform/QVWorkQueue.h"
#include "platform/fake/QVFakeClock.h"

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

struct QVFakeWorkQueuesState;

// Work queues in virtual time on the calling thread: nothing runs until told, and then always in
// the same order. Items run in the order in which they were enqueued across all queues; a delayed
// item is enqueued when virtual time reaches its moment.
//
// Used by tests through QVFakePlatform; QVFakeCondition runs other queues' work from inside a wait.
// Threads: any thread may enqueue; one thread runs items and moves the time.
// Ownership: items that have not run are destroyed with this object, from then on nothing is
// taken. Handles may outlive it.
class QVFakeWorkQueues final : public QVWorkQueues {
 public:
  static constexpr std::string_view kBackgroundLabel = "background";

  // A queue as it was asked for, and how its work stands.
  struct QueueRecord {
    std::string label;
    QVQualityOfService quality;
    int32_t relativePriority;
    std::size_t enqueuedCount;  // delayed items count from the moment they were handed over
    std::size_t runCount;
  };

  QVFakeWorkQueues(QVFakeClock& clock, QVLog& log);
  ~QVFakeWorkQueues() override { discard(); }
  QVFakeWorkQueues(const QVFakeWorkQueues&) = delete;
  QVFakeWorkQueues& operator=(const QVFakeWorkQueues&) = delete;

  std::shared_ptr<QVWorkQueue> makeSerialQueue(std::string_view label, QVQualityOfService quality,
                                               int32_t relativePriority) override;
  std::shared_ptr<QVWorkQueue> backgroundQueue() override;

  // Runs everything that is ready, and what that makes ready; answers how many items ran. Items of
  // a serial queue that has an item on the call stack have to wait.
  std::size_t runUntilIdle();
  // The same for the queues of one label only.
  std::size_t runUntilIdle(std::string_view label);
  // Runs what is ready, then moves virtual time by `duration`; stops at each moment at which
  // delayed items become due and runs them there.
  void advance(QVDuration duration);

  // Runs the test's own item `delay` later, in between the queues' items: how a test acts while an
  // item waits. On a queue of its own that appears in no record.
  void after(QVDuration delay, QVWorkItem item);

  // Destroys what has not run; from now on nothing is taken.
  void discard();

  // Lets other work go on while the caller waits: until `done` answers true, else until virtual
  // time is at `deadline` (work that is due at the deadline still runs before it). Answers whether
  // it was done. An item that waits inside of this one has to end its wait first, so a deadline
  // can be overrun by the wait of such an item.
  bool runOthersUntil(QVDuration deadline, const std::function<bool()>& done);

  // Items that are ready and have not begun to run.
  std::size_t pendingCount(std::string_view label) const;
  std::size_t pendingCount() const;
  // Items whose moment has not come.
  std::size_t delayedCount(std::string_view label) const;
  std::size_t delayedCount() const;
  // Every queue made so far, in order. The background queue is listed from its first use.
  std::vector<QueueRecord> queues() const;

 private:
  bool runOne(const std::optional<std::string_view>& label);

  QVFakeClock& clock_;
  QVLog& log_;
  // Shared with the handles: enqueueing on one after this object went must find something.
  const std::shared_ptr<QVFakeWorkQueuesState> state_;
};
