#include "platform/fake/QVFakeLog.h"
#include "platform/linux/queues/QVAsioRunLoopThreads.h"
#include "platform/linux/queues/QVAsioWorkQueues.h"
#include "tests/unit/system/QVEvent.h"

#include <array>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <optional>
#include <stdexcept>
#include <string>

#include <gmock/gmock.h>
#include <pthread.h>

namespace {

using namespace std::chrono_literals;

// The threads that are named as the tests name theirs: a sanitizer has threads of its own.
std::size_t threadCount() {
  std::size_t count = 0;
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    std::string name;
    std::getline(std::ifstream(task.path() / "comm") >> std::ws, name);
    if (name == "qv-test") ++count;
  }
  return count;
}

class QVAsioRunLoopThreadsTest : public testing::Test {
 protected:
  QVFakeLog log_;
  std::optional<QVAsioRunLoopThreads> threads_{std::in_place, log_};
};

TEST_F(QVAsioRunLoopThreadsTest, HasNoThreadUntilOneIsStarted) {
  const auto timer = threads_->makeTimer(0s, [] {});
  EXPECT_EQ(threadCount(), 0U);
  QVEvent hasBegun;
  QVEvent mayEnd;
  threads_->startThread("qv-test", [&](QVRunLoop&) {
    hasBegun.happen();
    EXPECT_TRUE(mayEnd.wait());
  });
  ASSERT_TRUE(hasBegun.wait());
  EXPECT_EQ(threadCount(), 1U);
  mayEnd.happen();
  threads_.reset();
}

TEST_F(QVAsioRunLoopThreadsTest, WaitsForItsThreadsAtTheEnd) {
  bool hasEnded = false;
  const auto timer = threads_->makeTimer(20ms, [] {});
  threads_->startThread("qv-test", [&](QVRunLoop& loop) {
    loop.attach(timer);
    loop.run();
    hasEnded = true;
  });
  threads_.reset();
  EXPECT_TRUE(hasEnded);
}

TEST_F(QVAsioRunLoopThreadsTest, CollectsThreadsThatHaveEndedWhenTheNextOneStarts) {
  for (int i = 0; i < 20; ++i) {
    const auto thread = threads_->startThread("qv-test", [](QVRunLoop&) {});
    // The limit only ends a test that has failed.
    for (int j = 0; j < 60'000 && !thread->isFinished(); ++j) threads_->pause(1ms);
    ASSERT_TRUE(thread->isFinished());
    EXPECT_LE(threadCount(), 1U);
  }
}

TEST_F(QVAsioRunLoopThreadsTest, NamesTheOperationsWhoseWorkFailed) {
  const auto timer = threads_->makeTimer(0s, [] { throw std::runtime_error("timer"); });
  threads_->startThread("qv-test", [&](QVRunLoop& loop) {
    loop.attach(timer);
    loop.run();
    throw std::runtime_error("body");
  });
  threads_.reset();
  EXPECT_THAT(
      log_.renderings(),
      testing::ElementsAre(
          "3[default] -[QVAsioRunLoop run]: exception in run loop qv-test: timer",
          "3[default] -[QVAsioRunLoopThreads startThread:body:]: exception in thread qv-test: "
          "body"));
}

TEST_F(QVAsioRunLoopThreadsTest, NamesThreadsAsTheKernelCanHoldIt) {
  std::array<char, 16> name{};
  threads_->startThread("qv-with-a-name-that-is-too-long", [&](QVRunLoop&) {
    pthread_getname_np(pthread_self(), name.data(), name.size());
  });
  threads_.reset();
  EXPECT_STREQ(name.data(), "qv-with-a-name-");
}

TEST_F(QVAsioRunLoopThreadsTest, WakesOthersBeforeAnItemPauses) {
  QVAsioWorkQueues queues(log_);
  const auto first = queues.makeSerialQueue("first", QVQualityOfService::utility, 0);
  const auto second = queues.makeSerialQueue("second", QVQualityOfService::userInteractive, 0);
  QVEvent ranOnSecond;
  QVEvent done;
  bool ranMeanwhile = false;
  first->async([&] {
    second->async([&] { ranOnSecond.happen(); });
    // The limit only ends a test that has failed.
    for (int i = 0; i < 60'000 && !ranOnSecond.hasHappened(); ++i) threads_->pause(1ms);
    ranMeanwhile = ranOnSecond.hasHappened();
    done.happen();
  });
  ASSERT_TRUE(done.wait());
  EXPECT_TRUE(ranMeanwhile);
}

TEST_F(QVAsioRunLoopThreadsTest, LetsAPoolUseAnotherWorkerWhileOnePauses) {
  // More than the pool runs at once, each of which ends when all have begun.
  constexpr int kItems = 16;
  QVAsioWorkQueues queues(log_);
  std::atomic<int> begun{0};
  std::array<QVEvent, kItems> done;
  for (QVEvent& event : done) {
    const auto queue = queues.makeSerialQueue("item", QVQualityOfService::utility, 0);
    queue->async([&, this] {
      ++begun;
      for (int i = 0; i < 60'000 && begun < kItems; ++i) threads_->pause(1ms);
      event.happen();
    });
  }
  for (QVEvent& event : done) ASSERT_TRUE(event.wait());
  EXPECT_EQ(begun, kItems);
}

}  // namespace
