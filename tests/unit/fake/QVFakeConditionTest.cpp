#include "platform/fake/QVFakeCondition.h"
#include "platform/fake/QVFakeConditions.h"
#include "platform/fake/QVFakeLog.h"

#include <chrono>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class QVFakeConditionTest : public testing::Test {
 protected:
  // Waits on the condition and notes how that ended.
  void wait(QVCondition& condition, QVDuration timeout, const std::string& name) {
    condition.lock();
    const bool signalled = condition.waitForTimeout(timeout);
    condition.unlock();
    ends_.push_back(name + (signalled ? " signalled" : " timed out"));
  }
  static void signal(QVCondition& condition) {
    condition.lock();
    condition.signal();
    condition.unlock();
  }

  QVFakeClock clock_;
  QVFakeLog log_;
  QVFakeWorkQueues queues_{clock_, log_};
  QVFakeConditions conditions_{queues_, clock_};
  std::shared_ptr<QVCondition> condition_ = conditions_.makeCondition();
  std::vector<std::string> ends_;
};

TEST_F(QVFakeConditionTest, TimesOutAtItsDeadline) {
  clock_.advance(1s);
  wait(*condition_, 9s, "wait");
  EXPECT_THAT(ends_, ElementsAre("wait timed out"));
  EXPECT_EQ(clock_.steadyTime(), 10s);
}

TEST_F(QVFakeConditionTest, EndsWhenOtherWorkSignals) {
  queues_.after(3s, [this] { signal(*condition_); });
  wait(*condition_, 9s, "wait");
  EXPECT_THAT(ends_, ElementsAre("wait signalled"));
  EXPECT_EQ(clock_.steadyTime(), 3s);
}

TEST_F(QVFakeConditionTest, RunsTimersUpToAndAtTheDeadline) {
  queues_.after(9s, [this] { signal(*condition_); });
  wait(*condition_, 9s, "wait");
  EXPECT_THAT(ends_, ElementsAre("wait signalled"));
  queues_.after(9s + 1ns, [this] { signal(*condition_); });
  wait(*condition_, 9s, "later");
  EXPECT_THAT(ends_, ElementsAre("wait signalled", "later timed out"));
}

TEST_F(QVFakeConditionTest, NobodyHearsASignalBeforeTheWait) {
  signal(*condition_);
  wait(*condition_, 1s, "wait");
  EXPECT_THAT(ends_, ElementsAre("wait timed out"));
}

TEST_F(QVFakeConditionTest, HoldsBackItsOwnQueueOnly) {
  const auto own = queues_.makeSerialQueue("own", QVQualityOfService::utility, 0);
  const auto other = queues_.makeSerialQueue("other", QVQualityOfService::utility, 0);
  own->async([this] { wait(*condition_, 9s, "wait"); });
  own->async([this] { ends_.emplace_back("own"); });
  other->async([this] { ends_.emplace_back("other"); });
  queues_.runUntilIdle();
  EXPECT_THAT(ends_, ElementsAre("other", "wait timed out", "own"));
}

TEST_F(QVFakeConditionTest, OneSignalEndsOneWait) {
  const auto a = queues_.makeSerialQueue("a", QVQualityOfService::utility, 0);
  const auto b = queues_.makeSerialQueue("b", QVQualityOfService::utility, 0);
  a->async([this] { wait(*condition_, 9s, "a"); });
  b->async([this] { wait(*condition_, 9s, "b"); });
  queues_.after(1s, [this] { signal(*condition_); });
  queues_.runUntilIdle();
  EXPECT_THAT(ends_, ElementsAre("b signalled", "a timed out"));
  const auto& record = *conditions_.made().front();
  EXPECT_EQ(record.waitCount(), 2U);
}

TEST_F(QVFakeConditionTest, CutsPresentAndFutureWaitsShort) {
  queues_.after(2s, [this] { conditions_.cutWaitsShort(); });
  wait(*condition_, 9s, "present");
  wait(*conditions_.makeCondition(), 9s, "future");
  EXPECT_THAT(ends_, ElementsAre("present timed out", "future timed out"));
  EXPECT_EQ(clock_.steadyTime(), 2s);
}

using QVFakeConditionDeathTest = QVFakeConditionTest;

TEST_F(QVFakeConditionDeathTest, EndsTheProgramOnWrongUse) {
  EXPECT_DEATH(condition_->waitForTimeout(1s), "waitForTimeout\\(\\) without the lock");
  EXPECT_DEATH(condition_->signal(), "signal\\(\\) without the lock");
  EXPECT_DEATH(condition_->unlock(), "unlock\\(\\) without the lock");
  EXPECT_DEATH(
      {
        condition_->lock();
        condition_->lock();
      },
      "lock\\(\\) while it is locked");
}

}  // namespace
