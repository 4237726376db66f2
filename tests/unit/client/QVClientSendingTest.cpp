// When calls leave, in how many writes, and what happens when the service does not read.

#include "client/QVClientBatch.h"
#include "tests/unit/client/QVScriptedService.h"

#include <thread>

#include <gtest/gtest.h>

namespace {

using Call = QVScriptedService::Call;
using Code = QVClientError::Code;

constexpr QVClientCategory kPerformance{QVClientComponent::session, QVClientKind::performance};

// The service's end keeps the client's writes apart: one read returns one write.
class QVClientSendingTest : public testing::Test {
 protected:
  QVClientError create(int64_t reporterID) {
    return client_->createReportingSession(reporterID, [this](const auto&) { ++replies_; });
  }
  // The size of the client's next write; waits for it.
  std::size_t nextWrite() { return service_.read().size(); }
  bool wroteNothing() { return service_.callsSoFar().empty(); }

  int replies_ = 0;
  QVScriptedService service_{SOCK_SEQPACKET};
  std::unique_ptr<QVClient> client_ = service_.connectLoopClient();
};

TEST_F(QVClientSendingTest, ALoneCallLeavesAtOnce) {
  EXPECT_FALSE(create(1));
  EXPECT_EQ(service_.callsSoFar().size(), 1U);
  EXPECT_FALSE(create(2));
  EXPECT_EQ(service_.callsSoFar().size(), 1U);
}

TEST_F(QVClientSendingTest, TheCallsOfABatchLeaveInOneWrite) {
  EXPECT_FALSE(create(0));
  const std::size_t lone = nextWrite();
  {
    QVClientBatch batch(*client_);
    for (int i = 0; i < 100; ++i) EXPECT_FALSE(create(i));
    EXPECT_TRUE(wroteNothing());
  }
  EXPECT_EQ(nextWrite(), 100 * lone);
}

TEST_F(QVClientSendingTest, OfBatchesWithinEachOtherTheOuterCounts) {
  {
    QVClientBatch outer(*client_);
    {
      QVClientBatch inner(*client_);
      EXPECT_FALSE(create(1));
    }
    EXPECT_TRUE(wroteNothing());
    EXPECT_FALSE(create(2));
  }
  EXPECT_EQ(service_.callsSoFar().size(), 2U);
}

TEST_F(QVClientSendingTest, FlushSendsWhatABatchKeeps) {
  QVClientBatch batch(*client_);
  EXPECT_FALSE(create(1));
  EXPECT_FALSE(create(2));
  client_->flush();
  EXPECT_EQ(service_.callsSoFar().size(), 2U);
  EXPECT_FALSE(create(3));
  EXPECT_TRUE(wroteNothing());
}

TEST_F(QVClientSendingTest, ABatchOf64KiBLeavesBeforeItsEnd) {
  QVClientPayload payload;
  payload.set("text", std::string(1000, 't'));
  QVClientBatch batch(*client_);
  const auto send = [&] {
    EXPECT_FALSE(
        client_->sendMessage(payload, kPerformance, QVClientMessageType::generic, 1, nullptr));
  };
  for (int i = 0; i < 50; ++i) send();
  EXPECT_TRUE(wroteNothing());
  for (int i = 0; i < 14; ++i) send();
  EXPECT_GE(nextWrite(), std::size_t{64} << 10);
}

TEST_F(QVClientSendingTest, AnotherThreadsCallIsNotKeptByABatch) {
  QVClientBatch batch(*client_);
  EXPECT_FALSE(create(1));
  std::thread([this] { EXPECT_FALSE(create(2)); }).join();
  EXPECT_EQ(service_.callsSoFar().size(), 2U);
}

TEST_F(QVClientSendingTest, CallsOutOfRepliesLeaveInOneWrite) {
  EXPECT_FALSE(create(0));
  const std::size_t lone = nextWrite();
  for (int i = 0; i < 10; ++i) {
    EXPECT_FALSE(client_->getServiceNameForReporterID(1, [this](const auto&) {
      EXPECT_FALSE(create(1));
      EXPECT_TRUE(wroteNothing());
    }));
  }
  const auto calls = service_.callsSoFar();
  ASSERT_EQ(calls.size(), 10U);
  // In one packet, so that the client reads all answers at once.
  std::string answers;
  uint32_t serial = 0;
  for (const Call& call : calls) {
    QVBusWriter writer(answers);
    writer.beginMessage({.type = QVBusMessageType::methodReturn,
                         .serial = ++serial,
                         .replySerial = call.serial,
                         .signature = "q"});
    writer.writeNumber<uint16_t>(2);
    writer.endMessage();
  }
  service_.send(answers);
  client_->dispatch();
  EXPECT_EQ(nextWrite(), 10 * lone);
  EXPECT_TRUE(wroteNothing());
}

TEST_F(QVClientSendingTest, AThousandCallsMayBeUnderWay) {
  {
    QVClientBatch batch(*client_);
    for (int i = 0; i < 1000; ++i) EXPECT_FALSE(create(i));
  }
  const auto calls = service_.callsSoFar();
  ASSERT_EQ(calls.size(), 1000U);
  std::string answers;
  uint32_t serial = 0;
  for (const Call& call : calls) {
    EXPECT_EQ(call.reader().readNumber<int64_t>(), static_cast<int64_t>(serial));
    QVBusWriter writer(answers);
    writer.beginMessage({.type = QVBusMessageType::methodReturn,
                         .serial = ++serial,
                         .replySerial = call.serial,
                         .signature = "b"});
    writer.writeBoolean(true);
    writer.endMessage();
  }
  service_.send(answers);
  while (replies_ < 1000) dispatchWhenReadable(*client_);
  EXPECT_EQ(replies_, 1000);
}

// A service that does not read, over a stream.
class QVClientFullQueueTest : public testing::Test {
 protected:
  static constexpr std::size_t kLimit = std::size_t{64} << 10;

  static QVClientOptions limited() {
    QVClientOptions options;
    options.maximumQueuedBytes = kLimit;
    options.maximumOutstandingCalls = 100'000;
    return options;
  }
  QVClientError send() {
    const QVClientError error = client_->sendMessage(
        payload_, kPerformance, QVClientMessageType::generic, 1,
        [this](const QVClientError& outcome) { outcome ? ++failed_ : ++answered_; });
    if (!error) ++taken_;
    return error;
  }
  QVClientError sendUntilRefused() {
    for (int i = 0; i < 100'000; ++i) {
      if (QVClientError error = send()) return error;
    }
    return {};
  }
  // Reads and answers until `count` calls have been answered.
  void serve(int count) {
    while (answered_ < count && !HasFailure()) {
      for (const Call& call : service_.callsSoFar()) service_.answer(call);
      dispatchWhenReadable(*client_);
    }
  }

  int taken_ = 0;
  int answered_ = 0;
  int failed_ = 0;
  QVClientPayload payload_;
  QVScriptedService service_;
  std::unique_ptr<QVClient> client_ = service_.connectLoopClient(limited());

  void SetUp() override { payload_.set("text", std::string(1000, 't')); }
};

TEST_F(QVClientFullQueueTest, RefusesCallsAndTakesThemAgainWhenTheServiceReads) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  EXPECT_EQ(send().code(), Code::queueFull);
  const int before = taken_;
  EXPECT_GE(before, 64);
  serve(before);
  EXPECT_EQ(failed_, 0);
  EXPECT_FALSE(send());
  serve(before + 1);
  EXPECT_EQ(answered_, taken_);
}

TEST_F(QVClientFullQueueTest, ARefusedCallsReplyNeverRuns) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  const int taken = taken_;
  serve(taken);
  service_.hangUp();
  dispatchWhenReadable(*client_);
  EXPECT_EQ(answered_ + failed_, taken);
}

TEST_F(QVClientFullQueueTest, AWaitingCallGivesUpAtItsLimit) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  const QVClientError error = client_->sendMessageAndWait(
      payload_, kPerformance, QVClientMessageType::generic, 1, std::chrono::milliseconds(1));
  EXPECT_EQ(error.code(), Code::timedOut);
  EXPECT_EQ(client_->waitUntilSent(std::chrono::milliseconds(1)).code(), Code::timedOut);
}

TEST_F(QVClientFullQueueTest, AWaitingCallGetsThroughWhenTheServiceReads) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  std::thread waiting([this] {
    EXPECT_FALSE(client_->sendMessageAndWait(payload_, kPerformance, QVClientMessageType::stop, 1));
  });
  for (int answered = 0; answered <= taken_; ++answered) {
    const Call call = service_.nextCall();
    ASSERT_EQ(call.member, "SendMessage");
    service_.answer(call);
  }
  waiting.join();
  while (answered_ < taken_) dispatchWhenReadable(*client_);
}

TEST_F(QVClientFullQueueTest, WaitUntilSentWaitsForTheService) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  std::thread waiting([this] { EXPECT_FALSE(client_->waitUntilSent()); });
  for (int calls = 0; calls < taken_; ++calls) EXPECT_EQ(service_.nextCall().member, "SendMessage");
  waiting.join();
}

TEST_F(QVClientFullQueueTest, ABatchThatFillsTheQueueIsSentBeforeACallIsRefused) {
  QVClientBatch batch(*client_);
  for (int i = 0; i < 100; ++i) EXPECT_FALSE(send());
}

TEST_F(QVClientFullQueueTest, OneLargeCallIsAlwaysTakenIn) {
  payload_.clear();
  payload_.set("large", std::string(std::size_t{7} << 20, 'x'));
  EXPECT_FALSE(send());
  EXPECT_EQ(send().code(), Code::queueFull);
  serve(1);
  EXPECT_FALSE(send());
}

TEST_F(QVClientFullQueueTest, TheLossOfTheConnectionFailsWhatWaits) {
  EXPECT_EQ(sendUntilRefused().code(), Code::queueFull);
  service_.hangUp();
  while (failed_ < taken_) dispatchWhenReadable(*client_);
  EXPECT_EQ(failed_, taken_);
  EXPECT_EQ(send().code(), Code::connectionLost);
  EXPECT_EQ(client_->waitUntilSent().code(), Code::connectionLost);
}

TEST(QVClientOutstandingCalls, AreLimited) {
  QVScriptedService service;
  QVClientOptions options;
  options.maximumOutstandingCalls = 3;
  const auto client = service.connectLoopClient(std::move(options));
  int replies = 0;
  const auto create = [&] {
    return client->createReportingSession(1, [&replies](const auto&) { ++replies; });
  };
  for (int i = 0; i < 3; ++i) EXPECT_FALSE(create());
  EXPECT_EQ(create().code(), Code::queueFull);
  EXPECT_FALSE(client->createReportingSession(1, nullptr));
  service.answerBoolean(service.callsSoFar()[1]);
  client->dispatch();
  EXPECT_FALSE(create());
  EXPECT_EQ(create().code(), Code::queueFull);
  EXPECT_EQ(replies, 1);
}

}  // namespace
