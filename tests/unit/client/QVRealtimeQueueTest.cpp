// Real-time queues: the ring by itself, and as a session's reporter empties it.

#include "client/QVRealtimeRing.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <cstring>
#include <thread>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;

class QVRealtimeRingTest : public testing::Test {
 protected:
  bool push(QVRealtimeRing& ring, uint32_t number) {
    const std::span<char> slot = ring.nextSlot();
    if (slot.empty()) return false;
    std::memcpy(slot.data(), &number, sizeof number);
    ring.push(sizeof number, number, static_cast<uint16_t>(number));
    return true;
  }
  static uint32_t numberIn(const QVRealtimeRing::Message& message) {
    uint32_t number = 0;
    EXPECT_EQ(message.payload.size(), sizeof number);
    std::memcpy(&number, message.payload.data(), sizeof number);
    EXPECT_EQ(message.category, number);
    EXPECT_EQ(message.type, static_cast<uint16_t>(number));
    return number;
  }

  QVRealtimeRing::Message message_;
};

TEST_F(QVRealtimeRingTest, TakesAsManyAsItHasSlots) {
  QVRealtimeRing ring(4, 64, nullptr);
  EXPECT_FALSE(ring.front(message_));
  for (uint32_t i = 0; i < 4; ++i) EXPECT_TRUE(push(ring, i));
  EXPECT_FALSE(push(ring, 4));
  ASSERT_TRUE(ring.front(message_));
  EXPECT_EQ(numberIn(message_), 0U);
  EXPECT_FALSE(push(ring, 4));
  ring.pop();
  EXPECT_TRUE(push(ring, 4));
  for (uint32_t i = 1; i < 5; ++i, ring.pop()) {
    ASSERT_TRUE(ring.front(message_));
    EXPECT_EQ(numberIn(message_), i);
  }
  EXPECT_FALSE(ring.front(message_));
}

TEST_F(QVRealtimeRingTest, HandsOverEveryMessageBetweenTwoThreads) {
  constexpr uint32_t kMessages = 200'000;
  QVRealtimeRing ring(16, 64, nullptr);
  std::thread producer([&] {
    for (uint32_t i = 0; i < kMessages;) {
      if (push(ring, i)) {
        ++i;
      } else {
        std::this_thread::yield();
      }
    }
  });
  for (uint32_t i = 0; i < kMessages;) {
    if (!ring.front(message_)) {
      std::this_thread::yield();
      continue;
    }
    EXPECT_EQ(numberIn(message_), i);
    ring.pop();
    ++i;
  }
  producer.join();
}

TEST_F(QVRealtimeRingTest, TellsOfEachDropOnce) {
  QVRealtimeRing ring(1, 64, nullptr);
  ring.countDrop(QVDropReason::queueFull);
  ring.countDrop(QVDropReason::queueFull);
  ring.countDrop(QVDropReason::disabled);
  const QVDropCounts drops = ring.takeDrops();
  EXPECT_EQ(drops.of(QVDropReason::queueFull), 2U);
  EXPECT_EQ(drops.of(QVDropReason::disabled), 1U);
  EXPECT_EQ(ring.takeDrops().inAll(), 0U);
}

class QVRealtimeQueueTest : public QVReporterFixture {
 protected:
  void begin(QVRealtimeQueueOptions options = {}) {
    open();
    session_ = openSession(7);
    auto made = session_->makeRealtimeQueue(options);
    ASSERT_TRUE(made) << made.error().text();
    queue_ = std::move(made.value());
  }
  bool commit(int64_t number) {
    QVClientPayload* message = queue_->begin();
    if (message == nullptr) return false;
    message->set("n", number);
    return queue_->commit(kPlayback, QVClientMessageType::generic);
  }

  std::unique_ptr<QVReporterSession> session_;
  std::unique_ptr<QVRealtimeQueue> queue_;
};

TEST_F(QVRealtimeQueueTest, SendsWhatIsCommittedWhileItsSessionIsStarted) {
  begin();
  EXPECT_TRUE(commit(1));
  session_->start();
  const auto service = accept();
  // Nothing before the start.
  EXPECT_THAT(serve(*service, 5),
              ElementsAre("create 7", "type 7 2", "start 7", "valid 7", "send 7 1"));
  // Nobody is woken for it; it comes all the same.
  EXPECT_TRUE(commit(2));
  EXPECT_EQ(serve(*service), "send 7 2");
}

TEST_F(QVRealtimeQueueTest, AStopSendsWhatWasCommittedBefore) {
  begin();
  session_->start();
  const auto service = accept();
  serve(*service, 4);
  for (int64_t i = 1; i <= 200; ++i) EXPECT_TRUE(commit(i));
  session_->stop();
  for (int64_t i = 1; i <= 200; ++i) EXPECT_EQ(serve(*service), "send 7 " + std::to_string(i));
  EXPECT_EQ(serve(*service), "stop 7");
}

TEST_F(QVRealtimeQueueTest, AFlushSendsWhatWasCommittedBefore) {
  begin();
  session_->start();
  const auto service = accept();
  serve(*service, 4);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_TRUE(commit(1));
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);
  EXPECT_EQ(serve(*service), "send 7 1");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().sent, 1U);
}

TEST_F(QVRealtimeQueueTest, WhatDoesNotFitIsDroppedAndCounted) {
  begin({.messages = 3, .bytesPerMessage = 64});
  for (int64_t i = 1; i <= 4; ++i) EXPECT_TRUE(commit(i));  // rounded up
  EXPECT_FALSE(commit(5));
  EXPECT_EQ(queue_->begin(), nullptr);
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::queueFull), 2U);
  session_->start();
  const auto service = accept();
  serve(*service, 8);

  QVClientPayload* message = queue_->begin();
  ASSERT_NE(message, nullptr);
  message->set("text", std::string(64, 'x'));
  EXPECT_EQ(message->errorCode(), Code::messageTooLarge);
  EXPECT_FALSE(queue_->commit(kPlayback, QVClientMessageType::generic));
  EXPECT_EQ(awaitDrops(3).of(QVDropReason::invalid), 1U);
  // One that was not begun, or begun twice, is no message.
  EXPECT_FALSE(queue_->commit(kPlayback, QVClientMessageType::generic));
  ASSERT_NE(queue_->begin(), nullptr);
  queue_->begin()->set("n", 6);
  EXPECT_TRUE(queue_->commit(kPlayback, QVClientMessageType::generic));
  EXPECT_EQ(serve(*service), "send 7 6");
}

TEST_F(QVRealtimeQueueTest, IsClosedToMessagesWhileReportingIsOff) {
  switchReporting(false);
  begin();
  EXPECT_EQ(queue_->begin(), nullptr);
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::disabled), 1U);
}

TEST_F(QVRealtimeQueueTest, MayGoBeforeWhatItHolds) {
  begin();
  session_->start();
  EXPECT_TRUE(commit(1));
  queue_.reset();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 5),
              ElementsAre("create 7", "type 7 2", "start 7", "valid 7", "send 7 1"));
}

TEST_F(QVRealtimeQueueTest, MayOutliveItsSessionAndItsReporter) {
  begin();
  session_.reset();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 3), ElementsAre("create 7", "type 7 2", "destroy 7"));
  EXPECT_TRUE(commit(1));
  reporter_.reset();
  EXPECT_TRUE(commit(2));
}

TEST_F(QVRealtimeQueueTest, KeepsItsMessagesWhileThereIsNoService) {
  begin();
  session_->start();
  auto service = accept();
  serve(*service, 4);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  stopListening();
  service->hangUp();
  // Once a send has been lost or kept, nothing else can leave.
  EXPECT_EQ(send(*session_, 1), Code::none);
  for (int64_t i = 2; i <= 5; ++i) EXPECT_TRUE(commit(i));
  listen();
  service = accept();
  Strings calls;
  do calls.push_back(serve(*service));
  while (calls.back() != "send 7 5" && !HasFailure());
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent + counters.dropped.of(QVDropReason::connectionLost), 5U);
}

TEST_F(QVRealtimeQueueTest, RefusesSizesBeyondItsLimits) {
  open();
  const auto session = openSession(7);
  for (const QVRealtimeQueueOptions given :
       {QVRealtimeQueueOptions{.messages = 0}, QVRealtimeQueueOptions{.messages = 65'537},
        QVRealtimeQueueOptions{.bytesPerMessage = 63},
        QVRealtimeQueueOptions{.bytesPerMessage = 65'537},
        QVRealtimeQueueOptions{.messages = 65'536, .bytesPerMessage = 1'025}}) {
    EXPECT_EQ(session->makeRealtimeQueue(given).error().code(), Code::invalidArgument);
  }
}

}  // namespace
