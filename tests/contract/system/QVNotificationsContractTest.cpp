#include "platform/fake/QVFakeNotifications.h"
#include "platform/linux/watch/QVInotifyNotifications.h"
#include "tests/contract/system/QVQueueHarness.h"
#include "tests/support/QVTemporaryRoot.h"

#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::Each;
using testing::Ge;
using testing::IsEmpty;
using testing::SizeIs;

class FakeNotificationsHarness : public QVFakeQueueHarness {
 public:
  QVNotifications& notifications() { return notifications_; }
  void post(const std::string& name) { notifications_.post(name); }

 private:
  QVFakeNotifications notifications_;
};

class InotifyNotificationsHarness : public QVRealQueueHarness {
 public:
  QVNotifications& notifications() { return notifications_; }
  // Making the file and closing it may be heard of one after the other: as two posts.
  void post(const std::string& name) const {
    std::ofstream(root_.runtime() / "notify" / name, std::ios::app).flush();
  }

 private:
  QVTemporaryRoot root_;
  QVInotifyNotifications notifications_{log(), std::make_shared<QVDirectoryWatcher>(log()),
                                        root_.runtime() / "notify"};
};

// What the handlers of a test heard. They share it, since they may run after the test. Threads:
// any.
class Deliveries {
 public:
  void add(int32_t token) {
    const std::lock_guard lock(mutex_);
    tokens_.push_back(token);
  }
  std::vector<int32_t> tokens() const {
    const std::lock_guard lock(mutex_);
    return tokens_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<int32_t> tokens_;
};

template <class Harness>
class QVNotificationsContract : public testing::Test {
 protected:
  // One registration: its token, what it heard, and the first delivery as an event.
  struct Registered {
    int32_t token = 0;
    std::shared_ptr<Deliveries> deliveries = std::make_shared<Deliveries>();
    std::shared_ptr<QVCountdown> arrival = std::make_shared<QVCountdown>(1);
  };

  Registered add(const std::string& name) {
    Registered registered;
    EXPECT_EQ(
        harness_.notifications().registerDispatch(
            name, registered.token, queue_,
            [deliveries = registered.deliveries, arrival = registered.arrival](int32_t token) {
              deliveries->add(token);
              arrival->hit();
            }),
        QVNotifications::kStatusOK);
    return registered;
  }
  void post(const std::string& name) { harness_.post(name); }
  bool arrives(const Registered& registered) { return harness_.runUntil(*registered.arrival); }
  // Returns when whatever was posted before has been delivered.
  void settle() {
    const Registered marker = add("marker");
    post("marker");
    EXPECT_TRUE(arrives(marker));
    harness_.notifications().cancel(marker.token);
  }

  Harness harness_;
  const std::shared_ptr<QVWorkQueue> queue_ =
      harness_.queues().makeSerialQueue("notified", QVQualityOfService::utility, 0);
};

using Harnesses = testing::Types<FakeNotificationsHarness, InotifyNotificationsHarness>;
TYPED_TEST_SUITE(QVNotificationsContract, Harnesses);

TYPED_TEST(QVNotificationsContract, DeliversAPostWithTheToken) {
  const auto registered = this->add("name");
  EXPECT_THAT(registered.deliveries->tokens(), IsEmpty());
  this->post("name");
  ASSERT_TRUE(this->arrives(registered));
  this->settle();
  EXPECT_THAT(registered.deliveries->tokens(), SizeIs(Ge(1U)));
  EXPECT_THAT(registered.deliveries->tokens(), Each(registered.token));
}

TYPED_TEST(QVNotificationsContract, GivesOutTokensThatDiffer) {
  const auto first = this->add("name");
  const auto second = this->add("name");
  EXPECT_NE(first.token, 0);
  EXPECT_NE(second.token, 0);
  EXPECT_NE(first.token, second.token);
}

TYPED_TEST(QVNotificationsContract, DeliversToEveryRegistrationOfTheName) {
  const auto first = this->add("name");
  const auto second = this->add("name");
  const auto other = this->add("other");
  this->post("name");
  EXPECT_TRUE(this->arrives(first));
  EXPECT_TRUE(this->arrives(second));
  this->settle();
  EXPECT_THAT(other.deliveries->tokens(), IsEmpty());
}

TYPED_TEST(QVNotificationsContract, DeliversNothingOnceItIsCancelled) {
  const auto registered = this->add("name");
  const auto other = this->add("name");
  this->harness_.notifications().cancel(registered.token);
  this->harness_.notifications().cancel(registered.token);
  this->harness_.notifications().cancel(-1);
  this->post("name");
  EXPECT_TRUE(this->arrives(other));
  this->settle();
  EXPECT_THAT(registered.deliveries->tokens(), IsEmpty());
}

TYPED_TEST(QVNotificationsContract, LosesNoPostThatComesAfterADelivery) {
  // Once the file is there, a post is heard of once: so each delivery is of its own post.
  this->settle();
  this->post("name");
  this->settle();
  const auto registered = this->add("name");
  for (int round = 0; round < 20; ++round) {
    this->post("name");
    ASSERT_TRUE(this->arrives(registered)) << round;
    registered.arrival->expectMore(1);
  }
}

TYPED_TEST(QVNotificationsContract, LetsAHandlerCancelAndRegister) {
  auto& notifications = this->harness_.notifications();
  const auto heard = std::make_shared<Deliveries>();
  const auto arrival = std::make_shared<QVCountdown>(1);
  const auto token = std::make_shared<int32_t>(0);
  EXPECT_EQ(notifications.registerDispatch(
                "first", *token, this->queue_,
                [&notifications, heard, arrival, token, queue = this->queue_](int32_t its) {
                  notifications.cancel(its);
                  EXPECT_EQ(notifications.registerDispatch("second", *token, queue,
                                                           [heard, arrival](int32_t later) {
                                                             heard->add(later);
                                                             arrival->hit();
                                                           }),
                            QVNotifications::kStatusOK);
                  heard->add(its);
                }),
            QVNotifications::kStatusOK);
  const int32_t first = *token;
  this->post("first");
  this->settle();
  EXPECT_THAT(heard->tokens(), SizeIs(Ge(1U)));
  EXPECT_THAT(heard->tokens(), Each(first));
  this->post("second");
  EXPECT_TRUE(this->harness_.runUntil(*arrival));
}

TYPED_TEST(QVNotificationsContract, DropsTheHandlerOfACancelledRegistration) {
  const auto held = std::make_shared<int>(0);
  int32_t token = 0;
  ASSERT_EQ(this->harness_.notifications().registerDispatch("name", token, this->queue_,
                                                            [held](int32_t) {}),
            QVNotifications::kStatusOK);
  EXPECT_GT(held.use_count(), 1);
  this->harness_.notifications().cancel(token);
  EXPECT_EQ(held.use_count(), 1);
}

TYPED_TEST(QVNotificationsContract, RefusesNamesThatNameNoFile) {
  using namespace std::string_view_literals;
  int32_t token = -7;
  for (const std::string_view name : {""sv, "."sv, ".."sv, "a/b"sv, "/"sv, "a\0b"sv}) {
    EXPECT_EQ(
        this->harness_.notifications().registerDispatch(name, token, this->queue_, [](int32_t) {}),
        QVNotifications::kStatusInvalidName)
        << name;
  }
  EXPECT_EQ(token, -7);
}

}  // namespace
