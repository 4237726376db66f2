#include "platform/linux/queues/QVAsioRunLoopWaits.h"

#include <utility>

#include <asio/post.hpp>

void QVAsioRunLoopWaits::add(std::shared_ptr<QVAsioRunLoopTimer> timer) {
  const auto fireDate = timer->fireDate();
  if (!fireDate) return;
  const auto* const key = timer.get();
  const auto added =
      waits_.try_emplace(key, Wait{std::move(timer), asio::steady_timer(context_)}).first;
  begin(added->second, *fireDate);
}

void QVAsioRunLoopWaits::begin(Wait& wait, QVAsioRunLoopTimer::Clock::time_point moment) {
  wait.wakeUp.expires_at(moment);
  wait.wakeUp.async_wait(
      [this, timer = wait.timer.get()](const asio::error_code&) { waitEnded(timer); });
}

// At the moment, or because it was cancelled: what matters is when the timer fires now.
void QVAsioRunLoopWaits::waitEnded(const QVAsioRunLoopTimer* timer) {
  const auto found = waits_.find(timer);
  if (found == waits_.end()) return;
  const auto fireDate = found->second.timer->fireDate();
  if (fireDate && *fireDate > QVAsioRunLoopTimer::Clock::now()) {
    begin(found->second, *fireDate);
    return;
  }
  const auto fired = std::move(found->second.timer);
  waits_.erase(found);
  // Whatever it throws passes through run().
  if (auto action = fired->spend()) action();
}

void QVAsioRunLoopWaits::spendAll() {
  for (const auto& [key, wait] : std::exchange(waits_, {})) wait.timer->spend();
}

// The timer may be gone by then, and another one in its place: that is looked at for nothing.
void QVAsioRunLoopWaits::lookAt(const QVAsioRunLoopTimer* timer) {
  asio::post(context_, [this, timer] {
    const auto found = waits_.find(timer);
    if (found != waits_.end()) found->second.wakeUp.cancel();
  });
}
