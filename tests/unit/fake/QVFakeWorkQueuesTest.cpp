#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeWorkQueues.h"

#include <chrono>
#include <stdexcept>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class QVFakeWorkQueuesTest : public testing::Test {
 protected:
  std::shared_ptr<QVWorkQueue> makeQueue(const std::string& label) {
    return queues_.makeSerialQueue(label, QVQualityOfService::utility, 0);
  }
  // An item that notes its name.
  QVWorkItem note(const std::string& name) {
    return [this, name] { ran_.push_back(name); };
  }

  QVFakeClock clock_;
  QVFakeLog log_;
  QVFakeWorkQueues queues_{clock_, log_};
  std::vector<std::string> ran_;
};

TEST_F(QVFakeWorkQueuesTest, RunsNothingUntilTold) {
  const auto queue = makeQueue("a");
  queue->async(note("one"));
  EXPECT_THAT(ran_, ElementsAre());
  EXPECT_EQ(queues_.pendingCount("a"), 1U);
  EXPECT_EQ(queues_.runUntilIdle(), 1U);
  EXPECT_THAT(ran_, ElementsAre("one"));
  EXPECT_EQ(queues_.pendingCount(), 0U);
}

TEST_F(QVFakeWorkQueuesTest, RunsAcrossQueuesInTheOrderOfEnqueueing) {
  const auto a = makeQueue("a");
  const auto b = makeQueue("b");
  a->async([this, b] {
    ran_.emplace_back("a1");
    b->async(note("b2"));
  });
  b->async(note("b1"));
  a->async(note("a2"));
  queues_.runUntilIdle();
  EXPECT_THAT(ran_, ElementsAre("a1", "b1", "a2", "b2"));
}

TEST_F(QVFakeWorkQueuesTest, RunsTheQueuesOfOneLabelOnly) {
  const auto a = makeQueue("a");
  const auto b = makeQueue("b");
  b->async(note("b"));
  a->async(note("a"));
  EXPECT_EQ(queues_.runUntilIdle("a"), 1U);
  EXPECT_THAT(ran_, ElementsAre("a"));
  EXPECT_EQ(queues_.pendingCount("b"), 1U);
}

TEST_F(QVFakeWorkQueuesTest, AdvancesFromOneDueMomentToTheNext) {
  const auto queue = makeQueue("a");
  std::vector<QVDuration> moments;
  const auto noteMoment = [this, &moments] { moments.push_back(clock_.steadyTime()); };
  queue->asyncAfter(3s, noteMoment);
  queue->asyncAfter(1s, [&, queue] {
    noteMoment();
    queue->asyncAfter(1s, noteMoment);
  });
  queue->asyncAfter(9s, noteMoment);
  queue->async(noteMoment);
  queues_.advance(5s);
  EXPECT_THAT(moments, ElementsAre(0s, 1s, 2s, 3s));
  EXPECT_EQ(clock_.steadyTime(), 5s);
  EXPECT_EQ(clock_.currentDate(), QVFakeClock::kStart + 5s);
  EXPECT_EQ(queues_.delayedCount("a"), 1U);
}

TEST_F(QVFakeWorkQueuesTest, RunsItemsOfTheSameMomentInTheOrderOfEnqueueing) {
  const auto a = makeQueue("a");
  const auto b = makeQueue("b");
  b->asyncAfter(1s, note("b"));
  a->asyncAfter(1s, note("a"));
  queues_.advance(1s);
  EXPECT_THAT(ran_, ElementsAre("b", "a"));
}

TEST_F(QVFakeWorkQueuesTest, RunsWorkOfADroppedHandle) {
  auto queue = makeQueue("a");
  queue->async(note("one"));
  queue->asyncAfter(1s, note("later"));
  queue.reset();
  queues_.advance(1s);
  EXPECT_THAT(ran_, ElementsAre("one", "later"));
}

TEST_F(QVFakeWorkQueuesTest, LogsAnExceptionOnceAndGoesOn) {
  const auto queue = makeQueue("a");
  queue->async([] { throw std::runtime_error("broken"); });
  queue->async([] { throw 7; });  // NOLINT(hicpp-exception-baseclass): any kind is caught
  queue->async(note("next"));
  queues_.runUntilIdle();
  EXPECT_THAT(ran_, ElementsAre("next"));
  EXPECT_THAT(log_.renderings(),
              ElementsAre("3[default] runOne: exception in work queue a: broken",
                          "3[default] runOne: exception in work queue a: of unknown type"));
}

TEST_F(QVFakeWorkQueuesTest, DestroysAnItemRightAfterItRan) {
  const auto queue = makeQueue("a");
  const auto token = std::make_shared<int>(0);
  queue->async([token] {});
  queue->async([this, token] { ran_.push_back(std::to_string(token.use_count())); });
  queues_.runUntilIdle();
  EXPECT_THAT(ran_, ElementsAre("2"));
  EXPECT_EQ(token.use_count(), 1);
}

TEST_F(QVFakeWorkQueuesTest, DestroysWhatHasNotRunAndTakesNothingMore) {
  const auto token = std::make_shared<int>(0);
  auto queues = std::make_unique<QVFakeWorkQueues>(clock_, log_);
  const auto queue = queues->makeSerialQueue("a", QVQualityOfService::utility, 0);
  // The items hold their queue: without help they would keep each other alive.
  queue->async([queue, token] {});
  queue->asyncAfter(1s, [queue, token] {});
  queues.reset();
  EXPECT_EQ(token.use_count(), 1);
  queue->async([token] {});
  EXPECT_EQ(token.use_count(), 1);
}

TEST_F(QVFakeWorkQueuesTest, RecordsEveryQueue) {
  const auto a = queues_.makeSerialQueue("a", QVQualityOfService::userInteractive, -1);
  a->async([] {});
  queues_.runUntilIdle();
  a->asyncAfter(1s, [] {});
  queues_.backgroundQueue()->async([] {});
  EXPECT_EQ(queues_.backgroundQueue()->label(), QVFakeWorkQueues::kBackgroundLabel);
  queues_.after(1s, [] {});
  const auto records = queues_.queues();
  ASSERT_EQ(records.size(), 2U);
  EXPECT_EQ(records[0].label, "a");
  EXPECT_EQ(records[0].quality, QVQualityOfService::userInteractive);
  EXPECT_EQ(records[0].relativePriority, -1);
  EXPECT_EQ(records[0].enqueuedCount, 2U);
  EXPECT_EQ(records[0].runCount, 1U);
  EXPECT_EQ(records[1].label, QVFakeWorkQueues::kBackgroundLabel);
  EXPECT_EQ(records[1].quality, QVQualityOfService::background);
  EXPECT_EQ(records[1].enqueuedCount, 1U);
}

TEST_F(QVFakeWorkQueuesTest, LetsOtherQueuesGoOnWhileAnItemWaits) {
  const auto a = makeQueue("a");
  const auto b = makeQueue("b");
  bool done = false;
  a->async([&] {
    EXPECT_TRUE(queues_.runOthersUntil(10s, [&done] { return done; }));
    ran_.emplace_back("a1");
  });
  a->async(note("a2"));
  b->async(note("b1"));
  b->asyncAfter(2s, [&] {
    ran_.emplace_back("b2");
    done = true;
  });
  queues_.runUntilIdle();
  EXPECT_THAT(ran_, ElementsAre("b1", "b2", "a1", "a2"));
  EXPECT_EQ(clock_.steadyTime(), 2s);
}

TEST_F(QVFakeWorkQueuesTest, LetsTheBackgroundQueueRunWhileOneOfItsItemsWaits) {
  const auto queue = queues_.backgroundQueue();
  bool done = false;
  queue->async([&] { EXPECT_TRUE(queues_.runOthersUntil(1s, [&done] { return done; })); });
  queue->async([&done] { done = true; });
  EXPECT_EQ(queues_.runUntilIdle(), 1U) << "the second ran inside of the first";
  EXPECT_TRUE(done);
}

}  // namespace
