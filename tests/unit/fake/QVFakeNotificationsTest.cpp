#include "platform/fake/QVFakeNotifications.h"
#include "platform/fake/QVFakePlatform.h"

#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class QVFakeNotificationsTest : public testing::Test {
 protected:
  // Registers and answers the token; deliveries are noted with their tokens.
  int32_t registerFor(std::string_view name) {
    int32_t token = 0;
    EXPECT_EQ(notifications().registerDispatch(
                  name, token, queue_, [this](int32_t told) { deliveries_.push_back(told); }),
              QVNotifications::kStatusOK);
    return token;
  }
  QVFakeNotifications& notifications() { return platform_.notifications(); }

  QVFakePlatform platform_;
  std::shared_ptr<QVWorkQueue> queue_ =
      platform_.queues().makeSerialQueue("test", QVQualityOfService::standard, 0);
  std::vector<int32_t> deliveries_;
};

TEST_F(QVFakeNotificationsTest, DeliversPostsOnTheQueueWithTheToken) {
  const int32_t first = registerFor("a");
  const int32_t second = registerFor("a");
  const int32_t other = registerFor("b");
  EXPECT_NE(first, 0);
  EXPECT_NE(first, second);
  EXPECT_NE(second, other);
  EXPECT_EQ(notifications().registrationCount("a"), 2U);
  EXPECT_EQ(notifications().registrationCount(), 3U);

  EXPECT_EQ(notifications().post("a"), 2U);
  EXPECT_EQ(notifications().post("c"), 0U);
  EXPECT_EQ(platform_.queues().pendingCount("test"), 2U);
  EXPECT_THAT(deliveries_, IsEmpty());
  platform_.queues().runUntilIdle();
  EXPECT_THAT(deliveries_, ElementsAre(first, second));
  EXPECT_EQ(notifications().enqueuedCount(), 2U);
}

TEST_F(QVFakeNotificationsTest, EnqueuesNothingOnceCancelled) {
  const int32_t token = registerFor("a");
  notifications().post("a");
  notifications().cancel(token);
  notifications().cancel(token);
  notifications().cancel(77);
  EXPECT_EQ(notifications().registrationCount(), 0U);
  EXPECT_EQ(notifications().post("a"), 0U);
  platform_.queues().runUntilIdle();
  EXPECT_THAT(deliveries_, ElementsAre(token)) << "what was enqueued before still runs";
}

TEST_F(QVFakeNotificationsTest, DropsTheHandlerWithTheRegistration) {
  const auto captured = std::make_shared<int>();
  int32_t token = 0;
  ASSERT_EQ(notifications().registerDispatch("a", token, queue_, [captured](int32_t) {}),
            QVNotifications::kStatusOK);
  EXPECT_EQ(captured.use_count(), 2);
  notifications().cancel(token);
  EXPECT_EQ(captured.use_count(), 1);
}

TEST_F(QVFakeNotificationsTest, DeliversAForeignToken) {
  const int32_t token = registerFor("a");
  EXPECT_EQ(notifications().postWithForeignToken("a"), 1U);
  platform_.queues().runUntilIdle();
  ASSERT_EQ(deliveries_.size(), 1U);
  EXPECT_NE(deliveries_[0], token);
}

TEST_F(QVFakeNotificationsTest, FailsAsItIsTold) {
  int32_t token = 5;
  const auto handler = [](int32_t) {};
  EXPECT_EQ(notifications().registerDispatch("", token, queue_, handler),
            QVNotifications::kStatusInvalidName);
  EXPECT_EQ(notifications().registerDispatch("a/b", token, queue_, handler),
            QVNotifications::kStatusInvalidName);
  EXPECT_EQ(notifications().registerDispatch("..", token, queue_, handler),
            QVNotifications::kStatusInvalidName);
  notifications().setRegistrationStatus(QVNotifications::kStatusFailed);
  EXPECT_EQ(notifications().registerDispatch("a", token, queue_, handler),
            QVNotifications::kStatusFailed);
  EXPECT_EQ(token, 5) << "not touched by a failure";
  EXPECT_EQ(notifications().post("a"), 0U);
  notifications().setRegistrationStatus(QVNotifications::kStatusOK);
  registerFor("a");
  EXPECT_EQ(notifications().post("a"), 1U);
}

TEST_F(QVFakeNotificationsTest, NotesMisuse) {
  int32_t token = 0;
  EXPECT_EQ(notifications().registerDispatch("a", token, nullptr, [](int32_t) {}),
            QVNotifications::kStatusFailed);
  EXPECT_EQ(notifications().registerDispatch("a", token, queue_, nullptr),
            QVNotifications::kStatusFailed);
  EXPECT_THAT(notifications().takeMisuses(),
              ElementsAre("a registration without a queue", "a registration without a handler"));
}

}  // namespace
