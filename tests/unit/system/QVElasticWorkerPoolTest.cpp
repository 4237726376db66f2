#include "platform/fake/QVFakeLog.h"
#include "platform/linux/queues/QVElasticWorkerPool.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "tests/unit/system/QVEvent.h"
#include "tests/unit/system/QVThreadEnds.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <semaphore>
#include <set>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;

class QVElasticWorkerPoolTest : public testing::Test {
 protected:
  void makePool(QVElasticWorkerPool::Limits limits) {
    pool_ = std::make_unique<QVElasticWorkerPool>("test", 0, log_, ledger_, limits);
  }
  void submit(QVWorkItem task) { EXPECT_TRUE(pool_->submit(task)); }

  // Submits `count` tasks that wait until endWaits(), and returns when all of them wait.
  void startWaits(int count) {
    QVEvent allWait;
    for (int i = 0; i < count; ++i) {
      submit([this, count, &allWait] {
        condition_->lock();
        if (++waitCount_ == count) allWait.happen();
        while (!mayEnd_) condition_->waitForTimeout(1min);
        condition_->unlock();
      });
    }
    EXPECT_TRUE(allWait.wait());
  }
  void endWaits() {
    condition_->lock();
    mayEnd_ = true;
    for (int i = 0; i < waitCount_; ++i) condition_->signal();
    condition_->unlock();
  }

  QVFakeLog log_;
  QVWorkLedger ledger_;
  QVStdConditions conditions_;
  const std::shared_ptr<QVCondition> condition_ = conditions_.makeCondition();
  // With the condition's lock.
  int waitCount_ = 0;
  bool mayEnd_ = false;
  std::unique_ptr<QVElasticWorkerPool> pool_;
};

TEST_F(QVElasticWorkerPoolTest, RunsOtherWorkWhileTwoHundredTasksWait) {
  makePool({});
  startWaits(200);
  QVEvent ran;
  submit([&ran] { ran.happen(); });
  EXPECT_TRUE(ran.wait());
  endWaits();
  ledger_.waitUntilEmpty();
}

TEST_F(QVElasticWorkerPoolTest, RetiresAllRestingWorkersButOne) {
  constexpr int kCount = 20;
  makePool({.concurrency = 2, .workers = 64, .rest = 1ms});
  QVThreadEnds ends;
  QVEvent allWait;
  for (int i = 0; i < kCount; ++i) {
    submit([this, &ends, &allWait] {
      ends.watchThisThread();
      condition_->lock();
      if (++waitCount_ == kCount) allWait.happen();
      while (!mayEnd_) condition_->waitForTimeout(1min);
      condition_->unlock();
    });
  }
  ASSERT_TRUE(allWait.wait());
  endWaits();
  ledger_.waitUntilEmpty();
  EXPECT_TRUE(ends.waitUntilLeft(1));
  EXPECT_EQ(ends.watchedCount(), kCount);
  // One is left, or is made again.
  QVEvent ran;
  submit([&ran] { ran.happen(); });
  EXPECT_TRUE(ran.wait());
  pool_->close();
  EXPECT_EQ(ends.leftCount(), 0) << "closing ends the last one, too";
}

TEST_F(QVElasticWorkerPoolTest, RunsWhatHasNoWorkerWhereItIsAskedTo) {
  makePool({.workers = 0});
  std::vector<std::thread::id> threads;
  for (int i = 0; i < 3; ++i) {
    submit([&threads] { threads.push_back(std::this_thread::get_id()); });
  }
  EXPECT_THAT(threads, testing::IsEmpty());
  EXPECT_FALSE(ledger_.waitUntilEmpty(0s));
  pool_->runUnattended();
  EXPECT_EQ(threads, std::vector(3, std::this_thread::get_id()));
  EXPECT_TRUE(ledger_.waitUntilEmpty(0s));
}

TEST_F(QVElasticWorkerPoolTest, HasNoMoreWorkersThanItsLimit) {
  constexpr int kTasks = 12;
  makePool({.concurrency = 2, .workers = 3, .rest = 5s});
  std::mutex mutex;
  std::set<std::thread::id> threads;
  std::atomic<int> early{0};
  QVEvent threeWait;
  for (int i = 0; i < kTasks; ++i) {
    submit([&] {
      {
        const std::lock_guard lock(mutex);
        threads.insert(std::this_thread::get_id());
      }
      condition_->lock();
      if (++waitCount_ == 3) threeWait.happen();
      if (waitCount_ > 3 && !mayEnd_) ++early;
      while (!mayEnd_) condition_->waitForTimeout(1min);
      condition_->unlock();
    });
  }
  ASSERT_TRUE(threeWait.wait());
  endWaits();
  ledger_.waitUntilEmpty();
  EXPECT_EQ(threads.size(), 3U);
  EXPECT_EQ(early, 0);
  EXPECT_EQ(waitCount_, kTasks);
}

TEST_F(QVElasticWorkerPoolTest, RunsNoMoreAtOnceThanItsConcurrency) {
  constexpr int kConcurrency = 2;
  constexpr int kTasks = 100;
  makePool({.concurrency = kConcurrency, .workers = 64, .rest = 5s});
  // Each task keeps its worker, without the pool's knowing that it waits, until it is let go.
  std::counting_semaphore<kTasks> begun{0};
  std::counting_semaphore<kTasks> mayEnd{0};
  std::atomic<int> running{0};
  std::atomic<int> most{0};
  for (int i = 0; i < kTasks; ++i) {
    submit([&] {
      const int now = ++running;
      int known = most;
      while (known < now && !most.compare_exchange_weak(known, now)) {
      }
      begun.release();
      mayEnd.acquire();
      --running;
    });
  }
  bool goesOn = true;
  for (int i = 0; i < kConcurrency; ++i) goesOn = goesOn && begun.try_acquire_for(1min);
  EXPECT_TRUE(goesOn) << "as many as may run do";
  // One at a time: a worker too many has until the last one to begin a task.
  for (int i = kConcurrency; i < kTasks && goesOn; ++i) {
    mayEnd.release();
    goesOn = begun.try_acquire_for(1min);
  }
  EXPECT_TRUE(goesOn) << "one that ends makes room for the next";
  mayEnd.release(kTasks);
  ledger_.waitUntilEmpty();
  EXPECT_EQ(most, kConcurrency);
}

TEST_F(QVElasticWorkerPoolTest, KnowsItsOwnThreads) {
  makePool({});
  EXPECT_EQ(QVElasticWorkerPool::current(), nullptr);
  QVElasticWorkerPool* current = nullptr;
  submit([&current] { current = QVElasticWorkerPool::current(); });
  ledger_.waitUntilEmpty();
  EXPECT_EQ(current, pool_.get());
}

TEST_F(QVElasticWorkerPoolTest, RunsWhatItTookAndNothingAfterItsClose) {
  makePool({.concurrency = 1, .workers = 1, .rest = 5s});
  std::atomic<int> ran{0};
  for (int i = 0; i < 100; ++i) submit([&ran] { ++ran; });
  pool_->close();
  EXPECT_EQ(ran, 100);
  QVWorkItem late = [&ran] { ++ran; };
  EXPECT_FALSE(pool_->submit(late));
  EXPECT_TRUE(static_cast<bool>(late)) << "a refused task stays the caller's";
  pool_->close();
}

}  // namespace
