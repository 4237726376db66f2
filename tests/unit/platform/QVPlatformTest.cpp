#include "platform/QVError.h"
#include "platform/QVPlatform.h"

#include <atomic>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace {

class QVPlatformTest : public testing::Test {
 protected:
  ~QVPlatformTest() override { QVPlatform::install(nullptr); }
};

TEST_F(QVPlatformTest, AnswersTheOneThatIsInstalled) {
  QVPlatform first;
  QVPlatform second;
  QVPlatform::install(&first);
  EXPECT_EQ(&QVPlatform::shared(), &first);
  QVPlatform::install(&second);
  EXPECT_EQ(&QVPlatform::shared(), &second);
}

TEST_F(QVPlatformTest, CountsInstallations) {
  QVPlatform platform;
  const uint64_t before = QVPlatform::generation();
  QVPlatform::install(&platform);
  EXPECT_EQ(QVPlatform::generation(), before + 1);
  QVPlatform::install(nullptr);
  EXPECT_EQ(QVPlatform::generation(), before + 2);
}

TEST_F(QVPlatformTest, MakesAValueOncePerPlatform) {
  QVPlatform platform;
  QVPlatform::install(&platform);
  QVOncePerPlatform<int> once;
  int made = 0;
  const auto make = [&made] { return ++made; };
  EXPECT_EQ(once.peek(), 0);
  EXPECT_EQ(once.get(make), 1);
  EXPECT_EQ(once.get(make), 1);
  EXPECT_EQ(once.peek(), 1);
  QVPlatform::install(&platform);
  EXPECT_EQ(once.peek(), 0) << "a new platform starts anew";
  EXPECT_EQ(once.get(make), 2);
  EXPECT_EQ(made, 2);
}

TEST_F(QVPlatformTest, MakesAValueOnceForAllThreads) {
  QVPlatform platform;
  QVPlatform::install(&platform);
  constexpr int kThreads = 8;
  QVOncePerPlatform<int> once;
  std::atomic<int> made{0};
  std::atomic<int> agreeing{0};
  std::atomic<bool> go{false};
  {
    std::vector<std::jthread> threads;
    for (int i = 0; i < kThreads; ++i) {
      threads.emplace_back([&] {
        go.wait(false);
        if (once.get([&made] { return ++made + 40; }) == 41) ++agreeing;
      });
    }
    go = true;
    go.notify_all();
  }
  EXPECT_EQ(made, 1);
  EXPECT_EQ(agreeing, kThreads);
}

TEST(QVError, IsDescribedByItsReasonElseByDomainAndCode) {
  EXPECT_EQ((QVError{"net.quillon.audio", 7, {}}).description(), "net.quillon.audio error 7");
  EXPECT_EQ((QVError{"net.quillon.audio", -1, {{"failureReason", "No room"}}}).description(),
            "No room");
  EXPECT_EQ((QVError{"d", 1, {{"other", "x"}}}).description(), "d error 1");
}

TEST(QVError, ComparesAllItsParts) {
  const QVError error{"d", 1, {{"a", 1}}};
  EXPECT_EQ(error, (QVError{"d", 1, {{"a", 1}}}));
  EXPECT_NE(error, (QVError{"e", 1, {{"a", 1}}}));
  EXPECT_NE(error, (QVError{"d", 2, {{"a", 1}}}));
  EXPECT_NE(error, (QVError{"d", 1, {}}));
}

}  // namespace
