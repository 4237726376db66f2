#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"
#include "platform/QVPlatform.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/linux/queues/QVAsioRunLoopThreads.h"
#include "tests/unit/system/QVEvent.h"

#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// A throttle in real time, on a thread of the operating system. What it does when is tested in
// virtual time; here it is that its threads get along.
class QVReportingBlockThrottleSystemTest : public testing::Test {
 protected:
  QVReportingBlockThrottleSystemTest() {
    platform_.log = std::make_unique<QVFakeLog>();
    platform_.runLoopThreads = std::make_unique<QVAsioRunLoopThreads>(*platform_.log);
    QVPlatform::install(&platform_);
    throttle_ = QVReportingBlockThrottle::init();
  }
  ~QVReportingBlockThrottleSystemTest() override {
    throttle_->setShouldKeepRunning(false);
    throttle_.reset();
    platform_.runLoopThreads.reset();  // waits for the thread
    QVPlatform::install(nullptr);
  }

  void add(const QVDictionary& message, QVFunction<void()> block) {
    throttle_->addMessageBlock(std::move(block), 42, message, 1, 0);
  }
  QVFunction<void()> noteBlock(const std::string& what) {
    return [this, what] { note(what); };
  }
  void note(const std::string& what) {
    const std::lock_guard lock(mutex_);
    notes_.push_back(what);
  }
  std::vector<std::string> notes() {
    const std::lock_guard lock(mutex_);
    return notes_;
  }

  std::mutex mutex_;
  std::vector<std::string> notes_;  // with mutex_
  QVPlatform platform_;
  std::shared_ptr<QVReportingBlockThrottle> throttle_;
};

TEST_F(QVReportingBlockThrottleSystemTest, RunsTheLastOfEqualMessagesAndKeysInTheirOrder) {
  QVEvent ran;
  // The thread is busy with this one until all are there, and attaches them together.
  QVEvent mayGoOn;
  add({{"_throttle_seconds", -1}}, [&] {
    note("busy");
    EXPECT_TRUE(mayGoOn.wait());
  });
  add({{"name", "late"}, {"_throttle_seconds", 3.0}}, [&] {
    note("late");
    ran.happen();
  });
  for (const char* const what : {"first", "second", "third"}) {
    add({{"name", "early"}, {"_throttle_seconds", 0.1}}, noteBlock(what));
  }
  mayGoOn.happen();
  ASSERT_TRUE(ran.wait());
  // The key of what ran last may not be free yet.
  throttle_->waitForCompletion();
  EXPECT_THAT(notes(), ElementsAre("busy", "third", "late"));
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
}

TEST_F(QVReportingBlockThrottleSystemTest, TakesMessagesFromManyThreadsAtOnce) {
  constexpr int kThreads = 4;
  constexpr int kMessages = 250;
  constexpr int kKeys = 5;
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([this, i] {
      for (int j = 0; j < kMessages; ++j) {
        const auto key = std::to_string(j % kKeys);
        // Some fire at once, while others with their keys arrive.
        add({{"key", key}, {"_throttle_seconds", j % 2 == 0 ? -1.0 : 0.01}},
            noteBlock(QVText(key, ' ', i, ' ', j)));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  // Once does, mostly; more only bound a test that has failed.
  for (int i = 0; i < 12 && !throttle_->timersInFlight().empty(); ++i) {
    throttle_->waitForCompletion();
  }
  EXPECT_THAT(throttle_->timersInFlight(), IsEmpty());
  EXPECT_THAT(throttle_->unscheduledTimerKeys(), IsEmpty());
  const auto ran = notes();
  EXPECT_EQ(std::set(ran.begin(), ran.end()).size(), ran.size()) << "no block runs twice";
  std::set<char> keys;
  for (const std::string& note : ran) keys.insert(note.front());
  EXPECT_EQ(keys.size(), std::size_t{kKeys}) << "every key's time has come";
}

}  // namespace
