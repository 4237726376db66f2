#include "platform/linux/queues/QVStdCondition.h"
#include "platform/linux/queues/QVStdConditions.h"

#include <chrono>
#include <memory>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class QVStdConditionTest : public testing::Test {
 protected:
  ~QVStdConditionTest() override {
    for (std::thread& thread : threads_) thread.join();
  }

  // Begins a wait on a thread of its own and returns when it waits.
  void startWait(int name, QVDuration timeout) {
    threads_.emplace_back([this, name, timeout] {
      condition_->lock();
      ++waitCount_;
      const bool signalled = condition_->waitForTimeout(timeout);
      ends_.push_back(signalled ? name : -name);
      condition_->unlock();
    });
    const auto count = static_cast<int>(threads_.size());
    while (true) {
      condition_->lock();
      const bool waits = waitCount_ == count;
      condition_->unlock();
      if (waits) return;
      std::this_thread::yield();
    }
  }
  void signal() {
    condition_->lock();
    condition_->signal();
    condition_->unlock();
  }
  void joinAll() {
    for (std::thread& thread : threads_) thread.join();
    threads_.clear();
  }

  QVStdConditions conditions_;
  const std::shared_ptr<QVStdCondition> condition_ = std::make_shared<QVStdCondition>(conditions_);
  // With the condition's lock.
  int waitCount_ = 0;
  std::vector<int> ends_;
  std::vector<std::thread> threads_;
};

TEST_F(QVStdConditionTest, EndsTheOldestWaitFirst) {
  startWait(1, 1min);
  startWait(2, 1min);
  signal();
  threads_.front().join();
  threads_.erase(threads_.begin());
  signal();
  joinAll();
  EXPECT_THAT(ends_, ElementsAre(1, 2));
}

TEST_F(QVStdConditionTest, DoesNotTakeAWakeUpForASignal) {
  startWait(1, 1min);
  for (int i = 0; i < 1'000; ++i) condition_->wakeAll();
  condition_->lock();
  // Lets the other one have the lock, which it has to have to end.
  EXPECT_FALSE(condition_->waitForTimeout(20ms));
  EXPECT_THAT(ends_, ElementsAre());
  condition_->unlock();
  signal();
  joinAll();
  EXPECT_THAT(ends_, ElementsAre(1));
}

TEST_F(QVStdConditionTest, DoesNotMoveTheDeadlineForAWakeUp) {
  startWait(1, 20ms);
  bool hasEnded = false;
  // Were each wake-up a new beginning, this would go on until the test is stopped from outside.
  while (!hasEnded) {
    condition_->wakeAll();
    condition_->lock();
    hasEnded = !ends_.empty();
    condition_->unlock();
  }
  joinAll();
  EXPECT_THAT(ends_, ElementsAre(-1));
}

TEST_F(QVStdConditionTest, GivesASignalToNoWaitThatBeganAfterIt) {
  startWait(1, 1min);
  condition_->lock();
  condition_->signal();
  // Begins before the thread that is signalled can have the lock.
  EXPECT_FALSE(condition_->waitForTimeout(1ms));
  condition_->unlock();
  joinAll();
  EXPECT_THAT(ends_, ElementsAre(1));
}

TEST_F(QVStdConditionTest, CutsEveryPresentWaitShort) {
  for (int i = 1; i <= 5; ++i) startWait(i, 24h);
  conditions_.cutWaitsShort();
  joinAll();
  EXPECT_THAT(ends_, testing::UnorderedElementsAre(-1, -2, -3, -4, -5));
}

TEST_F(QVStdConditionTest, MayLoseItsLastHandleRightAfterAWait) {
  for (int i = 0; i < 100; ++i) {
    auto condition = conditions_.makeCondition();
    const std::weak_ptr<QVCondition> watched = condition;
    std::thread waiter([condition] {
      condition->lock();
      EXPECT_FALSE(condition->waitForTimeout(0ms));
      condition->unlock();
    });
    condition.reset();
    waiter.join();
    EXPECT_TRUE(watched.expired()) << "what knew of its wait keeps it";
  }
}

}  // namespace
