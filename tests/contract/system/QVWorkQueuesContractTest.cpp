#include "platform/QVWorkQueue.h"
#include "tests/contract/system/QVQueueHarness.h"

#include <chrono>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

template <class Harness>
class QVWorkQueuesContract : public testing::Test {
 protected:
  // One of each kind: with a thread of its own, on shared threads, of background quality.
  std::vector<std::shared_ptr<QVWorkQueue>> makeSerialQueues() {
    std::vector<std::shared_ptr<QVWorkQueue>> queues;
    for (const auto quality : {QVQualityOfService::userInteractive, QVQualityOfService::standard,
                               QVQualityOfService::utility, QVQualityOfService::background}) {
      queues.push_back(harness_.queues().makeSerialQueue("net.quillon.quietvox.test", quality, 0));
    }
    return queues;
  }
  std::shared_ptr<QVWorkQueue> makeUtilityQueue() {
    return harness_.queues().makeSerialQueue("net.quillon.quietvox.test",
                                             QVQualityOfService::utility, 0);
  }

  Harness harness_;
};

using Harnesses = testing::Types<QVFakeQueueHarness, QVRealQueueHarness>;
TYPED_TEST_SUITE(QVWorkQueuesContract, Harnesses);

TYPED_TEST(QVWorkQueuesContract, RunsItemsOfASerialQueueInOrder) {
  constexpr int kCount = 1'000;
  for (const auto& queue : this->makeSerialQueues()) {
    QVCountdown done(1);
    std::vector<int> ran;
    for (int i = 0; i < kCount; ++i) queue->async([&ran, i] { ran.push_back(i); });
    queue->async([&done] { done.hit(); });
    ASSERT_TRUE(this->harness_.runUntil(done));
    ASSERT_EQ(ran.size(), std::size_t{kCount});
    EXPECT_TRUE(std::ranges::is_sorted(ran));
  }
}

TYPED_TEST(QVWorkQueuesContract, RunsItemsThatItemsEnqueue) {
  const auto queue = this->makeUtilityQueue();
  QVCountdown done(2);  // the second and the third, which may run in either order
  std::vector<std::string> ran;
  queue->async([&, queue] {
    queue->async([&] {
      ran.emplace_back("third");
      done.hit();
    });
    ran.emplace_back("first");
  });
  queue->async([&] {
    ran.emplace_back("second");
    done.hit();
  });
  ASSERT_TRUE(this->harness_.runUntil(done));
  // The third was enqueued while the first ran, which may have been before the second was.
  EXPECT_EQ(ran.front(), "first");
  EXPECT_THAT(ran, testing::UnorderedElementsAre("first", "second", "third"));
}

TYPED_TEST(QVWorkQueuesContract, NeverRunsTwoItemsOfASerialQueueAtOnce) {
  constexpr int kThreads = 4;
  constexpr int kItems = 500;
  const auto queues = this->makeSerialQueues();
  const auto others = this->makeSerialQueues();
  for (std::size_t i = 0; i < queues.size(); ++i) {
    QVCountdown done(1 + kThreads * kItems);
    QVCountdown otherRan(1);
    std::atomic<int> running{0};
    std::atomic<int> overlaps{0};
    const auto enqueueAll = [&] {
      std::vector<std::thread> threads;
      for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([&] {
          for (int item = 0; item < kItems; ++item) {
            queues[i]->async([&] {
              if (running.fetch_add(1) != 0) ++overlaps;
              running.fetch_sub(1);
              done.hit();
            });
          }
        });
      }
      for (std::thread& thread : threads) thread.join();
      // Behind them all: whoever ran any of them beside the first would have come to it before.
      std::thread([&] { others[i]->async([&otherRan] { otherRan.hit(); }); }).join();
    };
    queues[i]->async([&] {
      ++running;
      enqueueAll();
      EXPECT_TRUE(this->harness_.runUntil(otherRan));
      --running;
      done.hit();
    });
    ASSERT_TRUE(this->harness_.runUntil(done));
    EXPECT_EQ(overlaps, 0);
  }
}

TYPED_TEST(QVWorkQueuesContract, RunsWorkAfterTheLastHandleWent) {
  for (auto& queue : this->makeSerialQueues()) {
    QVCountdown done(2);
    queue->async([&done] { done.hit(); });
    queue->asyncAfter(1ms, [&done] { done.hit(); });
    queue.reset();
    EXPECT_TRUE(this->harness_.runUntil(done));
  }
}

TYPED_TEST(QVWorkQueuesContract, LetsAnItemDropTheLastHandleToItsQueue) {
  for (auto& queue : this->makeSerialQueues()) {
    QVCountdown done(2);
    auto* const handle = queue.get();
    handle->async([&done, last = std::move(queue)]() mutable {
      last.reset();
      done.hit();
    });
    // This one's queue has no handle but what the queue itself keeps.
    this->harness_.queues().backgroundQueue()->async([&done] { done.hit(); });
    EXPECT_TRUE(this->harness_.runUntil(done));
  }
}

TYPED_TEST(QVWorkQueuesContract, DestroysAnItemBeforeTheNextRuns) {
  for (const auto& queue : this->makeSerialQueues()) {
    QVCountdown done(1);
    auto capture = std::make_shared<int>(0);
    const std::weak_ptr<int> watched = capture;
    bool wasGone = false;
    queue->async([capture = std::move(capture)] {});
    queue->async([&] {
      wasGone = watched.expired();
      done.hit();
    });
    ASSERT_TRUE(this->harness_.runUntil(done));
    EXPECT_TRUE(wasGone);
  }
}

TYPED_TEST(QVWorkQueuesContract, LogsAnExceptionOnceAndGoesOn) {
  for (const auto& queue : this->makeSerialQueues()) {
    QVCountdown done(1);
    this->harness_.log().clear();
    queue->async([] { throw std::runtime_error("broken"); });
    queue->async([&done] { done.hit(); });
    ASSERT_TRUE(this->harness_.runUntil(done));
    const auto lines = this->harness_.log().lines();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].level, QVLogLevel::error);
    EXPECT_EQ(lines[0].scope, "default");
    EXPECT_EQ(lines[0].text, "exception in work queue net.quillon.quietvox.test: broken");
  }
}

TYPED_TEST(QVWorkQueuesContract, LogsAnExceptionOnTheBackgroundQueue) {
  QVCountdown done(1);
  const auto queue = this->harness_.queues().backgroundQueue();
  // Runs behind the log line, when the item is destroyed.
  auto end = std::shared_ptr<void>(nullptr, [&done](void*) { done.hit(); });
  queue->async([end = std::move(end)] { throw std::runtime_error("broken"); });
  ASSERT_TRUE(this->harness_.runUntil(done));
  const auto lines = this->harness_.log().lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].text, "exception in work queue background: broken");
}

TYPED_TEST(QVWorkQueuesContract, RunsDelayedItemsInTheOrderOfTheirMoments) {
  constexpr auto kGap = 10ms;
  for (const auto& queue : this->makeSerialQueues()) {
    // A moment counts from its call: where the calls took longer than their delays differ, another
    // order is right, and it is tried again.
    bool isKnown = false;
    for (int attempt = 0; attempt < 100 && !isKnown; ++attempt) {
      QVCountdown done(4);
      std::vector<std::string> ran;
      const auto note = [&](const char* name) {
        return [&ran, &done, name] {
          ran.emplace_back(name);
          done.hit();
        };
      };
      const auto begin = std::chrono::steady_clock::now();
      queue->asyncAfter(3 * kGap, note("last"));
      queue->asyncAfter(kGap, note("second"));
      queue->asyncAfter(2 * kGap, note("third"));
      queue->asyncAfter(0ms, note("first"));
      isKnown = std::chrono::steady_clock::now() - begin < kGap;
      ASSERT_TRUE(this->harness_.runUntil(done));
      if (isKnown) {
        EXPECT_THAT(ran, ElementsAre("first", "second", "third", "last"));
      }
    }
    EXPECT_TRUE(isKnown);
  }
}

TYPED_TEST(QVWorkQueuesContract, DelaysAgainAfterEveryDelayedItemHasRun) {
  const auto queue = this->makeUtilityQueue();
  for (int round = 0; round < 3; ++round) {
    QVCountdown done(1);
    queue->asyncAfter(1ms, [&done] { done.hit(); });
    ASSERT_TRUE(this->harness_.runUntil(done));
  }
}

TYPED_TEST(QVWorkQueuesContract, HasOneBackgroundQueue) {
  const auto queue = this->harness_.queues().backgroundQueue();
  EXPECT_EQ(queue->label(), "background");
  EXPECT_EQ(this->harness_.queues().backgroundQueue()->label(), "background");
  QVCountdown done(2);
  queue->async([&done] { done.hit(); });
  queue->asyncAfter(1ms, [&done] { done.hit(); });
  EXPECT_TRUE(this->harness_.runUntil(done));
}

TYPED_TEST(QVWorkQueuesContract, AnswersItsLabel) {
  EXPECT_EQ(this->makeUtilityQueue()->label(), "net.quillon.quietvox.test");
}

TYPED_TEST(QVWorkQueuesContract, KeepsOtherQueuesGoingWhileAnItemWaits) {
  const auto condition = this->harness_.conditions().makeCondition();
  const auto waiting = this->makeUtilityQueue();
  const auto signalling = this->makeUtilityQueue();
  QVCountdown done(1);
  bool signalled = false;
  bool isWaiting = false;
  waiting->async([&] {
    condition->lock();
    isWaiting = true;
    signalled = condition->waitForTimeout(1min);
    condition->unlock();
    done.hit();
  });
  // Until the other queue's item waits, this one comes again.
  QVFunction<void()> signal = [&] {
    condition->lock();
    const bool isTooEarly = !isWaiting;
    condition->signal();
    condition->unlock();
    if (isTooEarly) signalling->asyncAfter(1ms, [&signal] { signal(); });
  };
  signalling->async([&signal] { signal(); });
  ASSERT_TRUE(this->harness_.runUntil(done));
  EXPECT_TRUE(signalled);
}

}  // namespace
