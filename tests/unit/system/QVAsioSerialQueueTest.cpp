#include "platform/fake/QVFakeLog.h"
#include "platform/linux/QVWakeUpBatch.h"
#include "platform/linux/queues/QVAsioSerialQueue.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "tests/support/QVAllocationFailure.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <deque>
#include <functional>
#include <memory>
#include <new>
#include <numeric>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// Runs tasks when told.
class ManualExecutor final : public QVWorkExecutor {
 public:
  bool submit(QVWorkItem& task) override {
    if (isClosed_) return false;
    if (std::exchange(refuses_, false)) throw std::bad_alloc();
    tasks_.push_back(std::move(task));
    ++submitCount_;
    return true;
  }
  void close() override { isClosed_ = true; }

  void runOne() {
    QVWorkItem task = std::move(tasks_.front());
    tasks_.pop_front();
    task();
  }
  // The next task finds no memory.
  void refuseOne() { refuses_ = true; }
  int submitCount() const { return submitCount_; }
  std::size_t taskCount() const { return tasks_.size(); }

 private:
  bool isClosed_ = false;
  bool refuses_ = false;
  int submitCount_ = 0;
  std::deque<QVWorkItem> tasks_;
};

class QVAsioSerialQueueTest : public testing::Test {
 protected:
  std::shared_ptr<QVAsioSerialQueue> makeQueue() {
    return std::make_shared<QVAsioSerialQueue>("queue", executor_, timers_, log_);
  }
  QVWorkItem note(const std::string& name) {
    return [this, name] { ran_.push_back(name); };
  }

  QVFakeLog log_;
  ManualExecutor executor_;
  QVAsioTimers timers_;
  std::vector<std::string> ran_;
};

TEST_F(QVAsioSerialQueueTest, SubmitsItselfOnceForABatch) {
  const auto queue = makeQueue();
  queue->async(note("a"));
  queue->async(note("b"));
  EXPECT_EQ(executor_.submitCount(), 1);
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b"));
  EXPECT_EQ(executor_.taskCount(), 0U);
  queue->async(note("c"));
  EXPECT_EQ(executor_.submitCount(), 2);
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b", "c"));
}

TEST_F(QVAsioSerialQueueTest, LetsOthersInBetweenItsBatches) {
  const auto busy = makeQueue();
  const auto other = makeQueue();
  busy->async([this, busy] {
    ran_.emplace_back("busy 1");
    busy->async(note("busy 2"));
  });
  other->async(note("other"));
  while (executor_.taskCount() > 0) executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("busy 1", "other", "busy 2"));
}

TEST_F(QVAsioSerialQueueTest, WaitsForTheEndOfAWakeUpBatch) {
  const auto a = makeQueue();
  const auto b = makeQueue();
  {
    const QVWakeUpBatch outer;
    a->async(note("a1"));
    {
      const QVWakeUpBatch inner;
      b->async(note("b1"));
    }
    a->async(note("a2"));
    EXPECT_EQ(executor_.submitCount(), 0);
  }
  EXPECT_EQ(executor_.submitCount(), 2);
  while (executor_.taskCount() > 0) executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a1", "a2", "b1"));
}

TEST_F(QVAsioSerialQueueTest, LivesUntilItsItemsHaveRun) {
  auto queue = makeQueue();
  const std::weak_ptr<QVAsioSerialQueue> watched = queue;
  queue->async(note("a"));
  queue.reset();
  EXPECT_FALSE(watched.expired());
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a"));
  EXPECT_TRUE(watched.expired());
}

TEST_F(QVAsioSerialQueueTest, DestroysItemsOfAClosedExecutor) {
  const auto queue = makeQueue();
  executor_.close();
  const auto capture = std::make_shared<int>(0);
  queue->async([capture, queue] {});
  EXPECT_EQ(capture.use_count(), 1);
  EXPECT_EQ(queue.use_count(), 1);
  queue->async([capture] {});
  EXPECT_EQ(capture.use_count(), 1);
}

TEST_F(QVAsioSerialQueueTest, DestroysItemsOfAClosedExecutorInTheirOrder) {
  constexpr int kItems = 14;
  const auto queue = makeQueue();
  executor_.close();
  std::vector<int> destroyed;
  {
    const QVWakeUpBatch batch;
    for (int i = 0; i < kItems; ++i) {
      const std::shared_ptr<void> capture(nullptr,
                                          [&destroyed, i](void*) { destroyed.push_back(i); });
      queue->async([capture] {});
    }
    EXPECT_THAT(destroyed, IsEmpty());
  }
  std::vector<int> all(kItems);
  std::iota(all.begin(), all.end(), 0);
  EXPECT_EQ(destroyed, all);
}

// An item whose submission failed stays and may run, too, although its sender was told.
TEST_F(QVAsioSerialQueueTest, RunsWhatItTookOnceAndInOrderWhicheverAllocationFailed) {
  constexpr int kItems = 100;
  bool happened = true;
  for (std::size_t before = 0; happened; ++before) {
    const auto queue = makeQueue();
    std::vector<int> ran;
    std::vector<int> taken;
    ran.reserve(kItems);
    taken.reserve(kItems);
    {
      const QVAllocationFailure failure(before);
      for (int i = 0; i < kItems; ++i) {
        try {
          queue->async([&ran, i] { ran.push_back(i); });
          taken.push_back(i);
        } catch (const std::bad_alloc&) {
        }
      }
      happened = QVAllocationFailure::hasHappened();
    }
    while (executor_.taskCount() > 0) executor_.runOne();
    EXPECT_TRUE(std::ranges::includes(ran, taken)) << before;
    EXPECT_EQ(std::ranges::adjacent_find(ran, std::ranges::greater_equal()), ran.end()) << before;
  }
}

TEST_F(QVAsioSerialQueueTest, GoesOnWhereItCouldNotBeSubmitted) {
  const auto queue = makeQueue();
  executor_.refuseOne();
  EXPECT_THROW(queue->async(note("a")), std::bad_alloc);
  EXPECT_EQ(executor_.taskCount(), 0U);
  queue->async(note("b"));
  ASSERT_EQ(executor_.taskCount(), 1U);
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b"));
}

TEST_F(QVAsioSerialQueueTest, GoesOnWhereItCouldNotBeSubmittedAfterABatch) {
  const auto queue = makeQueue();
  const auto other = makeQueue();
  {
    const QVWakeUpBatch wakeUps;
    queue->async(note("a"));
    other->async(note("other"));
    executor_.refuseOne();
  }
  EXPECT_THAT(log_.renderings(), ElementsAre("3[default] -[QVAsioSerialQueue submit]: exception in "
                                             "work queue queue: std::bad_alloc"));
  queue->async(note("b"));
  while (executor_.taskCount() > 0) executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("other", "a", "b"));
}

TEST_F(QVAsioSerialQueueTest, RunsOnWhereItCouldNotSubmitItselfAgain) {
  const auto queue = makeQueue();
  queue->async([this, queue] {
    ran_.emplace_back("a");
    queue->async(note("b"));
    executor_.refuseOne();
  });
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b"));
  EXPECT_THAT(log_.renderings(), ElementsAre("3[default] -[QVAsioSerialQueue run]: exception in "
                                             "work queue queue: std::bad_alloc"));
  queue->async(note("c"));
  ASSERT_EQ(executor_.taskCount(), 1U);
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b", "c"));
}

TEST_F(QVAsioSerialQueueTest, WakesAnotherQueueOnceForAllItemsOfABatch) {
  const auto first = makeQueue();
  const auto second = makeQueue();
  int submittedWithin = 0;
  first->async([&] { second->async(note("a")); });
  first->async([&] {
    second->async(note("b"));
    submittedWithin = executor_.submitCount();
  });
  executor_.runOne();
  EXPECT_EQ(submittedWithin, 1) << "the first queue's own";
  EXPECT_EQ(executor_.submitCount(), 2);
  executor_.runOne();
  EXPECT_THAT(ran_, ElementsAre("a", "b"));
}

TEST_F(QVAsioSerialQueueTest, WakesAnotherQueueBeforeAnItemWaits) {
  QVStdConditions conditions;
  conditions.cutWaitsShort();
  const auto first = makeQueue();
  const auto second = makeQueue();
  int submittedAfterTheWait = 0;
  first->async([&] {
    second->async(note("a"));
    const auto condition = conditions.makeCondition();
    condition->lock();
    EXPECT_FALSE(condition->waitForTimeout(std::chrono::seconds(9)));
    condition->unlock();
    submittedAfterTheWait = executor_.submitCount();
  });
  executor_.runOne();
  EXPECT_EQ(submittedAfterTheWait, 2) << "what the wait may depend on is under way";
}

}  // namespace
