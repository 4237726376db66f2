#include "platform/fake/QVFakeWorkQueues.h"

#include "platform/fake/QVFakeWorkQueue.h"

#include <algorithm>
#include <exception>

namespace {

using State = QVFakeWorkQueuesState;

// Enqueues the delayed items whose moment has come. The mutex is held.
void enqueueDue(State& state) {
  while (!state.delayed.empty() && state.delayed.begin()->first.first <= state.clock.steadyTime()) {
    state.ready.push_back(std::move(state.delayed.begin()->second));
    state.delayed.erase(state.delayed.begin());
  }
}

std::optional<QVDuration> nextDue(const State& state) {
  const std::lock_guard lock(state.mutex);
  if (state.delayed.empty()) return std::nullopt;
  return state.delayed.begin()->first.first;
}

std::shared_ptr<QVFakeQueueData> makeQueue(State& state, std::string_view label,
                                           QVQualityOfService quality, int32_t relativePriority,
                                           bool serial) {
  auto queue = std::make_shared<QVFakeQueueData>(
      QVFakeQueueData{std::string(label), quality, relativePriority, serial});
  state.queues.push_back(queue);
  return queue;
}

}  // namespace

QVFakeWorkQueues::QVFakeWorkQueues(QVFakeClock& clock, QVLog& log)
    : clock_(clock), log_(log), state_(std::make_shared<State>(clock)) {}

std::shared_ptr<QVWorkQueue> QVFakeWorkQueues::makeSerialQueue(std::string_view label,
                                                               QVQualityOfService quality,
                                                               int32_t relativePriority) {
  const std::lock_guard lock(state_->mutex);
  return std::make_shared<QVFakeWorkQueue>(
      state_, makeQueue(*state_, label, quality, relativePriority, true));
}

std::shared_ptr<QVWorkQueue> QVFakeWorkQueues::backgroundQueue() {
  const std::lock_guard lock(state_->mutex);
  if (state_->background == nullptr) {
    state_->background =
        makeQueue(*state_, kBackgroundLabel, QVQualityOfService::background, 0, false);
  }
  return std::make_shared<QVFakeWorkQueue>(state_, state_->background);
}

bool QVFakeWorkQueues::runOne(const std::optional<std::string_view>& label) {
  State::Entry entry;
  {
    const std::lock_guard lock(state_->mutex);
    enqueueDue(*state_);
    const auto found = std::ranges::find_if(state_->ready, [&](const State::Entry& candidate) {
      const QVFakeQueueData& queue = *candidate.queue;
      return !(queue.serial && queue.onStackCount > 0) && (!label || queue.label == *label);
    });
    if (found == state_->ready.end()) return false;
    entry = std::move(*found);
    state_->ready.erase(found);
    ++entry.queue->onStackCount;
    state_->stack.push_back(entry.queue);
  }
  try {
    entry.item();
  } catch (const std::exception& exception) {
    log_.error(nullptr, __func__, "exception in work queue ", entry.queue->label, ": ",
               exception.what());
  } catch (...) {
    log_.error(nullptr, __func__, "exception in work queue ", entry.queue->label,
               ": of unknown type");
  }
  entry.item = nullptr;
  const std::lock_guard lock(state_->mutex);
  state_->stack.pop_back();
  --entry.queue->onStackCount;
  ++entry.queue->runCount;
  return true;
}

std::size_t QVFakeWorkQueues::runUntilIdle() {
  std::size_t count = 0;
  while (runOne(std::nullopt)) ++count;
  return count;
}

std::size_t QVFakeWorkQueues::runUntilIdle(std::string_view label) {
  std::size_t count = 0;
  while (runOne(label)) ++count;
  return count;
}

void QVFakeWorkQueues::advance(QVDuration duration) {
  const QVDuration target = clock_.steadyTime() + duration;
  for (;;) {
    runUntilIdle();
    const auto due = nextDue(*state_);
    if (!due || *due > target) break;
    clock_.advanceTo(*due);
  }
  clock_.advanceTo(target);
}

void QVFakeWorkQueues::after(QVDuration delay, QVWorkItem item) {
  const auto queue = std::make_shared<QVFakeQueueData>(
      QVFakeQueueData{"test", QVQualityOfService::standard, 0, false});
  QVFakeWorkQueue(state_, queue).asyncAfter(delay, std::move(item));
}

void QVFakeWorkQueues::discard() {
  // Items may hold handles, and with them the state that holds the items: only emptying it breaks
  // that ring. They are destroyed without the lock, since what they capture may enqueue again.
  std::deque<State::Entry> ready;
  decltype(State::delayed) delayed;
  const std::lock_guard lock(state_->mutex);
  state_->closed = true;
  ready.swap(state_->ready);
  delayed.swap(state_->delayed);
}

bool QVFakeWorkQueues::runOthersUntil(QVDuration deadline, const std::function<bool()>& done) {
  for (;;) {
    if (done()) return true;
    if (runOne(std::nullopt)) continue;
    const auto due = nextDue(*state_);
    if (!due || *due > deadline) break;
    clock_.advanceTo(*due);
  }
  clock_.advanceTo(deadline);
  return false;
}

std::size_t QVFakeWorkQueues::pendingCount(std::string_view label) const {
  const std::lock_guard lock(state_->mutex);
  return static_cast<std::size_t>(std::ranges::count_if(
      state_->ready, [label](const State::Entry& entry) { return entry.queue->label == label; }));
}

std::size_t QVFakeWorkQueues::pendingCount() const {
  const std::lock_guard lock(state_->mutex);
  return state_->ready.size();
}

std::size_t QVFakeWorkQueues::delayedCount(std::string_view label) const {
  const std::lock_guard lock(state_->mutex);
  return static_cast<std::size_t>(std::ranges::count_if(
      state_->delayed,
      [label](const auto& delayed) { return delayed.second.queue->label == label; }));
}

std::size_t QVFakeWorkQueues::delayedCount() const {
  const std::lock_guard lock(state_->mutex);
  return state_->delayed.size();
}

std::vector<QVFakeWorkQueues::QueueRecord> QVFakeWorkQueues::queues() const {
  const std::lock_guard lock(state_->mutex);
  std::vector<QueueRecord> records;
  for (const auto& queue : state_->queues) {
    records.push_back({queue->label, queue->quality, queue->relativePriority, queue->enqueuedCount,
                       queue->runCount});
  }
  return records;
}
