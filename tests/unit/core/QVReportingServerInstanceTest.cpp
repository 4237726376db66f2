// A client's connection object by itself: its sessions, their lookup, and the connection's end.

#include "QVServices/Statistics/Service/QVReportingServerInstance.h"
#include "tests/support/QVServiceFixture.h"

namespace {

using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;

std::string removalLine(int32_t pid) {
  return clientLine(standard, "handleConnectionError",
                    QVText("removing ", pid, " from the server client list"));
}
std::string destructionLine(int32_t pid) {
  return clientLine(standard, "dealloc", QVText("dealloc ", pid, " from the server client list"));
}

class QVReportingServerInstanceTest : public QVServiceFixture {};

TEST_F(QVReportingServerInstanceTest, StartsWithItsProcessAndNothingElse) {
  service();
  const auto instance = QVReportingServerInstance::initWithPID(42, service_);
  EXPECT_EQ(instance->processIdentifier(), 42);
  EXPECT_EQ(instance->clientStartDate(), std::nullopt);
  EXPECT_EQ(instance->clientProcessName(), std::nullopt);
  EXPECT_THAT(instance->clientReportingSessionMap(), IsEmpty());
  EXPECT_THAT(takeJournal(),
              ElementsAre(clientLine(standard, "initWithPID:delegate:", "new client with pid 42")));
}

TEST_F(QVReportingServerInstanceTest, TellsOfAProcessBelowZeroAsAnUnsignedNumber) {
  service();
  const auto instance = QVReportingServerInstance::initWithPID(-1, service_);
  EXPECT_THAT(takeJournal(), ElementsAre(clientLine(standard, "initWithPID:delegate:",
                                                    "new client with pid 18446744073709551615")));
}

TEST_F(QVReportingServerInstanceTest, HoldsTheDelegateWeakly) {
  service();
  const auto instance = QVReportingServerInstance::initWithPID(42, service_);
  EXPECT_EQ(service_.use_count(), 1);
  endService();
  EXPECT_EQ(instance->findReportingSessionForID(7, true), nullptr);
}

TEST_F(QVReportingServerInstanceTest, PrefersItsOwnSession) {
  QVTestClient& first = clientWithSession(42, 7);
  QVTestClient& second = clientWithSession(43, 7);
  EXPECT_NE(first.session(7), second.session(7));
  EXPECT_EQ(second.instance()->findReportingSessionForID(7, true), second.session(7));
  EXPECT_THAT(takeJournal(), IsEmpty()) << "no look through all clients";
}

TEST_F(QVReportingServerInstanceTest, FindsAnotherClientsSessionOnlyAcrossAllClients) {
  QVTestClient& first = clientWithSession(42, 7);
  QVTestClient& second = registeredClient(43);
  EXPECT_EQ(second.instance()->findReportingSessionForID(7, false), nullptr);
  EXPECT_THAT(takeJournal(), IsEmpty());
  EXPECT_EQ(second.instance()->findReportingSessionForID(7, true), first.session(7));
  EXPECT_THAT(takeJournal(), ElementsAre(lookupHit(7, 42)));
}

TEST_F(QVReportingServerInstanceTest, FindsItsOwnSessionZero) {
  QVTestClient& client = connectClient(42);
  QVTestClient& other = connectClient(43);
  client.create(0);
  runUntilIdle();
  takeJournal();
  EXPECT_NE(client.instance()->findReportingSessionForID(0, true), nullptr);
  EXPECT_EQ(other.instance()->findReportingSessionForID(0, true), nullptr);
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingServerInstanceTest, FindsItsOwnSessionsWhileReportingIsSwitchedOff) {
  QVTestClient& client = clientWithSession(42, 7);
  QVTestClient& other = clientWithSession(43, 8);
  switchReporting(false);
  EXPECT_EQ(client.instance()->findReportingSessionForID(7, true), client.session(7));
  EXPECT_EQ(client.instance()->findReportingSessionForID(8, true), nullptr);
  EXPECT_NE(other.session(8), nullptr);
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingServerInstanceTest, StopsTheStartedSessionsOfABrokenConnection) {
  makeSessionsVerbose();
  QVTestClient& client = clientWithSession(42, 9);
  for (const int64_t reporterID : {3, -5}) client.create(reporterID);
  client.start(9);
  client.start(-5);
  runUntilIdle();
  takeJournal();
  client.interrupt();
  takeJournal();
  runServerQueue();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "stop", "ending session -5"),
                                         sessionLine(debug, "stop", "ending session -5"),
                                         traceEntry(kTraceSessionStopped),
                                         sessionLine(debug, "stop", "ending session 9"),
                                         sessionLine(debug, "stop", "ending session 9"),
                                         traceEntry(kTraceSessionStopped), removalLine(42)))
      << "in ascending order; the third was never started";
  EXPECT_FALSE(client.session(9)->started());
  EXPECT_EQ(client.instance()->clientReportingSessionMap().size(), 3u) << "they stay in the map";
}

TEST_F(QVReportingServerInstanceTest, AnswersNoStartWhenTheConnectionBreaks) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.interrupt();
  runUntilIdle();
  EXPECT_FALSE(client.session(7)->started());
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(replies(), IsEmpty());
}

TEST_F(QVReportingServerInstanceTest, FetchesNoDriverStatisticsWhenTheConnectionBreaks) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.interrupt();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              Not(Contains(clientLine(standard, "stopReportingSessionForID:reply:",
                                      "nothing interesting to fetch from the drivers"))));
  EXPECT_NE(client.session(7)->driverSnapShot(), nullptr) << "still the one of the start";
}

TEST_F(QVReportingServerInstanceTest, HidesTheSessionsOfARemovedClientFromOthers) {
  QVTestClient& dead = clientWithStartedSession(42, 7);
  QVTestClient& other = registeredClient(43);
  dead.interrupt();
  runUntilIdle();
  takeJournal();
  EXPECT_NE(dead.session(7), nullptr);
  other.validate(7);
  other.listReporters();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(lookupFailure(7),
                          clientLine(standard, "reporterID:valid:", "validating reporter 7"),
                          R"(reply 43 validate 7: {"reporterID":0,"serviceType":65535})",
                          "reply 43 reporters:"));
}

TEST_F(QVReportingServerInstanceTest, LeavesAnUnlistedClientAlone) {
  service();
  const auto instance = QVReportingServerInstance::initWithPID(42, service_);
  takeJournal();
  instance->handleConnectionError();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingServerInstanceTest, LeavesARemovedClientAlone) {
  QVTestClient& client = clientWithSession(42, 7);
  client.interrupt();
  client.start(7);
  client.interrupt();
  runUntilIdle();
  EXPECT_TRUE(client.session(7)->started()) << "started after the removal: nobody stops it";
  EXPECT_THAT(takeJournal(), Contains(removalLine(42)).Times(1));
}

TEST_F(QVReportingServerInstanceTest, KeepsItselfAliveUntilTheRemovalHasRun) {
  QVTestClient& client = clientWithSession(42, 7);
  const std::weak_ptr<QVReportingServerInstance> instance = client.instance();
  client.disconnect();
  EXPECT_FALSE(instance.expired());
  runUntilIdle();
  EXPECT_TRUE(instance.expired());
}

TEST_F(QVReportingServerInstanceTest, WritesItsDestructionBeforeThatOfItsSessions) {
  QVTestClient& client = clientWithSession(42, 7);
  client.interrupt();
  runUntilIdle();
  takeJournal();
  client.connection().abandon();
  EXPECT_THAT(takeJournal(), ElementsAre(destructionLine(42),
                                         sessionLine(info, "dealloc", "deallocing this session 7"),
                                         traceEntry(kTraceSessionDestroyed)));
}

TEST_F(QVReportingServerInstanceTest, EndsTheProcessOnTheCallersThread) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.killService();
  EXPECT_THAT(takeJournal(),
              ElementsAre("log flushed", clientLine(standard, "killService:", "DESTROYING SERVICE"),
                          "log flushed"));
  EXPECT_THAT(platform_.process().exitStatuses(), ElementsAre(2));
  EXPECT_EQ(platform_.queues().pendingCount(), 0u) << "nothing is handed to the server queue";
  runUntilIdle();
  EXPECT_THAT(takeJournal(), IsEmpty()) << "nothing is stopped, nobody is answered";
  EXPECT_TRUE(client.session(7)->started());
}

TEST_F(QVReportingServerInstanceTest, HoldsTheMostSessionsAndMakesNoMore) {
  constexpr auto kMost = static_cast<int64_t>(QVReportingServerInstance::kMaximumSessions);
  static_assert(kMost == 65536);
  QVTestClient& client = connectClient(42);
  for (int64_t reporterID = 1; reporterID <= kMost; ++reporterID) client.create(reporterID);
  runUntilIdle();
  EXPECT_EQ(client.instance()->clientReportingSessionMap().size(), std::size_t{kMost});
  takeJournal();

  client.create(kMost + 1);
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceCreate),
                          clientLine(error, "createReportingSession:reply:",
                                     "client 42 has 65536 sessions, none created for reporter "
                                     "65537"),
                          "reply 42 create 65537: YES"));
  EXPECT_EQ(client.session(kMost + 1), nullptr);

  QVTestClient& sameProcess = connectClient(42);
  sameProcess.create(kMost + 1);
  runUntilIdle();
  EXPECT_NE(sameProcess.session(kMost + 1), nullptr) << "the limit is each connection's";

  const std::weak_ptr<QVReportingSession> replaced = client.session(1);
  client.create(1);
  runUntilIdle();
  EXPECT_TRUE(replaced.expired()) << "replacing one is not one more";
  EXPECT_EQ(client.instance()->clientReportingSessionMap().size(), std::size_t{kMost});

  client.destroy(1);
  client.create(kMost + 1);
  runUntilIdle();
  EXPECT_NE(client.session(kMost + 1), nullptr) << "there is room again";
}

}  // namespace
