#pragma once

#include "platform/QVFunction.h"
#include "platform/QVValue.h"
#include "platform/linux/QVThreadAnnotations.h"

#include <atomic>
#include <cstddef>
#include <memory>

// Bounds the memory of what the service has taken in and not yet got rid of, all connections
// together: decoded dictionaries, until their last handle goes, and messages that have come in by
// half.
//
// Above the bound a connection that holds more than its fair share (the bound divided by the number
// of open connections) is not read any further, so the heaviest stop first; one that holds less
// goes on, so that a peer that fills the bound and lingers starves nobody but itself and its like.
// What open connections hold thus stays near twice the bound. What connections left behind that
// have closed belongs to nobody who could be held back: above four times the bound no connection is
// read, until it has drained.
//
// Threads: charges from any thread, a few atomic additions each; the rest on the IPC thread.
// Lifetime: accounts outlive their connection until everything charged to them is gone, and keep
// the budget alive.
class QVIntakeBudget : public std::enable_shared_from_this<QVIntakeBudget> {
 public:
  class Account;  // NOLINT(cppcoreguidelines-virtual-class-destructor): frees itself, see below
  struct AccountCloser {
    void operator()(Account* account) const noexcept;
  };
  // Its connection's handle; the account itself may live on.
  using AccountHandle = std::unique_ptr<Account, AccountCloser>;

  explicit QVIntakeBudget(std::size_t bound = kBound) : bound_(bound) {}

  // `wake` is called on any thread when a connection that had to stop may go on; only posts.
  void setWake(QVFunction<void()> wake) QV_EXCLUDES(mutex_);
  AccountHandle open();

  // May the account's connection read on? If not, a wake will follow when that changes.
  [[nodiscard]] bool admits(Account& account);

  std::size_t total() const noexcept { return total_.load(std::memory_order_relaxed); }
  std::size_t bound() const noexcept { return bound_; }

  // Bytes. Enough for 100,000 messages of usual size, small enough for a small machine.
  static constexpr std::size_t kBound = std::size_t{64} << 20;
  static constexpr std::size_t kCeilingFactor = 4;

 private:
  bool isWithin(std::size_t heldByOne) const noexcept;
  void wakeUp() QV_EXCLUDES(mutex_);

  const std::size_t bound_;
  std::atomic<std::size_t> total_{0};
  std::atomic<std::size_t> accounts_{0};  // of open connections
  std::atomic<bool> someoneWaits_{false};
  QVMutex mutex_;
  QVFunction<void()> wake_ QV_GUARDED_BY(mutex_);
};

// What one connection is charged. Frees itself when the connection has closed and the last byte has
// been removed.
// NOLINTNEXTLINE(cppcoreguidelines-virtual-class-destructor): nobody deletes it through its base
class QVIntakeBudget::Account final : public QVMemoryCharge {
 public:
  explicit Account(std::shared_ptr<QVIntakeBudget> budget) : budget_(std::move(budget)) {}

  void add(std::size_t bytes) noexcept override;
  void remove(std::size_t bytes) noexcept override;

 private:
  friend class QVIntakeBudget;
  friend struct AccountCloser;
  // Only by itself and its handle.
  ~Account() = default;

  // `state_` holds twice the bytes charged, two more while the connection is open, and the lowest
  // bit while the connection waits: so one operation removes bytes and tells whether to wake.
  static constexpr std::size_t kWaits = 1;
  static constexpr std::size_t kUnit = 2;
  // While the connection is open.
  static std::size_t bytesIn(std::size_t state) noexcept { return state / kUnit - 1; }

  const std::shared_ptr<QVIntakeBudget> budget_;
  std::atomic<std::size_t> state_{kUnit};
};
