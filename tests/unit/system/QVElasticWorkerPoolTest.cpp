#include "platform/fake/QVFakeLog.h"
#include "platform/linux/queues/QVElasticWorkerPool.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "tests/unit/system/QVEvent.h"
#include "tests/unit/system/QVThreadEnds.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <semaphore>
#include <thread>
#include <utility>
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

// Where a task waits without the pool's knowing.
class PlainGate {
 public:
  void pass() { passes_.acquire(); }
  void letPass(int count) { passes_.release(count); }

 private:
  std::counting_semaphore<> passes_{0};
};

// Where a task waits so that the pool may use another worker.
class KnownGate {
 public:
  explicit KnownGate(std::shared_ptr<QVCondition> condition) : condition_(std::move(condition)) {}

  void pass() {
    condition_->lock();
    while (passCount_ == 0) condition_->waitForTimeout(1min);
    --passCount_;
    condition_->unlock();
  }
  void letPass(int count) {
    condition_->lock();
    passCount_ += count;
    for (int i = 0; i < count; ++i) condition_->signal();
    condition_->unlock();
  }

 private:
  const std::shared_ptr<QVCondition> condition_;
  int passCount_ = 0;  // with the condition's lock
};

class QVElasticWorkerPoolBoundTest : public QVElasticWorkerPoolTest {
 protected:
  // Expects that of many tasks, each of which keeps its worker at the gate, so many run at once.
  template <class Gate>
  void expectAtOnce(int count, Gate& gate) {
    constexpr int kTasks = 1'000;
    std::counting_semaphore<> begun{0};
    std::atomic<int> running{0};
    std::atomic<int> most{0};
    for (int i = 0; i < kTasks; ++i) {
      submit([&] {
        const int now = ++running;
        int known = most;
        while (known < now && !most.compare_exchange_weak(known, now)) {
        }
        begun.release();
        gate.pass();
        --running;
      });
    }
    bool goesOn = true;
    for (int i = 0; i < count && goesOn; ++i) goesOn = begun.try_acquire_for(1min);
    EXPECT_TRUE(goesOn) << "as many as may run do";
    // One at a time: a worker too many has until the last one to begin a task.
    for (int i = count; i < kTasks && goesOn; ++i) {
      gate.letPass(1);
      goesOn = begun.try_acquire_for(1min);
    }
    EXPECT_TRUE(goesOn) << "one that ends makes room for the next";
    gate.letPass(kTasks);
    ledger_.waitUntilEmpty();
    EXPECT_EQ(most, count);
  }
};

TEST_F(QVElasticWorkerPoolBoundTest, HasNoMoreWorkersThanItsLimit) {
  makePool({.concurrency = 2, .workers = 3, .rest = 5s});
  KnownGate gate(condition_);
  expectAtOnce(3, gate);
}

TEST_F(QVElasticWorkerPoolBoundTest, RunsNoMoreAtOnceThanItsConcurrency) {
  makePool({.concurrency = 2, .workers = 64, .rest = 5s});
  PlainGate gate;
  expectAtOnce(2, gate);
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
