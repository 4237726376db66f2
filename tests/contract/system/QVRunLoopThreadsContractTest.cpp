#include "platform/QVRunLoopThread.h"
#include "tests/contract/system/QVQueueHarness.h"

#include <chrono>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

constexpr const char* kName = "qv-test";

template <class Harness>
class QVRunLoopThreadsContract : public testing::Test {
 protected:
  using Timer = std::shared_ptr<QVRunLoopTimer>;

  // A body that tells its end, after what it holds is gone.
  struct Task {
    std::shared_ptr<void> end;
    QVRunLoopThreads::Body body;
    void operator()(QVRunLoop& loop) { body(loop); }
  };

  QVRunLoopThreads& threads() { return harness_.runLoopThreads(); }

  // Starts a thread that waitForEnds() waits for.
  std::shared_ptr<QVRunLoopThread> start(QVRunLoopThreads::Body body) {
    running_.expectMore(1);
    return threads().startThread(
        kName, Task{{nullptr, [this](void*) { running_.hit(); }}, std::move(body)});
  }
  // Runs a thread's loop with these timers until it has returned.
  void runLoopWith(std::vector<Timer> timers) {
    start([timers = std::move(timers)](QVRunLoop& loop) {
      for (const Timer& timer : timers) loop.attach(timer);
      loop.run();
    });
    waitForEnds();
  }
  // Until all bodies have returned and are gone.
  void waitForEnds() { ASSERT_TRUE(harness_.runUntil(running_)); }

  void note(const std::string& what) {
    const std::lock_guard lock(mutex_);
    notes_.push_back(what);
  }
  Timer noteTimer(QVDuration delay, const std::string& what) {
    return threads().makeTimer(delay, [this, what] { note(what); });
  }
  std::vector<std::string> notes() {
    const std::lock_guard lock(mutex_);
    return notes_;
  }

  // The handle tells it right after the body has gone. The limit only ends a test that has failed.
  bool waitUntilFinished(const QVRunLoopThread& thread) {
    for (int i = 0; i < 60'000 && !thread.isFinished(); ++i) threads().pause(1ms);
    return thread.isFinished();
  }

  QVCountdown running_{0};
  std::mutex mutex_;
  std::vector<std::string> notes_;  // with mutex_
  Harness harness_;                 // ends the threads, which use the rest
};

using Harnesses = testing::Types<QVFakeQueueHarness, QVRealQueueHarness>;
TYPED_TEST_SUITE(QVRunLoopThreadsContract, Harnesses);

TYPED_TEST(QVRunLoopThreadsContract, RunsABodyOnceOnAThreadOfItsOwn) {
  std::vector<std::thread::id> identifiers;
  for (int i = 0; i < 2; ++i) {
    const auto thread =
        this->start([&](QVRunLoop&) { identifiers.push_back(std::this_thread::get_id()); });
    ASSERT_NE(thread, nullptr);
    EXPECT_EQ(thread->name(), kName);
    this->waitForEnds();
  }
  ASSERT_EQ(identifiers.size(), 2U);
  for (const auto& identifier : identifiers) EXPECT_NE(identifier, std::this_thread::get_id());
}

TYPED_TEST(QVRunLoopThreadsContract, IsFinishedOnceTheBodyIsGone) {
  QVCountdown mayReturn(1);
  const auto capture = std::make_shared<int>();
  const auto thread =
      this->start([&, capture](QVRunLoop&) { EXPECT_TRUE(this->harness_.runUntil(mayReturn)); });
  EXPECT_FALSE(thread->isFinished());
  EXPECT_EQ(capture.use_count(), 2);
  mayReturn.hit();
  this->waitForEnds();
  EXPECT_TRUE(this->waitUntilFinished(*thread));
  EXPECT_EQ(capture.use_count(), 1);
}

TYPED_TEST(QVRunLoopThreadsContract, LetsABodyDropTheHandleToItsThread) {
  struct Owner {
    std::shared_ptr<QVRunLoopThread> thread;
  };
  QVCountdown hasHandle(1);
  auto owner = std::make_shared<Owner>();
  const std::weak_ptr<Owner> watched = owner;
  owner->thread = this->start([&, owner](QVRunLoop&) mutable {
    EXPECT_TRUE(this->harness_.runUntil(hasHandle));
    owner.reset();
    this->note("went on");
  });
  owner.reset();
  hasHandle.hit();
  this->waitForEnds();
  EXPECT_TRUE(watched.expired());
  EXPECT_THAT(this->notes(), ElementsAre("went on"));
}

TYPED_TEST(QVRunLoopThreadsContract, LogsAnExceptionThatEscapesABody) {
  this->start([](QVRunLoop&) { throw std::runtime_error("broken"); });
  this->waitForEnds();
  const auto lines = this->harness_.log().lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].level, QVLogLevel::error);
  EXPECT_EQ(lines[0].scope, "default");
  EXPECT_EQ(lines[0].text, "exception in thread qv-test: broken");
}

TYPED_TEST(QVRunLoopThreadsContract, PausesForAnyThread) {
  this->start([this](QVRunLoop&) {
    this->threads().pause(1ms);
    this->note("own");
  });
  this->waitForEnds();
  this->threads().pause(1ms);
  this->threads().pause(0ms);
  this->threads().pause(-1h);
  EXPECT_THAT(this->notes(), ElementsAre("own"));
}

TYPED_TEST(QVRunLoopThreadsContract, ReturnsAtOnceFromALoopWithoutTimers) {
  // What the machine does may look like a wait, or hide one, but not that often.
  constexpr int kTries = 10;
  this->start([this](QVRunLoop& loop) {
    bool pauseWaits = false;
    for (int i = 0; i < kTries && !pauseWaits; ++i) {
      pauseWaits = this->harness_.waitsDuring([this] { this->threads().pause(1ms); });
    }
    bool runWaits = true;
    for (int i = 0; i < kTries && runWaits; ++i) {
      runWaits = this->harness_.waitsDuring([&loop] { loop.run(); });
    }
    this->note(pauseWaits ? "a pause waits" : "a pause returns at once");
    this->note(runWaits ? "a run waits" : "a run returns at once");
  });
  this->waitForEnds();
  EXPECT_THAT(this->notes(), ElementsAre("a pause waits", "a run returns at once"));
}

TYPED_TEST(QVRunLoopThreadsContract, FiresATimerOnceOnTheLoopsThread) {
  std::thread::id body;
  std::thread::id action;
  int count = 0;
  this->start([&](QVRunLoop& loop) {
    body = std::this_thread::get_id();
    loop.attach(this->threads().makeTimer(1ms, [&] {
      action = std::this_thread::get_id();
      ++count;
    }));
    loop.run();
    loop.run();
  });
  this->waitForEnds();
  EXPECT_EQ(action, body);
  EXPECT_EQ(count, 1);
}

TYPED_TEST(QVRunLoopThreadsContract, RunsAgainWithNewTimers) {
  this->start([this](QVRunLoop& loop) {
    for (const char* const what : {"a", "b", "c"}) {
      loop.attach(this->noteTimer(1ms, what));
      loop.run();
      this->note("returned");
    }
  });
  this->waitForEnds();
  EXPECT_THAT(this->notes(), ElementsAre("a", "returned", "b", "returned", "c", "returned"));
}

TYPED_TEST(QVRunLoopThreadsContract, FiresInTheOrderOfFireDates) {
  // Their dates count from their making, and so come in this order however long that takes.
  const auto a = this->noteTimer(1ms, "a");
  const auto b = this->noteTimer(2ms, "b");
  const auto c = this->noteTimer(3ms, "c");
  this->runLoopWith({c, a, b});
  EXPECT_THAT(this->notes(), ElementsAre("a", "b", "c"));
}

TYPED_TEST(QVRunLoopThreadsContract, FiresAtOnceWhatIsAlreadyDue) {
  this->runLoopWith({this->noteTimer(0ms, "now"), this->noteTimer(QVDuration::min(), "long ago"),
                     this->noteTimer(1ms, "soon")});
  const auto notes = this->notes();
  ASSERT_EQ(notes.size(), 3U);
  EXPECT_EQ(notes.back(), "soon");
}

TYPED_TEST(QVRunLoopThreadsContract, CountsADelayFromTheCreationOfItsTimer) {
  const auto older = this->noteTimer(2ms, "older");
  this->threads().pause(3ms);
  const auto younger = this->noteTimer(1ms, "younger");
  this->runLoopWith({younger, older});
  EXPECT_THAT(this->notes(), ElementsAre("older", "younger"));
}

TYPED_TEST(QVRunLoopThreadsContract, MovesATimerThatIsNotAttached) {
  const auto timer = this->noteTimer(24h, "moved");
  timer->fireAfter(0ms);
  this->runLoopWith({timer});
  EXPECT_THAT(this->notes(), ElementsAre("moved"));
}

TYPED_TEST(QVRunLoopThreadsContract, MovesAnAttachedTimerEarlierFromAnotherThread) {
  const auto timer = this->noteTimer(QVDuration::max(), "moved");
  // Once its loop runs.
  this->runLoopWith({timer, this->threads().makeTimer(0ms, [this, timer] {
                       this->start([timer](QVRunLoop&) { timer->fireAfter(1ms); });
                     })});
  EXPECT_THAT(this->notes(), ElementsAre("moved"));
}

TYPED_TEST(QVRunLoopThreadsContract, MovesAnAttachedTimerLater) {
  // Put off before it fires, it comes after what was to come after it.
  std::shared_ptr<QVRunLoopTimer> moved;
  const auto mover = this->threads().makeTimer(0ms, [&moved] { moved->fireAfter(24h); });
  moved = this->noteTimer(10ms, "moved");
  const auto later = this->threads().makeTimer(20ms, [this, &moved] {
    this->note("later");
    moved->fireAfter(0ms);
  });
  this->runLoopWith({moved, mover, later});
  EXPECT_THAT(this->notes(), ElementsAre("later", "moved"));
}

TYPED_TEST(QVRunLoopThreadsContract, MovesATimerManyTimesFromManyThreads) {
  constexpr int kMovers = 4;
  constexpr int kMoves = 200;
  const auto timer = this->noteTimer(24h, "fired");
  this->start([timer](QVRunLoop& loop) {
    loop.attach(timer);
    loop.run();
  });
  std::vector<std::thread> movers;
  for (int i = 0; i < kMovers; ++i) {
    movers.emplace_back([&timer] {
      for (int j = 0; j < kMoves; ++j) timer->fireAfter(1h + std::chrono::minutes(j % 7));
    });
  }
  for (std::thread& mover : movers) mover.join();
  timer->fireAfter(0ms);
  this->waitForEnds();
  EXPECT_THAT(this->notes(), ElementsAre("fired"));
}

TYPED_TEST(QVRunLoopThreadsContract, NeverFiresAnInvalidatedTimer) {
  const auto before = this->noteTimer(0ms, "before");
  before->invalidate();
  const auto within = this->noteTimer(QVDuration::max(), "within");
  const auto without = this->noteTimer(QVDuration::max(), "without");
  this->runLoopWith({before, within, without, this->threads().makeTimer(0ms, [&] {
                       this->note("first");
                       within->invalidate();
                       within->fireAfter(0ms);
                       this->start([without](QVRunLoop&) { without->invalidate(); });
                     })});
  EXPECT_THAT(this->notes(), ElementsAre("first"));
}

TYPED_TEST(QVRunLoopThreadsContract, LeavesASpentTimerSpent) {
  std::shared_ptr<QVRunLoopTimer> timer;
  timer = this->threads().makeTimer(0ms, [&] {
    this->note("fired");
    timer->fireAfter(0ms);
  });
  this->start([&](QVRunLoop& loop) {
    loop.attach(timer);
    loop.run();
    timer->fireAfter(0ms);
    loop.run();
    this->note("returned");
  });
  this->waitForEnds();
  EXPECT_THAT(this->notes(), ElementsAre("fired", "returned"));
}

TYPED_TEST(QVRunLoopThreadsContract, LogsAnExceptionOfAnActionAndGoesOn) {
  const auto broken = this->threads().makeTimer(0ms, [] { throw std::runtime_error("broken"); });
  // NOLINTNEXTLINE(hicpp-exception-baseclass): what is not made for throwing can be thrown, too.
  const auto odd = this->threads().makeTimer(1ms, [] { throw 1; });
  this->runLoopWith({broken, odd, this->noteTimer(2ms, "fired")});
  EXPECT_THAT(this->notes(), ElementsAre("fired"));
  const auto lines = this->harness_.log().lines();
  ASSERT_EQ(lines.size(), 2U);
  for (const auto& line : lines) {
    EXPECT_EQ(line.level, QVLogLevel::error);
    EXPECT_EQ(line.scope, "default");
  }
  EXPECT_EQ(lines[0].text, "exception in run loop qv-test: broken");
  EXPECT_EQ(lines[1].text, "exception in run loop qv-test: of unknown type");
}

TYPED_TEST(QVRunLoopThreadsContract, DestroysAnActionOnceItHasRun) {
  auto capture = std::make_shared<int>();
  const std::weak_ptr<int> watched = capture;
  bool wasThere = false;
  bool isGone = false;
  const auto first = this->threads().makeTimer(
      0ms, [&, capture = std::move(capture)] { wasThere = !watched.expired(); });
  const auto second = this->threads().makeTimer(1ms, [&] { isGone = watched.expired(); });
  this->runLoopWith({first, second});
  EXPECT_TRUE(wasThere);
  EXPECT_TRUE(isGone);
}

TYPED_TEST(QVRunLoopThreadsContract, DestroysTheActionOfAnInvalidatedTimer) {
  const auto capture = std::make_shared<int>();
  const auto timer = this->threads().makeTimer(1h, [capture] {});
  EXPECT_EQ(capture.use_count(), 2);
  timer->invalidate();
  EXPECT_EQ(capture.use_count(), 1);
}

TYPED_TEST(QVRunLoopThreadsContract, SpendsWhatIsAttachedWhenTheBodyReturns) {
  const auto capture = std::make_shared<int>();
  const auto timer = this->threads().makeTimer(0ms, [this, capture] { this->note("fired"); });
  const auto thread = this->start([timer](QVRunLoop& loop) { loop.attach(timer); });
  this->waitForEnds();
  EXPECT_TRUE(this->waitUntilFinished(*thread));
  EXPECT_EQ(capture.use_count(), 1);
  timer->fireAfter(0ms);
  EXPECT_THAT(this->notes(), testing::IsEmpty());
}

}  // namespace
