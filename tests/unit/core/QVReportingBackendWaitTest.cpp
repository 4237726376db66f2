// A session whose framework session has to wait for its backends, in virtual time.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"

#include <chrono>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using Backends = QVFakeBeacon::Backends;

const std::string kWaiting = waitLine(standard, "waiting for beacond to find backends");
const std::string kContinuing = waitLine(standard, "continuing");
const std::string kFailed = waitLine(error, "failed to find backend");
const std::string kFound = sessionLine(standard, "start", R"(List of backends ["backend"])");
const std::string kNotFound =
    sessionLine(error, "start", "No backends found, this session won't get sent to the server");
const std::string kNoSession =
    sessionLine(error, "sendMessage:category:type:sync:reply:", "No valid BeaconSession");

class QVReportingBackendWaitTest : public QVServiceFixture {
 protected:
  // A started session whose set-up has not begun.
  std::shared_ptr<QVReportingSession> makeStartingSession(Backends backends) {
    platform_.beacon().setBackends(backends);
    auto session = QVReportingSession::initWithID(7, {42});
    session->setServiceType(1);
    session->start();
    journal_.forget();
    return session;
  }
  static void send(QVReportingSession& session, int number) {
    session.sendMessage({{"n", number}}, kSessionPlayback, kStart, {});
  }
};

TEST_F(QVReportingBackendWaitTest, WaitsUntilBackendsAreFound) {
  const auto session = makeStartingSession(Backends::whenTold);
  platform_.queues().after(4s, [this] { platform_.beacon().answerBackends(); });
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kWaiting, kFound, kContinuing));
  EXPECT_EQ(platform_.clock().steadyTime(), 4s);
  send(*session, 1);
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre("session 1", "configuration 1", R"(message 1: 3/1 {"n":1})"));
  EXPECT_FALSE(session->beaconSessionStarted());
}

TEST_F(QVReportingBackendWaitTest, GivesUpWhenNobodyAnswers) {
  const auto session = makeStartingSession(Backends::never);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kWaiting, kFailed));
  EXPECT_EQ(platform_.clock().steadyTime(), 9s);
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1", "end 1"));
  EXPECT_TRUE(session->started());
  EXPECT_FALSE(session->beaconSessionStarted());
}

TEST_F(QVReportingBackendWaitTest, GivesUpAfterTheWaitWhenThereIsNoList) {
  const auto session = makeStartingSession(Backends::noList);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kNotFound, kWaiting, kFailed));
  EXPECT_EQ(platform_.clock().steadyTime(), 9s) << "no signal comes with the missing list";
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1", "end 1"));
}

TEST_F(QVReportingBackendWaitTest, TakesAnEmptyListForBackends) {
  const auto session = makeStartingSession(Backends::whenTold);
  platform_.queues().after(1s, [this] { platform_.beacon().answerBackends(QVArray()); });
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(kWaiting, sessionLine(standard, "start", "List of backends []"), kContinuing));
}

TEST_F(QVReportingBackendWaitTest, GivesUpAtTheDeadlineWhenTheListIsRefusedMeanwhile) {
  const auto session = makeStartingSession(Backends::whenTold);
  platform_.queues().after(3s, [this] { platform_.beacon().answerBackends(std::nullopt); });
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kWaiting, kNotFound, kFailed));
  EXPECT_EQ(platform_.clock().steadyTime(), 9s);
}

TEST_F(QVReportingBackendWaitTest, TakesNoNoticeOfBackendsThatAreFoundAfterTheWait) {
  const auto session = makeStartingSession(Backends::whenTold);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kWaiting, kFailed));
  platform_.beacon().answerBackends();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kFound)) << "written, but nobody waits any more";
  send(*session, 1);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), kNoSession));
}

TEST_F(QVReportingBackendWaitTest, DropsAndRecordsMessagesWithoutBackends) {
  const auto session = makeStartingSession(Backends::never);
  send(*session, 1);
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceMessageSent), kWaiting, kFailed, kNoSession));
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 1u);
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent), kNoSession));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1", "end 1"))
      << "nothing to flush";
}

TEST_F(QVReportingBackendWaitTest, TriesAgainAtTheNextStart) {
  const auto session = makeStartingSession(Backends::never);
  runUntilIdle();
  platform_.beacon().setBackends(Backends::atOnce);
  session->stop();
  session->start();
  send(*session, 1);
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1", "end 1", "session 2",
                                             "configuration 2", R"(message 2: 3/1 {"n":1})"));
}

TEST_F(QVReportingBackendWaitTest, HoldsMessagesBackInTheirOrderWhileItWaits) {
  const auto session = makeStartingSession(Backends::whenTold);
  send(*session, 1);
  platform_.queues().after(2s, [&] { send(*session, 2); });
  platform_.queues().after(
      3s, [&] { EXPECT_THAT(platform_.beacon().count(QVFakeBeaconEvent::Kind::message), 0u); });
  platform_.queues().after(5s, [this] { platform_.beacon().answerBackends(); });
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre("session 1", "configuration 1", R"(message 1: 3/1 {"n":1})",
                          R"(message 1: 3/1 {"n":2})"));
}

TEST_F(QVReportingBackendWaitTest, FlushesAfterTheWaitWhenItIsStoppedMeanwhile) {
  const auto session = makeStartingSession(Backends::whenTold);
  platform_.queues().after(2s, [&] {
    session->stop();
    EXPECT_FALSE(session->started()) << "stop does not wait";
  });
  platform_.queues().after(5s, [this] { platform_.beacon().answerBackends(); });
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1", "flush 1", "end 1"));
}

TEST_F(QVReportingBackendWaitTest, KeepsItselfAliveUntilTheWaitIsOver) {
  auto session = makeStartingSession(Backends::never);
  const std::weak_ptr<QVReportingSession> weak = session;
  session.reset();
  EXPECT_FALSE(weak.expired());
  runUntilIdle();
  EXPECT_TRUE(weak.expired());
  EXPECT_EQ(platform_.beacon().liveSessions(), 0);
  EXPECT_EQ(platform_.beacon().liveTokens(), 0);
}

TEST_F(QVReportingBackendWaitTest, EndsAtOnceWhenTheServiceEnds) {
  const auto session = makeStartingSession(Backends::never);
  platform_.queues().after(1s, [this] { platform_.conditions().cutWaitsShort(); });
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(kWaiting, kFailed));
  EXPECT_EQ(platform_.clock().steadyTime(), 1s);
}

TEST_F(QVReportingBackendWaitTest, HoldsUpNobodyElse) {
  platform_.beacon().setBackends(Backends::whenTold);
  QVTestClient& waiting = clientWithSession(42, 7);
  QVTestClient& other = clientWithSession(43, 8, 3);
  waiting.start(7);
  waiting.send({{"n", 1}}, {7});
  // While session 7 waits, another client goes through a whole life.
  platform_.queues().after(1s, [&] {
    platform_.beacon().setBackends(Backends::atOnce);
    other.start(8);
    other.send({{"n", 2}}, {8});
    other.stop(8);
  });
  std::vector<std::string> meanwhile;
  platform_.queues().after(2s, [&] { meanwhile = takeBeaconStory(); });
  runUntilIdle();
  EXPECT_THAT(meanwhile,
              ElementsAre("session 1", "configuration 1", "session 2", "configuration 2",
                          R"(message 2: 3/1 {"n":2})",
                          R"(message 2: 65535/65535 {"QV_Session_Summary_Event":"3","n":"2"})",
                          "flush 2", "end 2"));
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil", "reply 43 send: nil",
                                     "reply 43 start 8: YES", "reply 43 stop 8: YES"));
  EXPECT_THAT(takeJournal(), Contains(kNoSession)) << "session 7 never found any";
}

TEST_F(QVReportingBackendWaitTest, LetsTwoHundredSessionsWaitWithoutHoldingUpAMessage) {
  platform_.beacon().setBackends(Backends::never);
  constexpr int64_t kWaitingSessions = 200;
  QVTestClient& client = connectClient(42);
  QVTestClient& other = clientWithSession(43, 1000, 3);
  for (int64_t reporterID = 1; reporterID <= kWaitingSessions; ++reporterID) {
    client.create(reporterID);
    client.start(reporterID);
  }
  platform_.queues().after(1s, [&] { other.send({{"n", 1}}, {1000}); });
  QVDuration sentAt{};
  std::size_t waitingThen = 0;
  platform_.queues().after(1s, [&] {
    // Looks once all work of that moment has run.
    platform_.queues().after(1ns, [&] {
      if (platform_.beacon().count(QVFakeBeaconEvent::Kind::singleMessage) == 1) {
        sentAt = platform_.clock().steadyTime();
        waitingThen = platform_.beacon().count(QVFakeBeaconEvent::Kind::configuration);
      }
    });
  });
  runUntilIdle();
  EXPECT_EQ(sentAt, 1s + 1ns);
  EXPECT_EQ(waitingThen, std::size_t{kWaitingSessions});
}

}  // namespace
