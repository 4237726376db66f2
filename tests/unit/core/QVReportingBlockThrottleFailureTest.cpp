// What a throttle does where a timer cannot be made or attached.

#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"
#include "platform/fake/QVFakePlatform.h"

#include <chrono>
#include <memory>
#include <new>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

// What goes wrong from now on, and how often.
struct Failures {
  int timersToMake = 0;
  int attachmentsToPass = 0;
  int attachments = 0;
};

class FailingRunLoop final : public QVRunLoop {
 public:
  FailingRunLoop(QVRunLoop& loop, Failures& failures) : loop_(loop), failures_(failures) {}

  void attach(std::shared_ptr<QVRunLoopTimer> timer) override {
    if (failures_.attachmentsToPass > 0) {
      --failures_.attachmentsToPass;
    } else if (failures_.attachments > 0) {
      --failures_.attachments;
      throw std::bad_alloc();
    }
    loop_.attach(std::move(timer));
  }
  void run() override { loop_.run(); }

 private:
  QVRunLoop& loop_;
  Failures& failures_;
};

class FailingRunLoopThreads final : public QVRunLoopThreads {
 public:
  FailingRunLoopThreads(std::unique_ptr<QVRunLoopThreads> threads, Failures& failures)
      : threads_(std::move(threads)), failures_(failures) {}

  std::shared_ptr<QVRunLoopThread> startThread(std::string_view name, Body body) override {
    return threads_->startThread(
        name, [this, body = std::make_shared<Body>(std::move(body))](QVRunLoop& loop) {
          FailingRunLoop failing(loop, failures_);
          (*body)(failing);
        });
  }
  std::shared_ptr<QVRunLoopTimer> makeTimer(QVDuration delay, QVFunction<void()> action) override {
    if (failures_.timersToMake > 0) {
      --failures_.timersToMake;
      throw std::bad_alloc();
    }
    return threads_->makeTimer(delay, std::move(action));
  }
  void pause(QVDuration duration) override { threads_->pause(duration); }

 private:
  const std::unique_ptr<QVRunLoopThreads> threads_;
  Failures& failures_;
};

class QVReportingBlockThrottleFailureTest : public testing::Test {
 protected:
  QVReportingBlockThrottleFailureTest() {
    auto& threads = QVPlatform::shared().runLoopThreads;
    threads = std::make_unique<FailingRunLoopThreads>(std::move(threads), failures_);
    throttle_ = QVReportingBlockThrottle::init();
  }
  ~QVReportingBlockThrottleFailureTest() override { throttle_->setShouldKeepRunning(false); }

  // Notes its name, with the moment in milliseconds, when it runs.
  void add(const std::string& name, double seconds = 0.5) {
    throttle_->addMessageBlock(
        [this, name] {
          const auto now =
              std::chrono::floor<std::chrono::milliseconds>(platform_.clock().steadyTime());
          notes_.push_back(std::to_string(now.count()).append(" ").append(name));
        },
        42, {{"_throttle_seconds", seconds}, {"name", name}}, 0x08000003, 1);
  }
  void advance(QVDuration duration) { platform_.queues().advance(duration); }
  std::vector<std::string> lines() { return platform_.log().renderings(); }

  Failures failures_;
  std::vector<std::string> notes_;
  QVFakePlatform platform_;
  std::shared_ptr<QVReportingBlockThrottle> throttle_;
};

TEST_F(QVReportingBlockThrottleFailureTest, KeepsAKeyFreeWhoseTimerCannotBeMade) {
  failures_.timersToMake = 1;
  EXPECT_THROW(add("a"), std::bad_alloc);
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  add("a");
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("500 a"));
}

TEST_F(QVReportingBlockThrottleFailureTest, AttachesATimerWithTheNextPassWhereItCouldNot) {
  add("a");
  add("b");
  add("c");
  failures_.attachmentsToPass = 1;
  failures_.attachments = 1;
  advance(0s);
  EXPECT_THAT(lines(),
              ElementsAre("3[default] -[QVReportingBlockThrottle init]: failed to attach timers: "
                          "std::bad_alloc"));
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), testing::SizeIs(2)) << "the first one is attached";
  EXPECT_THAT(throttle_->timersInFlight(), testing::SizeIs(3));
  advance(10s);
  EXPECT_THAT(notes_, ElementsAre("500 a", "600 b", "600 c"));
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  EXPECT_EQ(lines().size(), 1u);
}

TEST_F(QVReportingBlockThrottleFailureTest, TriesAgainWithEachPass) {
  add("a");
  failures_.attachments = 3;
  advance(10s);
  EXPECT_EQ(lines().size(), 3u) << "a line for each";
  EXPECT_THAT(notes_, ElementsAre("500 a"));
  add("a");
  advance(1s);
  EXPECT_THAT(notes_, ElementsAre("500 a", "10500 a")) << "the key is free again";
}

TEST_F(QVReportingBlockThrottleFailureTest, KeepsTheOrderOfKeysThatComeMeanwhile) {
  add("a", 0);
  failures_.attachments = 1;
  advance(0s);
  add("b", 0);
  advance(100ms);
  EXPECT_THAT(notes_, ElementsAre("100 a", "100 b"));
}

}  // namespace
