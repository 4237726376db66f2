#include "QVServices/Statistics/QVReportingUtility.h"
#include "platform/fake/QVFakePlatform.h"

#include <atomic>
#include <chrono>
#include <cmath>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(QVReportingDurationFromSecondsTest, SaturatesAtAYear) {
  constexpr auto kYear = 24h * 365;
  EXPECT_EQ(QVReportingDurationFromSeconds(0.25), 250ms);
  EXPECT_EQ(QVReportingDurationFromSeconds(-3.0), -3s);
  EXPECT_EQ(QVReportingDurationFromSeconds(1e300), kYear);
  EXPECT_EQ(QVReportingDurationFromSeconds(-1e300), -kYear);
  EXPECT_EQ(QVReportingDurationFromSeconds(std::nan("")), 0s);
}

class QVReportingUtilityWaitTest : public testing::Test {
 protected:
  bool wait(double timeout = 9.0) {
    return QVReportingUtilityWait(*condition_, flag_, "waiting for it", "it never came", scope_,
                                  timeout);
  }
  void signalAfter(QVDuration delay, bool settingTheFlag) {
    platform_.queues().after(delay, [this, settingTheFlag] {
      const std::lock_guard lock(*condition_);
      if (settingTheFlag) flag_ = true;
      condition_->signal();
    });
  }
  std::vector<std::string> lines() { return platform_.log().renderings(); }

  QVFakePlatform platform_;
  std::shared_ptr<QVCondition> condition_ = platform_.conditions().makeCondition();
  const QVLogScope* scope_ =
      platform_.log().registerScope(true, 1, "here", "domain", "verbose", 31);
  bool flag_ = false;
};

TEST_F(QVReportingUtilityWaitTest, ReturnsAtOnceWhenTheFlagIsSet) {
  flag_ = true;
  EXPECT_TRUE(wait());
  EXPECT_THAT(lines(), IsEmpty());
  EXPECT_EQ(platform_.conditions().made().front()->waitCount(), 0u);
  EXPECT_EQ(platform_.clock().steadyTime(), 0s);
}

TEST_F(QVReportingUtilityWaitTest, FailsAfterOnePeriodWithoutASignal) {
  EXPECT_FALSE(wait());
  EXPECT_THAT(lines(), ElementsAre("5[here] QVReportingUtilityWait: waiting for it",
                                   "3[here] QVReportingUtilityWait: it never came"));
  EXPECT_EQ(platform_.clock().steadyTime(), 9s);
  EXPECT_FALSE(flag_) << "the flag is the caller's";
}

TEST_F(QVReportingUtilityWaitTest, ReturnsWhenTheFlagComesWithASignal) {
  signalAfter(3s, true);
  EXPECT_TRUE(wait());
  EXPECT_THAT(lines(), ElementsAre("5[here] QVReportingUtilityWait: waiting for it",
                                   "5[here] QVReportingUtilityWait: continuing"));
  EXPECT_EQ(platform_.clock().steadyTime(), 3s);
}

TEST_F(QVReportingUtilityWaitTest, StartsAFreshPeriodWithEachSignal) {
  signalAfter(8s, false);
  signalAfter(16s, true);
  EXPECT_TRUE(wait());
  EXPECT_THAT(lines(), ElementsAre("5[here] QVReportingUtilityWait: waiting for it",
                                   "5[here] QVReportingUtilityWait: continuing",
                                   "5[here] QVReportingUtilityWait: waiting for it",
                                   "5[here] QVReportingUtilityWait: continuing"));
  EXPECT_EQ(platform_.clock().steadyTime(), 16s) << "longer than one time-out";
}

TEST_F(QVReportingUtilityWaitTest, FailsWhenAFreshPeriodPassesWithoutASignal) {
  signalAfter(8s, false);
  EXPECT_FALSE(wait());
  EXPECT_THAT(lines(), ElementsAre("5[here] QVReportingUtilityWait: waiting for it",
                                   "5[here] QVReportingUtilityWait: continuing",
                                   "5[here] QVReportingUtilityWait: waiting for it",
                                   "3[here] QVReportingUtilityWait: it never came"));
  EXPECT_EQ(platform_.clock().steadyTime(), 17s);
}

TEST_F(QVReportingUtilityWaitTest, WaitsFractionsOfASecond) {
  EXPECT_FALSE(wait(0.25));
  EXPECT_EQ(platform_.clock().steadyTime(), 250ms);
}

TEST_F(QVReportingUtilityWaitTest, LetsGoOfTheCondition) {
  EXPECT_FALSE(wait());
  condition_->lock();  // ends the program where it is still locked
  condition_->unlock();
  flag_ = true;
  EXPECT_TRUE(wait());
  condition_->lock();
  condition_->unlock();
}

TEST_F(QVReportingUtilityWaitTest, WritesToTheDefaultLogWithoutAScope) {
  scope_ = nullptr;
  EXPECT_FALSE(wait());
  EXPECT_THAT(lines(), ElementsAre("5[default] QVReportingUtilityWait: waiting for it",
                                   "3[default] QVReportingUtilityWait: it never came"));
}

class QVReportingIsInternalBuildTest : public testing::Test {
 protected:
  void answer(const QVValue& value) {
    platform_.deviceInformation().setAnswer("InternalBuild", value);
  }
  std::size_t questions() { return platform_.deviceInformation().questionsAbout("InternalBuild"); }

  QVFakePlatform platform_;
};

TEST_F(QVReportingIsInternalBuildTest, IsFalseWithoutAnAnswer) {
  EXPECT_FALSE(QVReportingIsInternalBuild());
  EXPECT_EQ(questions(), 1u);
}

TEST_F(QVReportingIsInternalBuildTest, AsksTheDeviceOnce) {
  answer(true);
  EXPECT_TRUE(QVReportingIsInternalBuild());
  answer(false);
  EXPECT_TRUE(QVReportingIsInternalBuild());
  EXPECT_TRUE(QVReportingIsInternalBuild());
  EXPECT_EQ(questions(), 1u);
}

TEST_F(QVReportingIsInternalBuildTest, AsksOnceAlsoWhenTheAnswerIsNo) {
  answer(false);
  EXPECT_FALSE(QVReportingIsInternalBuild());
  answer(true);
  EXPECT_FALSE(QVReportingIsInternalBuild());
  EXPECT_EQ(questions(), 1u);
}

TEST_F(QVReportingIsInternalBuildTest, AnswersAllThreadsAlikeWithOneQuestion) {
  answer(true);
  constexpr int kThreads = 8;
  std::atomic<int> yes{0};
  std::atomic<bool> go{false};
  {
    std::vector<std::jthread> threads;
    for (int i = 0; i < kThreads; ++i) {
      threads.emplace_back([&] {
        go.wait(false);
        if (QVReportingIsInternalBuild()) ++yes;
      });
    }
    go = true;
    go.notify_all();
  }
  EXPECT_EQ(yes, kThreads);
  EXPECT_EQ(questions(), 1u);
}

}  // namespace
