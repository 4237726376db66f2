// What a reporter makes of a service that goes away, is not there, and comes back.

#include "tests/unit/client/QVReporterFixture.h"

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;

class QVReporterLossTest : public QVReporterFixture {
 protected:
  // A started session that the service has.
  std::unique_ptr<QVReporterSession> startSession(int64_t reporterID) {
    auto session = openSession(reporterID);
    session->start();
    if (service_ == nullptr) service_ = accept();
    serve(*service_, 4);
    EXPECT_EQ(reporter_->flush(kPatience), Code::none);
    return session;
  }

  std::unique_ptr<QVScriptedService> service_;
};

TEST_F(QVReporterLossTest, MakesItsSessionsAnew) {
  open();
  const auto started = startSession(7);
  const auto stopped = startSession(8);
  QVClientPayload configuration;
  configuration.set("n", 1).set("rate", 48000);
  EXPECT_EQ(started->setConfiguration(configuration), Code::none);
  configuration.clear();
  configuration.set("n", 2);
  EXPECT_EQ(started->setConfiguration(configuration), Code::none);
  EXPECT_EQ(started->setServiceType(QVClientServiceType::alarms), Code::none);
  EXPECT_EQ(stopped->stop(), Code::none);
  serve(*service_, 4);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  service_->hangUp();

  const auto next = accept();
  EXPECT_THAT(serve(*next, 7), ElementsAre("create 7", "type 7 4", "configure 7 2", "start 7",
                                           "valid 7", "create 8", "type 8 2"));
  EXPECT_EQ(send(*started, 3), Code::none);
  EXPECT_EQ(serve(*next), "send 7 3");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().connections, 2U);
  EXPECT_EQ(reporter_->counters().dropped.inAll(), 0U);
}

TEST_F(QVReporterLossTest, WhatWasUnderWayIsLostAndCounted) {
  open();
  const auto session = startSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  EXPECT_EQ(send(*session, 2), Code::none);
  EXPECT_EQ(serve(*service_), "send 7 1");
  EXPECT_EQ(describe(service_->nextCall()), "send 7 2");
  service_->hangUp();
  EXPECT_EQ(awaitDrops(1).of(QVDropReason::connectionLost), 1U);
  EXPECT_EQ(reporter_->counters().sent, 1U);
}

TEST_F(QVReporterLossTest, WhatIsQueuedMeanwhileIsSentLater) {
  open();
  const auto session = startSession(7);
  stopListening();
  service_->hangUp();
  for (int i = 0; i < 100; ++i) EXPECT_EQ(send(*session, i), Code::none);
  EXPECT_EQ(session->stop(), Code::none);
  listen();
  const auto next = accept();
  // The loss may have been noticed only after some of them had left.
  uint64_t received = 0;
  std::string last;
  EXPECT_THAT(serve(*next, 4), ElementsAre("create 7", "type 7 2", "start 7", "valid 7"));
  for (std::string call = serve(*next); call != "stop 7" && !HasFailure(); call = serve(*next)) {
    ++received;
    last = call;
  }
  EXPECT_EQ(last, "send 7 99");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent, received);
  EXPECT_EQ(counters.sent + counters.dropped.of(QVDropReason::connectionLost), 100U);
}

TEST_F(QVReporterLossTest, ASessionThatEndedMeanwhileIsNotMadeAnew) {
  open();
  auto first = startSession(7);
  const auto second = startSession(8);
  stopListening();
  service_->hangUp();
  first.reset();
  EXPECT_EQ(send(*second, 1), Code::none);
  listen();
  const auto next = accept();
  // It is made for the sake of what was queued for it, and goes at once.
  Strings calls;
  do calls.push_back(serve(*next));
  while (calls.back() != "send 8 1" && !HasFailure());
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  next->hangUp();
  const auto last = accept();
  EXPECT_THAT(serve(*last, 4), ElementsAre("create 8", "type 8 2", "start 8", "valid 8"));
}

TEST_F(QVReporterLossTest, WithoutRestorationSessionsAreLost) {
  QVReporterOptions given = options();
  given.restoreSessions = false;
  open(std::move(given));
  const auto session = startSession(7);
  service_->hangUp();
  // Once more than may have left before the loss was noticed.
  EXPECT_EQ(send(*session, 1), Code::none);
  EXPECT_EQ(awaitDrops(1).of(QVDropReason::connectionLost), 1U);
  EXPECT_EQ(send(*session, 2), Code::none);
  EXPECT_EQ(awaitDrops(2).of(QVDropReason::connectionLost), 2U);
  EXPECT_EQ(session->stop(), Code::none);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().connections, 1U);

  EXPECT_EQ(session->start(), Code::none);
  EXPECT_EQ(send(*session, 3), Code::none);
  const auto next = accept();
  EXPECT_THAT(serve(*next, 5),
              ElementsAre("create 7", "type 7 2", "start 7", "valid 7", "send 7 3"));
}

TEST_F(QVReporterLossTest, TriesAgainUntilThereIsAService) {
  stopListening();
  open();
  const auto session = openSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);
  listen();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 3), ElementsAre("create 7", "type 7 2", "send 7 1"));
}

TEST_F(QVReporterLossTest, RestoresMoreSessionsThanMayBeUnderWay) {
  open();
  constexpr int kSessions = 300;
  std::vector<std::unique_ptr<QVReporterSession>> sessions;
  for (int i = 1; i <= kSessions; ++i) {
    sessions.push_back(openSession(i));
    sessions.back()->start();
  }
  service_ = accept();
  serve(*service_, 4 * kSessions);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  service_->hangUp();
  const auto next = accept();
  const Strings calls = serve(*next, 4 * kSessions);
  for (int i = 1; i <= kSessions; ++i) {
    EXPECT_EQ(calls[static_cast<std::size_t>(4 * i - 4)], "create " + std::to_string(i));
    EXPECT_EQ(calls[static_cast<std::size_t>(4 * i - 1)], "valid " + std::to_string(i));
  }
}

TEST_F(QVReporterLossTest, ALossBeforeTheFirstAnswerIsMadeUpFor) {
  open();
  const auto session = openSession(7);
  session->start();
  EXPECT_EQ(send(*session, 1), Code::none);
  accept()->hangUp();
  const auto next = accept();
  // The message was under way or queued; the session is there in any case.
  EXPECT_THAT(serve(*next, 4), ElementsAre("create 7", "type 7 2", "start 7", "valid 7"));
  EXPECT_EQ(send(*session, 2), Code::none);
  std::string call;
  do call = serve(*next);
  while (call != "send 7 2" && !HasFailure());
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent + counters.dropped.of(QVDropReason::connectionLost), 2U);
}

}  // namespace
