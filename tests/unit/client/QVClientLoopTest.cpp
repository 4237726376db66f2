// A client in a program's own loop: what its descriptor tells, and that nothing but dispatch() runs
// replies.

#include "tests/unit/client/QVScriptedService.h"

#include <thread>

#include <gtest/gtest.h>

namespace {

using Call = QVScriptedService::Call;
using Code = QVClientError::Code;

class QVClientLoopTest : public testing::Test {
 protected:
  QVClientError create() {
    return client_->createReportingSession(1, [this](const auto&) { ++replies_; });
  }

  int replies_ = 0;
  int losses_ = 0;
  QVScriptedService service_;
  std::unique_ptr<QVClient> client_ = service_.connectLoopClient(noting(losses_));

  static QVClientOptions noting(int& losses) {
    QVClientOptions options;
    options.connectionLost = [&losses](const QVClientError&) { ++losses; };
    return options;
  }
};

TEST_F(QVClientLoopTest, IsReadableOnlyWhileThereIsSomethingToDo) {
  EXPECT_FALSE(isReadable(*client_));
  EXPECT_FALSE(create());
  EXPECT_FALSE(isReadable(*client_));
  service_.answerBoolean(service_.nextCall());
  EXPECT_TRUE(isReadable(*client_));
  EXPECT_EQ(replies_, 0);
  client_->dispatch();
  EXPECT_EQ(replies_, 1);
  EXPECT_FALSE(isReadable(*client_));
}

TEST_F(QVClientLoopTest, DispatchingWithNothingToDoDoesNothing) {
  client_->dispatch();
  client_->dispatch();
  EXPECT_EQ(replies_, 0);
}

TEST_F(QVClientLoopTest, AWaitingCallKeepsOthersRepliesForTheLoop) {
  EXPECT_FALSE(create());
  EXPECT_FALSE(create());
  const Call first = service_.nextCall();
  service_.answerBoolean(first);
  std::thread server([this] {
    const Call second = service_.nextCall();
    const Call waiting = service_.nextCall();
    service_.answerBoolean(second);
    service_.answerBoolean(waiting);
  });
  EXPECT_TRUE(client_->createReportingSessionAndWait(2));
  server.join();
  EXPECT_EQ(replies_, 0);
  EXPECT_TRUE(isReadable(*client_));
  client_->dispatch();
  EXPECT_EQ(replies_, 2);
  EXPECT_FALSE(isReadable(*client_));
}

TEST_F(QVClientLoopTest, KeptRepliesRunInTheOrderOfTheAnswers) {
  std::vector<int> order;
  for (int i = 0; i < 3; ++i) {
    EXPECT_FALSE(
        client_->createReportingSession(i, [&order, i](const auto&) { order.push_back(i); }));
  }
  const auto calls = service_.callsSoFar();
  service_.answerBoolean(calls[0]);
  service_.answerBoolean(calls[1]);
  std::thread server([&] { service_.answerBoolean(service_.nextCall()); });
  EXPECT_TRUE(client_->createReportingSessionAndWait(9));
  server.join();
  service_.answerBoolean(calls[2]);
  client_->dispatch();
  EXPECT_EQ(order, (std::vector<int>{0, 1, 2}));
}

TEST_F(QVClientLoopTest, AWaitingCallThatMeetsTheLossLeavesItToTheLoop) {
  EXPECT_FALSE(create());
  std::thread server([this] {
    service_.nextCall();
    service_.nextCall();
    service_.hangUp();
  });
  EXPECT_EQ(client_->createReportingSessionAndWait(2).error().code(), Code::connectionLost);
  server.join();
  EXPECT_EQ(replies_, 0);
  EXPECT_EQ(losses_, 0);
  dispatchWhenReadable(*client_);
  EXPECT_EQ(replies_, 1);
  EXPECT_EQ(losses_, 1);
  EXPECT_FALSE(isReadable(*client_));
}

TEST_F(QVClientLoopTest, IsNotReadableForEverAfterTheLoss) {
  service_.hangUp();
  dispatchWhenReadable(*client_);
  EXPECT_EQ(losses_, 1);
  client_->dispatch();
  EXPECT_FALSE(isReadable(*client_));
  EXPECT_EQ(losses_, 1);
}

TEST_F(QVClientLoopTest, RepliesMustNotWaitOrDispatch) {
  std::vector<Code> codes;
  int inner = 0;
  EXPECT_FALSE(client_->createReportingSession(1, [&](const auto&) {
    codes.push_back(client_->createReportingSessionAndWait(2).error().code());
    client_->dispatch();
    inner = replies_;
  }));
  EXPECT_FALSE(create());
  for (const Call& call : service_.callsSoFar()) service_.answerBoolean(call);
  client_->dispatch();
  EXPECT_EQ(codes, std::vector<Code>{Code::wouldDeadlock});
  EXPECT_EQ(inner, 0);
  EXPECT_EQ(replies_, 1);
}

TEST_F(QVClientLoopTest, WhatTheSocketDoesNotTakeLeavesWhenThereIsRoom) {
  QVClientPayload payload;
  payload.set("large", std::string(std::size_t{4} << 20, 'x'));
  EXPECT_FALSE(client_->setConfiguration(payload, 1, [this](const auto&) { ++replies_; }));
  while (replies_ == 0 && !HasFailure()) {
    for (const Call& call : service_.callsSoFar()) service_.answerBoolean(call);
    dispatchWhenReadable(*client_);
  }
  EXPECT_EQ(replies_, 1);
  EXPECT_FALSE(isReadable(*client_));
}

TEST_F(QVClientLoopTest, AThreadMayWaitWhileAnotherDispatches) {
  std::thread server([this] {
    for (Call call = service_.nextCall(); !call.member.empty(); call = service_.nextCall()) {
      service_.answerBoolean(call);
    }
  });
  std::thread waiting([this] {
    for (int i = 0; i < 500; ++i) EXPECT_TRUE(client_->createReportingSessionAndWait(i));
  });
  while (replies_ < 500 && !HasFailure()) {
    EXPECT_FALSE(create());
    const int before = replies_;
    while (replies_ == before && !HasFailure()) dispatchWhenReadable(*client_);
  }
  waiting.join();
  client_.reset();
  server.join();
  EXPECT_EQ(replies_, 500);
}

}  // namespace
