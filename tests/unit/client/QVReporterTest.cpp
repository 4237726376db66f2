// A reporter with its service: what is sent when, and what is counted.

#include "tests/support/QVDescriptorLimit.h"
#include "tests/unit/client/QVReporterFixture.h"

#include <chrono>
#include <future>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class QVReporterTest : public QVReporterFixture {};

TEST_F(QVReporterTest, ConnectsWhenThereIsSomethingToSend) {
  open();
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().connections, 0U);
  const auto session = openSession(7);
  const auto service = accept();
  EXPECT_EQ(serve(*service), "create 7");
  EXPECT_EQ(reporter_->counters().connections, 1U);
}

TEST_F(QVReporterTest, MakesCallsOfStepsAndMessagesInTheirOrder) {
  open();
  auto session = openSession(7);
  QVClientPayload configuration;
  configuration.set("n", 48000);
  EXPECT_EQ(session->setConfiguration(configuration), Code::none);
  EXPECT_EQ(session->start(), Code::none);
  EXPECT_EQ(send(*session, 1), Code::none);
  EXPECT_EQ(session->setServiceType(QVClientServiceType::alarms), Code::none);
  EXPECT_EQ(reporter_->sendToEverySession(configuration, kPlayback, QVClientMessageType::start),
            Code::none);
  EXPECT_EQ(session->stop(), Code::none);
  session.reset();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 10),
              ElementsAre("create 7", "type 7 2", "configure 7 48000", "start 7", "valid 7",
                          "send 7 1", "type 7 4", "send * 48000", "stop 7", "destroy 7"));
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent, 2U);
  EXPECT_EQ(counters.dropped.inAll(), 0U);
  EXPECT_EQ(counters.queuedMessages, 0U);
  EXPECT_EQ(counters.queuedBytes, 0U);
}

TEST_F(QVReporterTest, SendsAMessageAsItWasWritten) {
  open();
  const auto session = openSession(7);
  QVClientPayload payload;
  payload.set("text", "speaker").beginArray("levels").add(-3.5).endArray();
  EXPECT_EQ(session->sendMessage(payload, QVClientCategory(0xC0FFEE), QVClientMessageType::error),
            Code::none);
  const std::string entries(payload.entries());
  payload.clear();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  const Call call = service->nextCall();
  EXPECT_EQ(call.body.substr(8, entries.size()), entries);
  QVBusReader reader = call.reader();
  QVBusSignature signature;
  ASSERT_TRUE(signature.parse("a{sv}"));
  reader.skipValue(signature, 0);
  EXPECT_EQ(reader.readNumber<uint32_t>(), 0xC0FFEEU);
  EXPECT_EQ(reader.readNumber<uint16_t>(), 4U);
}

TEST_F(QVReporterTest, PicksIDsThatAreFree) {
  open();
  const auto first = openSession(0);
  const auto second = openSession(0);
  EXPECT_GT(first->reporterID(), 0);
  EXPECT_LT(first->reporterID(), int64_t{1} << 52);
  EXPECT_NE(first->reporterID(), second->reporterID());
  const auto taken = reporter_->openSession({.reporterID = first->reporterID()});
  EXPECT_EQ(taken.error().code(), Code::reporterIDTaken);
}

TEST_F(QVReporterTest, AnIDIsFreeAgainWhenItsSessionIsDestroyed) {
  stopListening();
  open();
  // At once, whether there is a service or not.
  for (int i = 0; i < 3; ++i) openSession(7).reset();
  const auto again = openSession(7);
  EXPECT_EQ(reporter_->openSession({.reporterID = 7}).error().code(), Code::reporterIDTaken);
  again->start();
  listen();
  const auto service = accept();
  // What comes and goes before there is a service is made and destroyed all the same.
  Strings calls;
  do calls.push_back(serve(*service));
  while (calls.back() != "start 7" && !HasFailure());
  ASSERT_GE(calls.size(), 3U);
  EXPECT_EQ(calls[calls.size() - 3], "create 7");
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);
  EXPECT_EQ(serve(*service), "valid 7");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  service->hangUp();
  // One of them alone is made anew.
  const auto next = accept();
  EXPECT_THAT(serve(*next, 4), ElementsAre("create 7", "type 7 2", "start 7", "valid 7"));
  EXPECT_EQ(send(*again, 1), Code::none);
  EXPECT_EQ(serve(*next), "send 7 1");
}

TEST_F(QVReporterTest, CountsWhatTheServiceDoesNotTake) {
  open();
  const auto session = openSession(7);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(send(*session, i), Code::none);
  const auto service = accept();
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  service->answer(service->nextCall());
  service->refuse(service->nextCall(), "net.quillon.audio.reporting.Code1",
                  "reporting is switched off");
  service->refuse(service->nextCall(), "org.freedesktop.DBus.Error.InvalidArgs", "no");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  const QVReporterCounters counters = reporter_->counters();
  EXPECT_EQ(counters.sent, 1U);
  EXPECT_EQ(counters.dropped.of(QVDropReason::disabled), 1U);
  EXPECT_EQ(counters.dropped.of(QVDropReason::refused), 1U);
  EXPECT_EQ(counters.dropped.inAll(), 2U);
}

TEST_F(QVReporterTest, RefusesPayloadsThatAreNotInOrder) {
  QVReporterOptions given = options();
  given.maximumQueuedBytes = 4096;
  open(std::move(given));
  const auto session = openSession(7);
  QVClientPayload payload;
  payload.beginArray("open");
  EXPECT_EQ(session->sendMessage(payload, kPlayback, QVClientMessageType::generic),
            Code::invalidPayload);
  EXPECT_EQ(session->setConfiguration(payload), Code::invalidPayload);
  payload.clear();
  payload.set("text", std::string(4096, 'x'));
  EXPECT_EQ(session->sendMessage(payload, kPlayback, QVClientMessageType::generic),
            Code::messageTooLarge);
  EXPECT_EQ(awaitDrops(2).of(QVDropReason::invalid), 2U);
  payload.set("text", std::string(65'536, 'x'));
  EXPECT_EQ(session->setConfiguration(payload), Code::messageTooLarge);
}

TEST_F(QVReporterTest, DropsWhatItsQueueHasNoRoomFor) {
  QVReporterOptions given = options();
  given.maximumQueuedMessages = 20;
  open(std::move(given));
  const auto session = openSession(7);
  // Nobody reads: some are under way, some are queued, and then there is an end.
  int64_t taken = 0;
  while (send(*session, taken) == Code::none) ++taken;
  EXPECT_GE(taken, 19);
  EXPECT_LE(taken, 20 + 256);
  EXPECT_GE(awaitDrops(1).of(QVDropReason::queueFull), 1U);
  // Steps of the session are not kept from it.
  EXPECT_EQ(session->stop(), Code::none);

  const auto service = accept();
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  for (int64_t i = 0; i < taken; ++i) EXPECT_EQ(serve(*service), "send 7 " + std::to_string(i));
  EXPECT_EQ(serve(*service), "stop 7");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->counters().sent, static_cast<uint64_t>(taken));
}

TEST_F(QVReporterTest, BoundsTheBytesOfItsQueue) {
  QVReporterOptions given = options();
  given.maximumQueuedBytes = 64 << 10;
  open(std::move(given));
  const auto session = openSession(7);
  QVClientPayload payload;
  payload.set("text", std::string(10'000, 'x'));
  int taken = 0;
  while (session->sendMessage(payload, kPlayback, QVClientMessageType::generic) == Code::none) {
    ++taken;
    EXPECT_LE(reporter_->counters().queuedBytes, std::size_t{64} << 10);
  }
  // What may be under way, in the queue, and the one message that may go beyond the former.
  EXPECT_LE(taken, ((256 + 64) << 10) / 10'000 + 1);
  EXPECT_GE(taken, (64 << 10) / 10'100);
}

TEST_F(QVReporterTest, StepsOfSessionsAreBoundedAsWell) {
  open();
  stopListening();
  const auto session = openSession(7);
  Code code = Code::none;
  int taken = 0;
  while ((code = session->start()) == Code::none) ++taken;
  EXPECT_EQ(code, Code::queueFull);
  EXPECT_LE(taken, 16'384 + 1'024);
  EXPECT_EQ(reporter_->openSession().error().code(), Code::queueFull);
}

TEST_F(QVReporterTest, AFlushEndsAtItsLimit) {
  open();
  const auto session = openSession(7);
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds::min()), Code::timedOut);
  const auto service = accept();
  auto flushed = std::async(std::launch::async, [this] { return reporter_->flush(kPatience); });
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  EXPECT_EQ(flushed.get(), Code::none);
}

TEST_F(QVReporterTest, AStartIsFlushedWhenTheServiceHasIt) {
  open();
  const auto session = openSession(7);
  session->start();
  const auto service = accept();
  EXPECT_THAT(serve(*service, 3), ElementsAre("create 7", "type 7 2", "start 7"));
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);
  EXPECT_EQ(serve(*service), "valid 7");
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
}

TEST_F(QVReporterTest, ItsEndSendsWhatIsLeft) {
  QVReporterOptions given = options();
  given.endTimeLimit = kPatience;
  open(std::move(given));
  const auto session = openSession(7);
  for (int i = 0; i < 1'000; ++i) EXPECT_EQ(send(*session, i), Code::none);
  auto ended = std::async(std::launch::async, [this] { reporter_.reset(); });
  const auto service = accept();
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  for (int i = 0; i < 1'000; ++i) EXPECT_EQ(serve(*service), "send 7 " + std::to_string(i));
  EXPECT_EQ(serve(*service), "hung up");
  ended.get();
  EXPECT_EQ(awaitDrops(0).inAll(), 0U);
}

TEST_F(QVReporterTest, ItsEndDoesNotWaitForAServiceThatIsNotThere) {
  QVReporterOptions given = options();
  given.endTimeLimit = std::chrono::hours(1);
  open(std::move(given));
  stopListening();
  const auto session = openSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  reporter_.reset();
  EXPECT_EQ(awaitDrops(1).of(QVDropReason::connectionLost), 1U);
}

TEST_F(QVReporterTest, AfterItsEndSessionsTakeNothing) {
  open();
  const auto session = openSession(7);
  const auto queue = std::move(session->makeRealtimeQueue().value());
  reporter_.reset();
  EXPECT_EQ(send(*session, 1), Code::closed);
  EXPECT_EQ(session->start(), Code::closed);
  EXPECT_EQ(queue->begin(), nullptr);
  EXPECT_FALSE(queue->commit(kPlayback, QVClientMessageType::generic));
}

TEST_F(QVReporterTest, ADropCallbackMayEndIt) {
  QVReporterOptions given = options();
  std::promise<void> isIdle;  // no other thread uses the reporter any more
  std::promise<Code> flushed;
  given.dropped = [this, &isIdle, &flushed](const QVDropCounts&) {
    isIdle.get_future().get();
    const Code code = reporter_->flush(kPatience);
    reporter_.reset();
    flushed.set_value(code);
  };
  open(std::move(given));
  QVClientPayload payload;
  payload.beginArray("open");
  EXPECT_EQ(reporter_->sendToEverySession(payload, kPlayback, QVClientMessageType::generic),
            Code::invalidPayload);
  isIdle.set_value();
  EXPECT_EQ(flushed.get_future().get(), Code::wouldDeadlock);
  EXPECT_EQ(reporter_, nullptr);
}

TEST_F(QVReporterTest, SaysWhatKeepsItFromTheService) {
  open();
  EXPECT_EQ(reporter_->connectionError().code(), Code::none) << "nothing was to be sent yet";
  stopListening();
  const auto session = openSession(7);
  awaitConnectionError();
  EXPECT_EQ(reporter_->connectionError().code(), Code::cannotConnect);
  EXPECT_THAT(reporter_->connectionError().text(), HasSubstr(root_.socket().string()));
  listen();
  const auto service = accept();
  serve(*service, 2);
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_EQ(reporter_->connectionError().code(), Code::none);
  stopListening();
  service->hangUp();
  awaitConnectionError();
}

TEST_F(QVReporterTest, OpensWithoutDescriptorsForTheSwitch) {
  if (kObjectsNeedDescriptors) GTEST_SKIP() << "the sanitizer needs the descriptors";
  {
    const QVDescriptorLimit oneMore(1);
    open();
  }
  ASSERT_NE(reporter_, nullptr);
  const auto session = openSession(7);
  const auto service = accept();
  switchReporting(false);
  EXPECT_THAT(serve(*service, 2), ElementsAre("create 7", "type 7 2"));
  // Read again at the connection.
  EXPECT_EQ(reporter_->flush(kPatience), Code::none);
  EXPECT_FALSE(reporter_->isReportingEnabled());
}

TEST_F(QVReporterTest, RefusesOptionsBeyondTheirLimits) {
  const auto codeOf = [this](const std::function<void(QVReporterOptions&)>& change) {
    QVReporterOptions given = options();
    change(given);
    return QVReporter::open(std::move(given)).error().code();
  };
  using Options = QVReporterOptions;
  using std::chrono::milliseconds;
  EXPECT_EQ(codeOf([](Options&) {}), Code::none);
  EXPECT_EQ(codeOf([](Options& o) { o.maximumQueuedBytes = 0; }), Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.maximumQueuedMessages = 0; }), Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.maximumQueuedBytes = SIZE_MAX; }), Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.shortestReconnectDelay = milliseconds(0); }),
            Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.longestReconnectDelay = milliseconds(0); }),
            Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.realtimePeriod = milliseconds(0); }), Code::invalidArgument);
  EXPECT_EQ(codeOf([](Options& o) { o.endTimeLimit = milliseconds(-1); }), Code::invalidArgument);
}

}  // namespace
