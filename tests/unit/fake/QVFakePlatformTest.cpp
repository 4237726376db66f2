#include "platform/fake/QVFakePlatform.h"

#include <chrono>
#include <memory>

#include <gmock/gmock.h>

namespace {

using namespace std::chrono_literals;

TEST(QVFakePlatformTest, IsInstalledAndFilled) {
  QVFakePlatform fakes;
  QVPlatform& platform = QVPlatform::shared();
  EXPECT_EQ(platform.log.get(), &fakes.log());
  EXPECT_EQ(platform.clock.get(), &fakes.clock());
  EXPECT_EQ(platform.random.get(), &fakes.random());
  EXPECT_EQ(platform.process.get(), &fakes.process());
  EXPECT_EQ(platform.tracePoints.get(), &fakes.tracePoints());
  EXPECT_EQ(platform.preferences.get(), &fakes.preferences());
  EXPECT_EQ(platform.deviceInformation.get(), &fakes.deviceInformation());
  EXPECT_EQ(platform.fileSystem.get(), &fakes.fileSystem());
  EXPECT_EQ(platform.jsonOutput.get(), &fakes.jsonOutput());
  EXPECT_EQ(platform.conditions.get(), &fakes.conditions());
  EXPECT_EQ(platform.queues.get(), &fakes.queues());
  EXPECT_EQ(platform.beacon.get(), &fakes.beacon());
  EXPECT_EQ(platform.countwise.get(), &fakes.countwise());
  EXPECT_EQ(platform.joulewell.get(), &fakes.joulewell());
  EXPECT_EQ(platform.tally.get(), &fakes.tally());
  EXPECT_EQ(platform.orientation.get(), &fakes.orientation());
  EXPECT_EQ(platform.notifications.get(), &fakes.notifications());
  EXPECT_EQ(platform.runLoopThreads.get(), &fakes.runLoopThreads());
  EXPECT_EQ(platform.listener.get(), &fakes.listener());
}

TEST(QVFakePlatformTest, SharesOneVirtualTime) {
  QVFakePlatform fakes;
  const auto condition = QVPlatform::shared().conditions->makeCondition();
  condition->lock();
  EXPECT_FALSE(condition->waitForTimeout(9s));
  condition->unlock();
  EXPECT_EQ(QVPlatform::shared().clock->currentDate(), QVFakeClock::kStart + 9s);
}

// What logs when it goes, as sessions do.
struct Mourner {
  ~Mourner() { QVPlatform::shared().log->info(nullptr, "~Mourner", "gone"); }
};

TEST(QVFakePlatformTest, CanBeAskedWhileItDropsWork) {
  const uint64_t generation = QVPlatform::generation();
  std::weak_ptr<Mourner> watched;
  {
    QVFakePlatform fakes;
    const auto mourner = std::make_shared<Mourner>();
    watched = mourner;
    fakes.queues().backgroundQueue()->async([mourner] {});
    fakes.orientation().QVRegisterUIOrientation("a", [mourner](int32_t) {});
  }
  EXPECT_TRUE(watched.expired());
  EXPECT_EQ(QVPlatform::generation(), generation + 2) << "installed once, taken away once";
}

}  // namespace
