#include "platform/fake/QVFakePlatform.h"

#include <atomic>
#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

class QVFakeRunLoopThreadsTest : public testing::Test {
 protected:
  std::shared_ptr<QVRunLoopThread> start(QVRunLoopThreads::Body body) {
    return threads_.startThread("net.quillon.quietvox.test", std::move(body));
  }
  // Notes what happens, with the moment in milliseconds.
  void note(const std::string& what) {
    const auto now =
        std::chrono::duration_cast<std::chrono::milliseconds>(platform_.clock().steadyTime());
    notes_.push_back(std::to_string(now.count()).append(" ").append(what));
  }
  std::shared_ptr<QVRunLoopTimer> noteTimer(QVDuration delay, const std::string& what) {
    return threads_.makeTimer(delay, [this, what] { note(what); });
  }
  // A thread that runs its loop with these timers.
  std::shared_ptr<QVRunLoopThread> runLoopWith(
      std::vector<std::shared_ptr<QVRunLoopTimer>> timers) {
    return start([this, timers = std::move(timers)](QVRunLoop& loop) {
      for (const auto& timer : timers) loop.attach(timer);
      loop.run();
      note("end");
    });
  }
  void advance(QVDuration duration) { platform_.queues().advance(duration); }

  std::vector<std::string> notes_;
  QVFakePlatform platform_;
  QVFakeRunLoopThreads& threads_ = platform_.runLoopThreads();
};

TEST_F(QVFakeRunLoopThreadsTest, RunsAThreadOnlyWhenToldAndNotOnTheTestsThread) {
  std::thread::id identifier;
  const auto thread = start([&](QVRunLoop&) { identifier = std::this_thread::get_id(); });
  EXPECT_EQ(identifier, std::thread::id());
  EXPECT_FALSE(thread->isFinished());
  EXPECT_EQ(platform_.queues().runUntilIdle(), 1u);
  EXPECT_NE(identifier, std::thread::id());
  EXPECT_NE(identifier, std::this_thread::get_id());
  EXPECT_TRUE(thread->isFinished());
}

TEST_F(QVFakeRunLoopThreadsTest, WakesPausingThreadsAtTheirMoments) {
  for (const char* const name : {"a", "b"}) {
    start([this, name](QVRunLoop&) {
      for (int i = 0; i < 3; ++i) {
        note(name);
        threads_.pause(name[0] == 'a' ? 100ms : 150ms);
      }
    });
  }
  advance(199ms);
  EXPECT_THAT(notes_, ElementsAre("0 a", "0 b", "100 a", "150 b"));
  advance(1ms);
  EXPECT_THAT(notes_, ElementsAre("0 a", "0 b", "100 a", "150 b", "200 a"));
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("0 a", "0 b", "100 a", "150 b", "200 a", "300 b"));
}

TEST_F(QVFakeRunLoopThreadsTest, LetsThreadsGoOnWhileTheTestPauses) {
  start([this](QVRunLoop&) {
    for (int i = 0; i < 4; ++i) {
      threads_.pause(200ms);
      note("woke");
    }
  });
  threads_.pause(500ms);
  note("test");
  threads_.pause(0s);
  threads_.pause(-1s);
  threads_.pause(300ms);
  note("test");
  EXPECT_THAT(notes_,
              ElementsAre("200 woke", "400 woke", "500 test", "600 woke", "800 woke", "800 test"));
}

TEST_F(QVFakeRunLoopThreadsTest, LetsAnItemPause) {
  start([this](QVRunLoop&) {
    threads_.pause(100ms);
    note("thread");
  });
  platform_.queues().backgroundQueue()->async([this] {
    threads_.pause(200ms);
    note("item");
  });
  platform_.queues().runUntilIdle();
  EXPECT_THAT(notes_, ElementsAre("100 thread", "200 item"));
}

TEST_F(QVFakeRunLoopThreadsTest, RunsItemsWhileAThreadWaitsInACondition) {
  const auto condition = platform_.conditions().makeCondition();
  start([&](QVRunLoop&) {
    condition->lock();
    EXPECT_TRUE(condition->waitForTimeout(9s));
    condition->unlock();
    note("signalled");
  });
  platform_.queues().after(2s, [&] {
    condition->lock();
    condition->signal();
    condition->unlock();
  });
  platform_.queues().runUntilIdle();
  EXPECT_THAT(notes_, ElementsAre("2000 signalled"));
}

TEST_F(QVFakeRunLoopThreadsTest, FiresTimersAtTheirMoments) {
  runLoopWith({noteTimer(300ms, "b"), noteTimer(100ms, "a"), noteTimer(300ms, "c")});
  advance(99ms);
  EXPECT_THAT(notes_, IsEmpty());
  advance(1ms);
  EXPECT_THAT(notes_, ElementsAre("100 a"));
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("100 a", "300 b", "300 c", "300 end"));
}

TEST_F(QVFakeRunLoopThreadsTest, MovesATimerLaterAndEarlier) {
  const auto later = noteTimer(100ms, "later");
  const auto earlier = noteTimer(1s, "earlier");
  runLoopWith({later, earlier});
  advance(50ms);
  later->fireAfter(400ms);
  earlier->fireAfter(200ms);
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("250 earlier", "450 later", "450 end"));
}

TEST_F(QVFakeRunLoopThreadsTest, ReturnsFromTheLoopWhenTheLastTimerIsInvalidated) {
  const auto timer = noteTimer(1h, "never");
  runLoopWith({timer});
  advance(1s);
  timer->invalidate();
  platform_.queues().runUntilIdle();
  EXPECT_THAT(notes_, ElementsAre("1000 end"));
}

TEST_F(QVFakeRunLoopThreadsTest, TakesMovesFromOtherThreadsAtAnyTime) {
  constexpr int kTimers = 8;
  std::vector<std::shared_ptr<QVRunLoopTimer>> timers;
  for (int i = 0; i < kTimers; ++i) timers.push_back(noteTimer(1h, "fired"));
  const auto thread = runLoopWith(timers);
  std::atomic<bool> isDone{false};
  std::thread mover([&] {
    for (int round = 0; round < 200; ++round) {
      for (const auto& timer : timers) timer->fireAfter(1h + std::chrono::minutes{round});
    }
    for (const auto& timer : timers) timer->fireAfter(0s);
    isDone = true;
  });
  while (!isDone) platform_.queues().runUntilIdle();
  mover.join();
  platform_.queues().runUntilIdle();
  EXPECT_EQ(notes_.size(), std::size_t{kTimers + 1});
  EXPECT_TRUE(thread->isFinished());
}

TEST_F(QVFakeRunLoopThreadsTest, LogsAnExceptionThatEndsABody) {
  const auto thread = start([](QVRunLoop&) { throw std::runtime_error("broken"); });
  platform_.queues().runUntilIdle();
  EXPECT_TRUE(thread->isFinished());
  EXPECT_THAT(
      platform_.log().renderings(),
      ElementsAre("3[default] main: exception in thread net.quillon.quietvox.test: broken"));
}

TEST_F(QVFakeRunLoopThreadsTest, RefusesThreadsWhenTold) {
  threads_.refuseThreads();
  const auto capture = std::make_shared<int>();
  EXPECT_EQ(start([capture](QVRunLoop&) {}), nullptr);
  EXPECT_EQ(capture.use_count(), 1);
  EXPECT_THAT(
      platform_.log().renderings(),
      ElementsAre("3[default] startThread: no thread for net.quillon.quietvox.test: refused"));
}

TEST_F(QVFakeRunLoopThreadsTest, EndsThreadsThatHaveNotBegunWithoutTheirBodies) {
  const auto capture = std::make_shared<int>();
  const auto thread = start([this, capture](QVRunLoop&) { note("ran"); });
  EXPECT_THAT(threads_.threads(), ElementsAre(thread));
  threads_.discard();
  EXPECT_THAT(notes_, IsEmpty());
  EXPECT_EQ(capture.use_count(), 1);
  EXPECT_TRUE(thread->isFinished());
  EXPECT_THAT(threads_.threads(), IsEmpty());
}

TEST_F(QVFakeRunLoopThreadsTest, EndsWaitsAtOnceAndFiresNoTimersAnyMore) {
  const auto timer = noteTimer(1s, "fired");
  const auto looping = runLoopWith({timer});
  const auto pausing = start([this](QVRunLoop& loop) {
    threads_.pause(1h);
    threads_.pause(1h);
    loop.attach(noteTimer(0s, "fired"));
    loop.run();
    note("pauser ended");
  });
  platform_.queues().runUntilIdle();
  threads_.discard();
  EXPECT_TRUE(looping->isFinished());
  EXPECT_TRUE(pausing->isFinished());
  EXPECT_THAT(notes_, ElementsAre("0 end", "0 pauser ended"));
}

TEST_F(QVFakeRunLoopThreadsTest, SpendsTimersThatAreStillAttachedWhenTheBodyReturns) {
  const auto capture = std::make_shared<int>();
  const auto timer = threads_.makeTimer(1s, [this, capture] { note("fired"); });
  start([timer](QVRunLoop& loop) { loop.attach(timer); });
  advance(2s);
  EXPECT_THAT(notes_, IsEmpty());
  EXPECT_EQ(capture.use_count(), 1);
}

// A test program with threads is left in a strange state by a plain fork.
class QVFakeRunLoopThreadsMisuseTest : public QVFakeRunLoopThreadsTest {
 protected:
  QVFakeRunLoopThreadsMisuseTest() { GTEST_FLAG_SET(death_test_style, "threadsafe"); }
};

TEST_F(QVFakeRunLoopThreadsMisuseTest, EndsTheProgramWhenABodyIsNotToldToReturn) {
  EXPECT_DEATH(
      {
        start([this](QVRunLoop&) {
          for (;;) threads_.pause(1s);
        });
        advance(1s);
        threads_.discard();
      },
      "nobody told the body of this thread to return: net.quillon.quietvox.test");
}

TEST_F(QVFakeRunLoopThreadsMisuseTest, EndsTheProgramWhenATimerIsAttachedTwice) {
  EXPECT_DEATH(
      {
        start([this](QVRunLoop& loop) {
          const auto timer = noteTimer(1s, "fired");
          loop.attach(timer);
          loop.attach(timer);
        });
        platform_.queues().runUntilIdle();
      },
      "attached twice");
}

TEST_F(QVFakeRunLoopThreadsMisuseTest, EndsTheProgramWhenAnActionRunsTheLoop) {
  EXPECT_DEATH(
      {
        start([this](QVRunLoop& loop) {
          loop.attach(threads_.makeTimer(0s, [&loop] { loop.run(); }));
          loop.run();
        });
        platform_.queues().runUntilIdle();
      },
      "run\\(\\) from the action of a timer");
}

TEST_F(QVFakeRunLoopThreadsMisuseTest, EndsTheProgramWhenAnotherThreadUsesTheLoop) {
  EXPECT_DEATH(
      {
        QVRunLoop* foreign = nullptr;
        start([&](QVRunLoop& loop) {
          foreign = &loop;
          threads_.pause(1s);
        });
        platform_.queues().runUntilIdle();
        foreign->run();
      },
      "run\\(\\) on another thread");
}

}  // namespace
