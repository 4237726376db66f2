#include "platform/fake/QVFakeLog.h"
#include "platform/linux/QVThreads.h"
#include "platform/linux/queues/QVAsioWorkQueues.h"
#include "platform/linux/queues/QVStdConditions.h"
#include "tests/unit/system/QVEvent.h"

#include <array>
#include <chrono>
#include <csignal>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

// The calling thread, as the kernel sees it.
struct ThreadFacts {
  std::string name;
  int niceness = 0;
  bool takesTermination = true;

  static ThreadFacts ofThisThread() {
    std::array<char, 16> name{};
    pthread_getname_np(pthread_self(), name.data(), name.size());
    sigset_t blocked;
    pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
    return {name.data(), getpriority(PRIO_PROCESS, 0), sigismember(&blocked, SIGTERM) == 0};
  }
};

class QVAsioWorkQueuesTest : public testing::Test {
 protected:
  ThreadFacts factsOf(QVWorkQueue& queue) {
    ThreadFacts facts;
    QVEvent ran;
    queue.async([&] {
      facts = ThreadFacts::ofThisThread();
      ran.happen();
    });
    EXPECT_TRUE(ran.wait());
    return facts;
  }

  QVFakeLog log_;
  QVStdConditions conditions_;
  QVAsioWorkQueues queues_{log_};
};

TEST_F(QVAsioWorkQueuesTest, NamesThreadsAndSetsTheirNiceness) {
  const int base = getpriority(PRIO_PROCESS, static_cast<id_t>(getpid()));
  const auto server = factsOf(*queues_.makeSerialQueue("net.quillon.quietvox.reporting.server",
                                                       QVQualityOfService::userInteractive, 0));
  EXPECT_EQ(server.name, "qv-server");
  EXPECT_LE(server.niceness, base) << "less is granted only where it is permitted";
  const auto session = factsOf(*queues_.makeSerialQueue("net.quillon.quietvox.session.beacon",
                                                        QVQualityOfService::utility, 0));
  EXPECT_EQ(session.name, "qv-utility");
  EXPECT_EQ(session.niceness, std::min(base + 5, 19));
  const auto background = factsOf(*queues_.backgroundQueue());
  EXPECT_EQ(background.name, "qv-background");
  EXPECT_EQ(background.niceness, std::min(base + 10, 19));
  for (const ThreadFacts& facts : {server, session, background}) {
    EXPECT_FALSE(facts.takesTermination) << facts.name;
  }
}

TEST(QVThreadsTest, MakesLessUrgentWorkNicer) {
  using enum QVQualityOfService;
  EXPECT_EQ(QVNicenessForQuality(userInteractive, 0), -5);
  EXPECT_EQ(QVNicenessForQuality(userInteractive, -3), -2);
  EXPECT_EQ(QVNicenessForQuality(userInitiated, 0), -2);
  EXPECT_EQ(QVNicenessForQuality(standard, 0), 0);
  EXPECT_EQ(QVNicenessForQuality(utility, 0), 5);
  EXPECT_EQ(QVNicenessForQuality(background, 0), 10);
  EXPECT_EQ(QVNicenessForQuality(background, -100), 19);
  EXPECT_EQ(QVNicenessForQuality(standard, 5), 0) << "priorities above the class do not exist";
}

TEST_F(QVAsioWorkQueuesTest, KeepsTheServerQueueOnOneThread) {
  const auto queue = queues_.makeSerialQueue("server", QVQualityOfService::userInteractive, 0);
  std::vector<std::thread::id> threads;
  QVEvent done;
  for (int i = 0; i < 100; ++i) {
    queue->async([&threads] { threads.push_back(std::this_thread::get_id()); });
  }
  queue->async([&done] { done.happen(); });
  ASSERT_TRUE(done.wait());
  EXPECT_THAT(threads, testing::Each(threads.front()));
  EXPECT_NE(threads.front(), std::this_thread::get_id());
}

TEST_F(QVAsioWorkQueuesTest, RunsEverythingAtTheEndWithoutThreads) {
  std::vector<std::string> ran;
  {
    QVAsioWorkQueues queues(log_, {.workers = 0});
    queues.makeSerialQueue("a", QVQualityOfService::utility, 0)->async([&] {
      ran.emplace_back("utility");
      queues.backgroundQueue()->async([&ran] { ran.emplace_back("background"); });
    });
    queues.drain();
  }
  EXPECT_THAT(ran, ElementsAre("utility", "background"));
}

TEST_F(QVAsioWorkQueuesTest, RunsDelayedItemsAtOnceAtTheEnd) {
  const auto queue = queues_.makeSerialQueue("a", QVQualityOfService::utility, 0);
  std::vector<std::string> ran;
  queue->asyncAfter(59s, [&ran] { ran.emplace_back("second"); });
  queue->asyncAfter(24h * 365 * 200, [&ran] { ran.emplace_back("third"); });
  queue->asyncAfter(10s, [&ran] { ran.emplace_back("first"); });
  queues_.drain();
  EXPECT_THAT(ran, ElementsAre("first", "second", "third"));
}

TEST_F(QVAsioWorkQueuesTest, RunsWhatTheLastItemsEnqueue) {
  const auto server = queues_.makeSerialQueue("server", QVQualityOfService::userInteractive, 0);
  const auto session = queues_.makeSerialQueue("session", QVQualityOfService::utility, 0);
  std::atomic<bool> reachedTheEnd{false};
  server->async([&, session] {
    session->async([&] {
      queues_.backgroundQueue()->asyncAfter(
          59s, [&] { server->asyncAfter(59s, [&reachedTheEnd] { reachedTheEnd = true; }); });
    });
  });
  queues_.drain();
  EXPECT_TRUE(reachedTheEnd);
}

TEST_F(QVAsioWorkQueuesTest, EndsWithWaitsCutShort) {
  const auto condition = conditions_.makeCondition();
  const auto session = queues_.makeSerialQueue("session", QVQualityOfService::utility, 0);
  bool signalled = true;
  session->async([&] {
    condition->lock();
    signalled = condition->waitForTimeout(24h);
    condition->unlock();
  });
  conditions_.cutWaitsShort();
  queues_.drain();
  EXPECT_FALSE(signalled);
}

TEST_F(QVAsioWorkQueuesTest, DestroysWhatComesAfterTheEnd) {
  const auto own = queues_.makeSerialQueue("a", QVQualityOfService::userInteractive, 0);
  const auto shared = queues_.makeSerialQueue("b", QVQualityOfService::utility, 0);
  const auto background = queues_.backgroundQueue();
  queues_.drain();
  queues_.drain();
  const auto capture = std::make_shared<bool>(false);
  for (const auto& queue : {own, shared, background}) {
    queue->async([capture] { *capture = true; });
    queue->asyncAfter(1ms, [capture] { *capture = true; });
  }
  EXPECT_FALSE(*capture);
  EXPECT_EQ(capture.use_count(), 1);
}

TEST_F(QVAsioWorkQueuesTest, LetsTwoHundredWaitingQueuesDelayNoOther) {
  constexpr int kCount = 200;
  const auto condition = conditions_.makeCondition();
  int waitCount = 0;
  bool mayEnd = false;
  QVEvent allWait;
  std::vector<std::shared_ptr<QVWorkQueue>> waiting;
  for (int i = 0; i < kCount; ++i) {
    waiting.push_back(queues_.makeSerialQueue("session", QVQualityOfService::utility, 0));
    waiting.back()->async([&] {
      condition->lock();
      if (++waitCount == kCount) allWait.happen();
      while (!mayEnd) condition->waitForTimeout(1min);
      condition->unlock();
    });
  }
  ASSERT_TRUE(allWait.wait());
  QVEvent ran;
  queues_.makeSerialQueue("other", QVQualityOfService::utility, 0)->async([&ran] { ran.happen(); });
  EXPECT_TRUE(ran.wait());
  condition->lock();
  mayEnd = true;
  for (int i = 0; i < kCount; ++i) condition->signal();
  condition->unlock();
  queues_.drain();
}

TEST_F(QVAsioWorkQueuesTest, DelaysAgainWhileTheTimerThreadEnds) {
  // Each round the timer thread has ended or is about to, and has to be there again.
  const auto queue = queues_.makeSerialQueue("a", QVQualityOfService::utility, 0);
  for (int i = 0; i < 50; ++i) {
    QVEvent ran;
    queue->asyncAfter(1us, [&ran] { ran.happen(); });
    ASSERT_TRUE(ran.wait());
  }
}

}  // namespace
