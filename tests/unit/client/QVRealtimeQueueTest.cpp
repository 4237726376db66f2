// Real-time queues: the ring by itself, and as a session's reporter empties it.

#include "client/QVRealtimeRing.h"
#include "client/QVRealtimeRings.h"
#include "client/QVReporterSessionState.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <cstring>
#include <future>
#include <thread>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsSupersetOf;

class QVRealtimeRingTest : public testing::Test {
 protected:
  bool push(QVRealtimeRing& ring, uint32_t number) {
    const std::span<char> slot = ring.nextSlot();
    if (slot.empty()) return false;
    std::memcpy(slot.data(), &number, sizeof number);
    return ring.push(sizeof number, number, static_cast<uint16_t>(number));
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
  constexpr uint32_t kMessages = 20'000;
  QVRealtimeRing ring(256, 64, nullptr);
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

TEST_F(QVRealtimeRingTest, TakesNothingOnceItIsClosed) {
  QVRealtimeRing ring(4, 64, nullptr);
  EXPECT_TRUE(push(ring, 0));
  const std::span<char> begun = ring.nextSlot();
  ring.close();
  EXPECT_TRUE(ring.isClosed());
  ASSERT_EQ(begun.size(), 64U);
  EXPECT_FALSE(ring.push(4, 1, 1));
  EXPECT_EQ(ring.written(), 1U);
  ASSERT_TRUE(ring.front(message_));
  EXPECT_EQ(numberIn(message_), 0U);
  ring.pop();
  EXPECT_FALSE(ring.front(message_));
}

TEST_F(QVRealtimeRingTest, ClosingItLosesNoMessageUnnoticed) {
  for (int round = 0; round < 200; ++round) {
    QVRealtimeRing ring(1'024, 64, nullptr);
    uint32_t taken = 0;
    std::thread producer([&] {
      while (taken < 1'024 && push(ring, taken)) ++taken;
    });
    while (!ring.front(message_)) std::this_thread::yield();
    ring.close();
    uint32_t seen = 0;
    for (; ring.front(message_); ring.pop()) ++seen;
    producer.join();
    EXPECT_EQ(seen, taken);
    EXPECT_FALSE(ring.front(message_));
  }
}

class QVRealtimeRingsTest : public QVRealtimeRingTest {
 protected:
  std::shared_ptr<QVRealtimeRing> add(std::size_t slots, std::size_t slotBytes) {
    auto ring = std::make_shared<QVRealtimeRing>(slots, slotBytes, nullptr);
    code_ = rings_.add(ring);
    return ring;
  }

  using Code = QVClientError::Code;
  QVRealtimeRings rings_;
  Code code_ = Code::none;
};

TEST_F(QVRealtimeRingsTest, BoundsTheirNumber) {
  std::vector<std::shared_ptr<QVRealtimeRing>> rings;
  for (std::size_t i = 0; i < QVRealtimeRings::kMaximum; ++i) {
    rings.push_back(add(1, 64));
    EXPECT_EQ(code_, Code::none);
  }
  add(1, 64);
  EXPECT_EQ(code_, Code::queueFull);
  // One that holds a message still counts, one that is empty does not.
  EXPECT_TRUE(push(*rings[0], 1));
  rings[0]->abandon();
  add(1, 64);
  EXPECT_EQ(code_, Code::queueFull);
  rings[1]->abandon();
  add(1, 64);
  EXPECT_EQ(code_, Code::none);
  EXPECT_EQ(rings_.all().size(), QVRealtimeRings::kMaximum);
}

TEST_F(QVRealtimeRingsTest, BoundsTheirBytes) {
  add(1'024, 65'536);
  EXPECT_EQ(code_, Code::none);
  // What a message takes beyond its payload counts as well.
  EXPECT_EQ(rings_.admit(QVRealtimeRings::kMaximumBytes / 2), Code::queueFull);
  add(1'024, 65'536);
  EXPECT_EQ(code_, Code::queueFull);
  add(1'023, 65'536);
  EXPECT_EQ(code_, Code::none);
  add(1'024, 64);
  EXPECT_EQ(code_, Code::queueFull);
}

TEST_F(QVRealtimeRingsTest, AdmitMessagesOfOneSession) {
  QVReporterSessionState first(1);
  QVReporterSessionState second(2);
  const auto ofFirst = std::make_shared<QVRealtimeRing>(2, 64, &first);
  const auto ofSecond = std::make_shared<QVRealtimeRing>(2, 64, &second);
  for (const auto& ring : {ofFirst, ofSecond}) {
    EXPECT_EQ(rings_.add(ring), Code::none);
    EXPECT_TRUE(push(*ring, 1));
    ring->refuse();
    EXPECT_FALSE(push(*ring, 2));
    EXPECT_FALSE(ring->takesIn());
    EXPECT_EQ(ring->written(), 1U);
  }
  rings_.admitMessages(second);
  EXPECT_FALSE(ofFirst->takesIn());
  EXPECT_TRUE(push(*ofSecond, 2));
  ofSecond->close();
  rings_.admitMessages(second);
  EXPECT_FALSE(push(*ofSecond, 3));
}

TEST_F(QVRealtimeRingsTest, TakeInNothingOnceTheyAreClosed) {
  add(1, 64);
  EXPECT_EQ(rings_.close().size(), 1U);
  add(1, 64);
  EXPECT_EQ(code_, Code::closed);
  EXPECT_TRUE(rings_.all().empty());
}

class QVRealtimeQueueTest : public QVReporterFixture {
 protected:
  void begin(QVRealtimeQueueOptions size = {}) { begin(options(), size); }
  void begin(QVReporterOptions given, QVRealtimeQueueOptions size = {}) {
    open(std::move(given));
    session_ = openSession(7);
    auto made = session_->makeRealtimeQueue(size);
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

TEST_F(QVRealtimeQueueTest, TakesOnlyWhatIsWrittenWhereItGave) {
  begin();
  session_->start();
  const auto service = accept();
  serve(*service, 4);
  QVClientPayload other;
  other.set("n", 1);
  QVClientPayload* message = queue_->begin();
  ASSERT_NE(message, nullptr);
  *message = std::move(other);
  EXPECT_FALSE(queue_->commit(kPlayback, QVClientMessageType::generic));
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::invalid), 1U);
  // What was handed over is written no more.
  EXPECT_TRUE(commit(2));
  message->clear();
  message->set("n", 3);
  EXPECT_EQ(message->errorCode(), Code::messageTooLarge);
  EXPECT_EQ(serve(*service), "send 7 2");
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

TEST_F(QVRealtimeQueueTest, DropsAndCountsWhatComesWithoutItsSession) {
  begin();
  session_.reset();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 3), ElementsAre("create 7", "type 7 2", "destroy 7"));
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_TRUE(queue_->isClosed());
  for (int64_t i = 1; i <= 1'000; ++i) EXPECT_FALSE(commit(i));
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::connectionLost), 1'000U);
}

TEST_F(QVRealtimeQueueTest, DropsAndCountsWhatIsHalfWrittenWhenItsSessionGoes) {
  begin();
  QVClientPayload* message = queue_->begin();
  ASSERT_NE(message, nullptr);
  session_.reset();
  const auto service = accept();
  serve(*service, 3);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  message->set("n", 1);
  EXPECT_FALSE(queue_->commit(kPlayback, QVClientMessageType::generic));
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::connectionLost), 1U);
}

TEST_F(QVRealtimeQueueTest, MayOutliveItsReporter) {
  begin();
  EXPECT_FALSE(queue_->isClosed());
  EXPECT_TRUE(commit(1));
  reporter_.reset();
  EXPECT_EQ(awaitDrops(1).of(QVDropReason::connectionLost), 1U);
  EXPECT_TRUE(queue_->isClosed());
  EXPECT_FALSE(commit(2));
  EXPECT_EQ(session_->makeRealtimeQueue().error().code(), Code::closed);
}

TEST_F(QVRealtimeQueueTest, AreBoundedWhileTheirSessionIsNotStarted) {
  begin({.messages = 1, .bytesPerMessage = 64});
  // Closed without a message, they take nothing.
  for (int i = 0; i < 2'000; ++i) ASSERT_TRUE(session_->makeRealtimeQueue({.messages = 1}));
  QVClientResult<std::unique_ptr<QVRealtimeQueue>> made = QVClientError();
  std::size_t kept = 1;
  while ((made = session_->makeRealtimeQueue({.messages = 1, .bytesPerMessage = 64}))) {
    ASSERT_NE(made.value()->begin(), nullptr);
    ASSERT_TRUE(made.value()->commit(kPlayback, QVClientMessageType::generic));
    ASSERT_LE(++kept, 1'024U);
  }
  EXPECT_EQ(made.error().code(), Code::queueFull);
  EXPECT_EQ(kept, 1'024U);
}

// A thread that keeps its queue full: for each message that the service answers there is another.
class QVFullRealtimeQueueTest : public QVRealtimeQueueTest {
 protected:
  static constexpr std::size_t kSlots = 1'024;  // more than may be under way

  void beginFull() {
    begin({.messages = kSlots, .bytesPerMessage = 64});
    session_->start();
    service_ = accept();
    serve(*service_, 4);
    EXPECT_EQ(reporter_->flush(kPatience), Code::none);
    fillUp();
  }
  void fillUp() {
    while (queue_->begin() != nullptr) {
      // Its session may go in between.
      EXPECT_TRUE(queue_->commit(kPlayback, QVClientMessageType::generic) || queue_->isClosed());
    }
  }
  std::string serveFull() {
    fillUp();
    return serve(*service_);
  }

  std::unique_ptr<QVScriptedService> service_;
};

TEST_F(QVFullRealtimeQueueTest, HoldsUpNoStop) {
  beginFull();
  session_->stop();
  std::string call;
  for (std::size_t i = 0; i < 3 * kSlots && call != "stop 7"; ++i) call = serveFull();
  EXPECT_EQ(call, "stop 7");
}

TEST_F(QVFullRealtimeQueueTest, HoldsUpNoDestruction) {
  beginFull();
  session_.reset();
  std::string call;
  for (std::size_t i = 0; i < 3 * kSlots && call != "destroy 7"; ++i) call = serveFull();
  EXPECT_EQ(call, "destroy 7");
}

TEST_F(QVFullRealtimeQueueTest, HoldsUpNoFlush) {
  beginFull();
  auto flushed = std::async(std::launch::async, [this] { return reporter_->flush(kPatience); });
  while (flushed.wait_for(std::chrono::seconds(0)) != std::future_status::ready) serveFull();
  EXPECT_EQ(flushed.get(), Code::none);
}

TEST_F(QVFullRealtimeQueueTest, HoldsUpNoOtherQueue) {
  beginFull();
  const auto made = session_->makeRealtimeQueue({.messages = 1});
  ASSERT_TRUE(made) << made.error().text();
  QVClientPayload* message = made.value()->begin();
  ASSERT_NE(message, nullptr);
  message->set("n", 99);
  EXPECT_TRUE(made.value()->commit(kPlayback, QVClientMessageType::generic));
  std::string call;
  for (std::size_t i = 0; i < 3 * kSlots && call != "send 7 99"; ++i) call = serveFull();
  EXPECT_EQ(call, "send 7 99");
}

TEST_F(QVFullRealtimeQueueTest, HoldsUpNoOtherQueueBeforeAStop) {
  beginFull();
  const auto other = openSession(8);
  other->start();
  const auto made = other->makeRealtimeQueue({.messages = 1});
  ASSERT_TRUE(made) << made.error().text();
  std::string call;
  for (std::size_t i = 0; i < 3 * kSlots && call != "valid 8"; ++i) call = serveFull();
  EXPECT_EQ(call, "valid 8");
  fillUp();
  session_->stop();
  QVClientPayload* message = made.value()->begin();
  ASSERT_NE(message, nullptr);
  message->set("n", 99);
  EXPECT_TRUE(made.value()->commit(kPlayback, QVClientMessageType::generic));
  // Without more of the full one: its stop has to wait for what it holds, this has not.
  Strings calls;
  do calls.push_back(serve(*service_));
  while (calls.back() != "send 8 99" && calls.back() != "stop 7" && !HasFailure());
  EXPECT_EQ(calls.back(), "send 8 99");
  do calls.push_back(serve(*service_));
  while (calls.back() != "stop 7" && !HasFailure());
}

TEST_F(QVRealtimeQueueTest, IsNotHeldUpByTheQueueOfOtherThreads) {
  begin();
  session_->start();
  const auto service = accept();
  serve(*service, 4);
  const auto fillUp = [this] {
    Code code = Code::none;
    while (code == Code::none) code = send(*session_, 1);
    EXPECT_EQ(code, Code::queueFull);
  };
  fillUp();
  EXPECT_TRUE(commit(99));
  std::string call;
  for (std::size_t i = 0; i < 1'024 && call != "send 7 99"; ++i) {
    call = serve(*service);
    fillUp();
  }
  EXPECT_EQ(call, "send 7 99");
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
  // What was under way is counted by now.
  const uint64_t lost = reporter_->counters().dropped.of(QVDropReason::connectionLost);
  EXPECT_LE(lost, 1U);
  EXPECT_THAT(serve(*service, 4), ElementsAre("create 7", "type 7 2", "start 7", "valid 7"));
  EXPECT_THAT(serve(*service, 5 - lost),
              IsSupersetOf({"send 7 2", "send 7 3", "send 7 4", "send 7 5"}));
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().sent, 5 - lost);
}

TEST_F(QVRealtimeQueueTest, ItsMessagesAreSentWhereItsSessionGoesWhileThereIsNoService) {
  begin();
  session_->start();
  auto service = accept();
  serve(*service, 4);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  stopListening();
  service->hangUp();
  awaitConnectionError();
  for (int64_t i = 1; i <= 5; ++i) EXPECT_TRUE(commit(i));
  session_.reset();
  listen();
  service = accept();
  EXPECT_THAT(serve(*service, 10),
              ElementsAre("create 7", "type 7 2", "start 7", "valid 7", "send 7 1", "send 7 2",
                          "send 7 3", "send 7 4", "send 7 5", "destroy 7"));
}

TEST_F(QVRealtimeQueueTest, HandsNothingOfALostSessionToTheNext) {
  QVReporterOptions given = options();
  given.restoreSessions = false;
  begin(std::move(given));
  session_->start();
  auto service = accept();
  serve(*service, 4);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  QVClientPayload* message = queue_->begin();
  ASSERT_NE(message, nullptr);
  message->set("n", 1);
  service->hangUp();
  awaitConnectionError();
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_FALSE(queue_->commit(kPlayback, QVClientMessageType::generic));
  for (int i = 0; i < 1'000; ++i) EXPECT_EQ(queue_->begin(), nullptr);
  EXPECT_EQ(reporter_->counters().dropped.of(QVDropReason::connectionLost), 1'001U);
  EXPECT_FALSE(queue_->isClosed());
  // What comes behind the start waits for it.
  session_->start();
  EXPECT_TRUE(commit(2));
  service = accept();
  EXPECT_THAT(serve(*service, 5),
              ElementsAre("create 7", "type 7 2", "start 7", "valid 7", "send 7 2"));
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
