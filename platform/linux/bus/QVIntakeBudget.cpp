#include "platform/linux/bus/QVIntakeBudget.h"

#include <algorithm>

void QVIntakeBudget::setWake(QVFunction<void()> wake) {
  const QVMutexLock lock(mutex_);
  wake_ = std::move(wake);
}

QVIntakeBudget::AccountHandle QVIntakeBudget::open() {
  accounts_.fetch_add(1, std::memory_order_relaxed);
  return AccountHandle(new Account(shared_from_this()));
}

void QVIntakeBudget::AccountCloser::operator()(Account* account) const noexcept {
  const auto budget = account->budget_;
  budget->accounts_.fetch_sub(1);
  account->state_.fetch_and(~Account::kWaits);
  if (account->state_.fetch_sub(Account::kUnit) == Account::kUnit) delete account;
  // With fewer connections, those that wait have a larger share.
  if (budget->someoneWaits_.load()) budget->wakeUp();
}

bool QVIntakeBudget::isWithin(std::size_t heldByOne) const noexcept {
  const std::size_t total = total_.load();
  if (total <= bound_) return true;
  if (total > kCeilingFactor * bound_) return false;
  const std::size_t open = std::max<std::size_t>(accounts_.load(std::memory_order_relaxed), 1);
  return heldByOne <= bound_ / open;
}

bool QVIntakeBudget::admits(Account& account) {
  if (!isWithin(Account::bytesIn(account.state_.load()))) {
    // Announced before the second look: a removal meanwhile either shows there or sees what was
    // announced and wakes. All four steps are sequentially consistent for that.
    account.state_.fetch_or(Account::kWaits);
    someoneWaits_.store(true);
    if (!isWithin(Account::bytesIn(account.state_.load()))) return false;
  }
  account.state_.fetch_and(~Account::kWaits, std::memory_order_relaxed);
  return true;
}

void QVIntakeBudget::wakeUp() {
  if (!someoneWaits_.exchange(false)) return;
  const QVMutexLock lock(mutex_);
  if (wake_) wake_();
}

void QVIntakeBudget::Account::add(std::size_t bytes) noexcept {
  state_.fetch_add(bytes * kUnit, std::memory_order_relaxed);
  budget_->total_.fetch_add(bytes, std::memory_order_relaxed);
}

void QVIntakeBudget::Account::remove(std::size_t bytes) noexcept {
  const std::size_t total = budget_->total_.fetch_sub(bytes) - bytes;
  const std::size_t ceiling = kCeilingFactor * budget_->bound_;
  const bool fellBelowCeiling = total <= ceiling && total + bytes > ceiling;
  if ((total <= budget_->bound_ || fellBelowCeiling) && budget_->someoneWaits_.load()) {
    budget_->wakeUp();
  }

  // Until here our bytes have kept the account alive; after this another thread may free it.
  std::size_t state = state_.load(std::memory_order_relaxed);
  while ((state & kWaits) == 0) {
    if (state_.compare_exchange_weak(state, state - bytes * kUnit)) {
      if (state == bytes * kUnit) delete this;
      return;
    }
  }
  const auto budget = budget_;
  state = state_.fetch_sub(bytes * kUnit) - bytes * kUnit;
  if (state == 0) {
    delete this;
    return;
  }
  if (budget->isWithin(bytesIn(state))) budget->wakeUp();
}
