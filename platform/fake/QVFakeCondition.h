#pragma once

#include "platform/QVCondition.h"
#include "platform/fake/QVFakeWorkQueues.h"

#include <atomic>
#include <cstddef>
#include <memory>

// A condition for one thread in virtual time: while it waits, the other queues' work runs, and
// where there is none, time passes up to the deadline. Wrong use (waiting or signalling without the
// lock, locking twice, unlocking what is not locked) ends the program with a message.
//
// Threads: the one that runs the fake queues' items.
class QVFakeCondition final : public QVCondition {
 public:
  QVFakeCondition(QVFakeWorkQueues& queues, const QVFakeClock& clock,
                  const std::atomic<bool>& waitsAreCutShort);

  void lock() override;
  void unlock() override;
  bool waitForTimeout(QVDuration timeout) override;
  void signal() override;

  std::size_t waitCount() const { return waitCount_; }

 private:
  QVFakeWorkQueues& queues_;
  const QVFakeClock& clock_;
  const std::atomic<bool>& waitsAreCutShort_;
  bool locked_ = false;
  std::size_t waiterCount_ = 0;
  std::size_t pendingSignalCount_ = 0;  // never above waiterCount_: nobody waits, nobody hears
  std::size_t waitCount_ = 0;
};
