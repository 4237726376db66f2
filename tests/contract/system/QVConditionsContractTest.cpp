#include "platform/QVCondition.h"
#include "tests/contract/system/QVQueueHarness.h"

#include <chrono>
#include <memory>
#include <mutex>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;

template <class Harness>
class QVConditionsContract : public testing::Test {
 protected:
  // Starts a wait on a queue of its own; `end` is hit once it has ended.
  void startWait(QVDuration timeout, QVCountdown& end) {
    queues_.push_back(harness_.queues().makeSerialQueue("wait", QVQualityOfService::utility, 0));
    queues_.back()->async([this, timeout, &end] {
      condition_->lock();
      ++waitCount_;
      const bool signalled = condition_->waitForTimeout(timeout);
      --waitCount_;
      signalledCount_ += signalled ? 1 : 0;
      ++endedCount_;
      condition_->unlock();
      end.hit();
    });
  }
  // Runs `act` with the lock held, once that many waits have begun; never where all have ended.
  void whenWaiting(int count, QVFunction<void()> act) {
    // What has begun and released the lock waits: the lock is held from the count to the wait.
    harness_.queues().backgroundQueue()->asyncAfter(
        1ms, [this, count, act = std::move(act)]() mutable {
          condition_->lock();
          const bool isReady = waitCount_ == count;
          const bool isTooLate = endedCount_ == queues_.size();
          if (isReady) act();
          condition_->unlock();
          if (!isReady && !isTooLate) whenWaiting(count, std::move(act));
        });
  }
  int signalledCount() {
    condition_->lock();
    const int count = signalledCount_;
    condition_->unlock();
    return count;
  }

  Harness harness_;
  const std::shared_ptr<QVCondition> condition_ = harness_.conditions().makeCondition();
  // With the condition's lock.
  int waitCount_ = 0;
  int signalledCount_ = 0;
  std::size_t endedCount_ = 0;
  std::vector<std::shared_ptr<QVWorkQueue>> queues_;
};

using Harnesses = testing::Types<QVFakeQueueHarness, QVRealQueueHarness>;
TYPED_TEST_SUITE(QVConditionsContract, Harnesses);

TYPED_TEST(QVConditionsContract, EndsAWaitAtItsDeadline) {
  this->condition_->lock();
  EXPECT_FALSE(this->condition_->waitForTimeout(1ms));
  EXPECT_FALSE(this->condition_->waitForTimeout(0ms));
  EXPECT_FALSE(this->condition_->waitForTimeout(-1ms));
  this->condition_->unlock();
}

TYPED_TEST(QVConditionsContract, EndsAWaitBySignal) {
  QVCountdown end(1);
  this->startWait(1min, end);
  this->whenWaiting(1, [this] { this->condition_->signal(); });
  ASSERT_TRUE(this->harness_.runUntil(end));
  EXPECT_EQ(this->signalledCount(), 1);
}

TYPED_TEST(QVConditionsContract, ForgetsASignalThatNobodyWaitsFor) {
  this->condition_->lock();
  this->condition_->signal();
  EXPECT_FALSE(this->condition_->waitForTimeout(1ms));
  this->condition_->unlock();
}

TYPED_TEST(QVConditionsContract, EndsOneWaitPerSignal) {
  QVCountdown end(2);
  this->startWait(1min, end);
  this->startWait(1min, end);
  int endedBeforeSecondSignal = -1;
  this->whenWaiting(2, [&] {
    this->condition_->signal();
    // Only now: before both wait, one that waits is not the one that is left.
    this->whenWaiting(1, [&] {
      endedBeforeSecondSignal = this->signalledCount_;
      this->condition_->signal();
    });
  });
  ASSERT_TRUE(this->harness_.runUntil(end));
  EXPECT_EQ(endedBeforeSecondSignal, 1);
  EXPECT_EQ(this->signalledCount(), 2);
}

TYPED_TEST(QVConditionsContract, EndsAsManyWaitsAsThereAreSignals) {
  QVCountdown end(3);
  for (int i = 0; i < 3; ++i) this->startWait(1min, end);
  this->whenWaiting(3, [this] {
    for (int i = 0; i < 3; ++i) this->condition_->signal();
  });
  ASSERT_TRUE(this->harness_.runUntil(end));
  EXPECT_EQ(this->signalledCount(), 3);
}

TYPED_TEST(QVConditionsContract, CutsPresentAndFutureWaitsShort) {
  QVCountdown end(1);
  this->startWait(24h, end);
  // Not with the lock held: it is the platform that ends the service, not the one who waits.
  QVCountdown isWaiting(1);
  this->whenWaiting(1, [&isWaiting] { isWaiting.hit(); });
  this->harness_.queues().backgroundQueue()->asyncAfter(2ms, [this, &isWaiting] {
    ASSERT_TRUE(this->harness_.runUntil(isWaiting));
    this->harness_.conditions().cutWaitsShort();
  });
  ASSERT_TRUE(this->harness_.runUntil(end));
  EXPECT_EQ(this->signalledCount(), 0);
  this->condition_->lock();
  EXPECT_FALSE(this->condition_->waitForTimeout(24h));
  this->condition_->unlock();
}

}  // namespace
