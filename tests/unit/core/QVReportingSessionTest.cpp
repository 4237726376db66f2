// A session by itself: what it is made of, how it starts and stops.

#include "QVServices/Statistics/QVReportingUserInfoAccount.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "platform/fake/QVFakeMemoryCharge.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <chrono>
#include <numeric>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::Pair;
using testing::SizeIs;
using Kind = QVFakeBeaconEvent::Kind;

constexpr uint16_t kTest = 11;

const std::string kNotAllowed = sessionLine(
    info, "sendMessage:category:type:sync:reply:", "transactions aren't allowed on this platform");

class QVReportingSessionTest : public QVServiceFixture {
 protected:
  std::shared_ptr<QVReportingSession> makeSession(int64_t reporterID = 7,
                                                  uint16_t serviceType = 65535) {
    auto session = QVReportingSession::initWithID(reporterID, {42});
    if (serviceType != 65535) session->setServiceType(serviceType);
    journal_.forget();
    return session;
  }
  std::shared_ptr<QVReportingSession> makeStartedSession(uint16_t serviceType = 1) {
    auto session = makeSession(7, serviceType);
    session->start();
    runUntilIdle();
    journal_.forget();
    takeBeaconStory();
    return session;
  }
  static void send(QVReportingSession& session, const QVDictionary& message) {
    session.sendMessage(message, kSessionPlayback, kStart, {});
  }
};

TEST_F(QVReportingSessionTest, TakesNoMoreUserInformationThanItsLimit) {
  const auto session = makeSession();
  session->setConfiguration({{"a", 1}, {"text", std::string(40'000, 'x')}});
  EXPECT_THAT(takeJournal(), IsEmpty());
  session->setConfiguration({{"a", 2}, {"more", std::string(40'000, 'x')}});
  session->updateDefaults({{"all at once", std::string(70'000, 'x')}});
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(sessionLine(error, "setConfiguration:",
                              "user information of 7 would be larger than 65536 bytes, nothing "
                              "added"),
                  sessionLine(error, "updateDefaults:",
                              "user information of 7 would be larger than 65536 bytes, nothing "
                              "added")));
  EXPECT_EQ(*session->userInfo().find("a"), QVValue(1));
  EXPECT_EQ(session->userInfo().size(), 2U);
}

TEST_F(QVReportingSessionTest, TakesNoUserInformationWhereAllSessionsHaveTooMuch) {
  const auto session = makeSession();
  QVReportingUserInfoAccount& account = QVReportingUserInfoAccount::shared();
  account.add(QVReportingUserInfoAccount::kMaximumBytes);
  session->setConfiguration({{"a", 1}});
  session->updateDefaults({{"device_name", "kitchen"}});
  account.remove(QVReportingUserInfoAccount::kMaximumBytes);
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(error, "setConfiguration:",
                                      "user information of all sessions would be larger than "
                                      "268435456 bytes, nothing added for 7")));
  EXPECT_EQ(session->userInfo(), (QVDictionary{{"device_name", "kitchen"}}));
  session->setConfiguration({{"a", 1}});
  EXPECT_EQ(session->userInfo(), (QVDictionary{{"a", 1}, {"device_name", "kitchen"}}));
}

// A client is not read while too much of what it sent is on its way; what stays is not.
TEST_F(QVReportingSessionTest, KeepsNothingOfAConfigurationThatIsCharged) {
  const auto session = makeSession();
  QVFakeMemoryCharge charge;
  std::vector<QVDictionaryEntry> entries{
      {"text", "value"}, {"array", QVArray{"a", 1}}, {"nested", QVDictionary{{"a", "b"}}}};
  QVDictionary configuration = QVDictionary::assemble(entries, &charge);
  entries.clear();
  session->setConfiguration(configuration);
  EXPECT_EQ(session->userInfo(), configuration);
  configuration = {};
  EXPECT_EQ(charge.held(), 0U);
}

// ---- creation and properties

TEST_F(QVReportingSessionTest, IsCreatedWithItsLineAndMark) {
  const auto session = QVReportingSession::initWithID(-7, {42, 43});
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(info, "initWithID:processIdentifiers:",
                                                     "created reporting session for ID: -7"),
                                         traceEntry(kTraceSessionCreated)));
  EXPECT_EQ(session->reporterID(), -7);
  EXPECT_THAT(session->processIdentifiers(), ElementsAre(42, 43));
  EXPECT_FALSE(session->started());
  EXPECT_FALSE(session->beaconSessionStarted());
  EXPECT_EQ(session->serviceType(), 65535);
  EXPECT_EQ(session->serviceName(), "unknown");
  EXPECT_TRUE(session->userInfo().empty());
  EXPECT_EQ(session->driverSnapShot(), nullptr);
  EXPECT_FALSE(session->transactionCompleteBlock());
  EXPECT_THAT(session->messageTypeCounts(), IsEmpty());
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
  EXPECT_EQ(session->startDate(), std::nullopt);
  ASSERT_NE(session->aggregatedPayloadData(), nullptr);
  ASSERT_NE(session->nestedAggregatedPayloadData(), nullptr);
  EXPECT_TRUE(session->aggregatedPayloadData()->empty());
  EXPECT_TRUE(session->nestedAggregatedPayloadData()->empty());
}

TEST_F(QVReportingSessionTest, RegistersTheSessionScopeOnce) {
  const auto first = makeSession(1);
  const auto second = makeSession(2);
  EXPECT_THAT(platform_.log().registrations(),
              ElementsAre(QVFakeLog::Registration{true, 0x71767272, "qvrr", "net.quillon.quietvox",
                                                  "reporting_session_verbose", 31}));
}

TEST_F(QVReportingSessionTest, MakesAQueueOfItsOwn) {
  const auto first = makeSession(1);
  const auto second = makeSession(2);
  const auto queues = platform_.queues().queues();
  ASSERT_THAT(queues, SizeIs(2));
  for (const auto& queue : queues) {
    EXPECT_EQ(queue.label, "net.quillon.quietvox.session.beacon");
    EXPECT_EQ(queue.quality, QVQualityOfService::utility);
    EXPECT_EQ(queue.relativePriority, 0);
  }
}

TEST_F(QVReportingSessionTest, WritesAndMarksItsDestruction) {
  auto session = makeSession(-7);
  session.reset();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(info, "dealloc", "deallocing this session -7"),
                                         traceEntry(kTraceSessionDestroyed)));
}

TEST_F(QVReportingSessionTest, TakesTheNameOfItsServiceType) {
  const auto session = makeSession();
  session->setServiceType(2);
  EXPECT_EQ(session->serviceName(), "telephony");
  session->setServiceType(65535);
  EXPECT_EQ(session->serviceName(), "unknown");
  session->setServiceType(13);
  EXPECT_EQ(session->serviceType(), 13);
  EXPECT_EQ(session->serviceName(), std::nullopt);
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type telephony"),
                          sessionLine(info, "setServiceType:", "setting service type unknown"),
                          sessionLine(info, "setServiceType:", "setting service type (null)")));
}

TEST_F(QVReportingSessionTest, MergesConfigurationsAndDefaultsSilently) {
  const auto session = makeSession();
  session->setConfiguration({{"a", 1}, {"b", 1}});
  session->updateDefaults({{"b", 2}, {"device_name", "Kitchen"}});
  session->setConfiguration({{"device_name", "Hall"}});
  session->setConfiguration({});
  session->setConfiguration(QVDictionary());
  session->updateDefaults(QVDictionary());
  EXPECT_EQ(session->userInfo(), (QVDictionary{{"a", 1}, {"b", 2}, {"device_name", "Hall"}}));
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingSessionTest, IsDescribedByItsID) {
  EXPECT_EQ(makeSession(-7)->description(), "<QVReportingSession -7>");
}

// ---- start

TEST_F(QVReportingSessionTest, SetsItsFrameworkSessionUpOnItsQueue) {
  const auto session = makeSession(7, 2);
  session->start();
  EXPECT_TRUE(session->started());
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceSessionStarted)));
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "start returns at once";
  EXPECT_EQ(platform_.queues().runUntilIdle(kSessionQueue), 1u);
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(standard, "start", R"(List of backends ["backend"])")))
      << "found before the wait: no line about waiting";
  const auto made = latestBeaconEvent(Kind::session);
  EXPECT_EQ(made.sessionInfo, (QVDictionary{{"kBeaconSessionInfoClientType", 19},
                                            {"kBeaconSessionInfoClientVersion", 2.0},
                                            {"kBeaconSessionInfoSessionID", 7},
                                            {"kBeaconSessionInfoBatchEvent", true},
                                            {"kBeaconSessionInfoHierarchyToken", "token 1"},
                                            {"kBeaconSessionInfoContainsRealtimeEvents", false}}));
  EXPECT_EQ(made.userInfo, (QVDictionary{{"kBeaconUserInfoClientName", "net.quillon.quietvox"},
                                         {"kBeaconUserInfoServiceName", "telephony_session"}}));
  EXPECT_TRUE(made.frameworksToCheck.empty());
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 1", "configuration 1"));
  EXPECT_FALSE(session->beaconSessionStarted()) << "a success is not stored";
}

TEST_F(QVReportingSessionTest, ReportsInRealTimeForTheUseOfInterfacesOnly) {
  std::vector<uint16_t> types(14);
  std::iota(types.begin(), types.end(), uint16_t{0});
  std::erase(types, kTest);  // is given no framework session
  types.push_back(65535);
  for (const uint16_t type : types) {
    makeSession(type, type)->start();
    runUntilIdle();
  }
  const auto made = platform_.beacon().events(Kind::session);
  ASSERT_THAT(made, SizeIs(types.size()));
  for (std::size_t i = 0; i < types.size(); ++i) {
    const bool realtime = types[i] == 12;
    EXPECT_EQ(*made[i].sessionInfo.find("kBeaconSessionInfoBatchEvent"), QVValue(!realtime))
        << types[i];
    EXPECT_EQ(*made[i].sessionInfo.find("kBeaconSessionInfoContainsRealtimeEvents"),
              QVValue(realtime))
        << types[i];
  }
}

TEST_F(QVReportingSessionTest, NamesAServiceWithoutANameNull) {
  const auto session = makeSession(7, 13);
  session->start();
  runUntilIdle();
  EXPECT_EQ(*latestBeaconEvent(Kind::session).userInfo.find("kBeaconUserInfoServiceName"),
            QVValue("(null)_session"));
}

TEST_F(QVReportingSessionTest, NamesTheServiceUnknownUntilItIsSet) {
  const auto session = makeSession();
  session->start();
  runUntilIdle();
  EXPECT_EQ(*latestBeaconEvent(Kind::session).userInfo.find("kBeaconUserInfoServiceName"),
            QVValue("unknown_session"));
}

TEST_F(QVReportingSessionTest, LetsTheConfigurationReplaceTheFrameworksNames) {
  const auto userInfoWith = [this](const QVDictionary& configuration) {
    const auto session = makeSession(7, 1);
    session->setConfiguration(configuration);
    session->start();
    runUntilIdle();
    return latestBeaconEvent(Kind::session).userInfo;
  };
  EXPECT_EQ(userInfoWith({{"kBeaconUserInfoClientName", "mine"}, {"rate", 48000}}),
            (QVDictionary{{"kBeaconUserInfoClientName", "mine"},
                          {"kBeaconUserInfoServiceName", "voxa_session"},
                          {"rate", 48000}}));
  EXPECT_EQ(userInfoWith({{"kBeaconUserInfoServiceName", "my service"}, {"rate", 48000}}),
            (QVDictionary{{"kBeaconUserInfoClientName", "net.quillon.quietvox"},
                          {"kBeaconUserInfoServiceName", "my service"},
                          {"rate", 48000}}));
  const QVDictionary both{{"kBeaconUserInfoClientName", "mine"},
                          {"kBeaconUserInfoServiceName", "my service"}};
  EXPECT_EQ(userInfoWith(both), both);
}

TEST_F(QVReportingSessionTest, TakesNameAndTypeAtTheStartAndTheUserInformationAtTheSetUp) {
  const auto session = makeSession(7, 12);
  session->start();
  session->setServiceType(2);
  session->setConfiguration({{"late", "but in time"}});
  runUntilIdle();
  session->setConfiguration({{"later", "too late"}});
  const auto made = latestBeaconEvent(Kind::session);
  EXPECT_EQ(*made.userInfo.find("kBeaconUserInfoServiceName"), QVValue("apiusage_session"));
  EXPECT_EQ(*made.sessionInfo.find("kBeaconSessionInfoBatchEvent"), QVValue(false));
  EXPECT_EQ(*made.userInfo.find("late"), QVValue("but in time"));
  EXPECT_FALSE(made.userInfo.contains("later"));
  EXPECT_TRUE(session->userInfo().contains("later"));
}

TEST_F(QVReportingSessionTest, RefusesASecondStart) {
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  const auto aggregated = session->aggregatedPayloadData();
  const auto nested = session->nestedAggregatedPayloadData();
  journal_.forget();
  session->start();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(info, "start", "7 is already started")));
  EXPECT_EQ(session->aggregatedPayloadData(), aggregated);
  EXPECT_EQ(session->nestedAggregatedPayloadData(), nested);
  EXPECT_THAT(entriesOf(*aggregated), ElementsAre(Pair("", QVDictionary{{"a", 1}})));
  EXPECT_THAT(entriesOf(*nested),
              ElementsAre(Pair("Session_Playback_Start_1", QVDictionary{{"a", 1}})));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
}

TEST_F(QVReportingSessionTest, WritesItsStartOnlyWhenVerbose) {
  makeSessionsVerbose();
  const auto session = makeSession(7, kTest);
  session->start();
  session->start();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "start", "starting session owned by 7"),
                                         traceEntry(kTraceSessionStarted),
                                         sessionLine(debug, "start", "starting session owned by 7"),
                                         sessionLine(info, "start", "7 is already started")));
}

TEST_F(QVReportingSessionTest, ThrowsAwayWhatWasCollectedBeforeTheStart) {
  const auto session = makeSession(7, 1);
  send(*session, {{"early", 1}});
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 1u);
  EXPECT_EQ(session->nestedAggregatedPayloadData()->size(), 1u);
  session->start();
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 0u);
  EXPECT_EQ(session->nestedAggregatedPayloadData()->size(), 0u);
  EXPECT_THAT(session->messageTypeCounts(), ElementsAre(Pair("Session_Playback_Start", 1)))
      << "but it was counted";
  send(*session, {{"late", 2}});
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              Contains(R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1","late":"2"})"));
}

// ---- stop

TEST_F(QVReportingSessionTest, StopsWithASummaryAndAFlush) {
  const auto session = makeStartedSession(2);
  send(*session, {{"a", 1}});
  journal_.forget();
  session->stop();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent)));
  EXPECT_FALSE(session->started());
  EXPECT_EQ(session->aggregatedPayloadData(), nullptr);
  EXPECT_EQ(session->nestedAggregatedPayloadData(), nullptr);
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "stop returns at once";
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 3/1 {"a":1})",
                          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"2","a":"1"})",
                          "flush 1", "end 1"));
}

TEST_F(QVReportingSessionTest, SendsNoSummaryOfASessionWithoutMessages) {
  const auto session = makeStartedSession();
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceSessionStopped)));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("flush 1", "end 1"));
}

TEST_F(QVReportingSessionTest, WritesItsEndTwiceWhenStartedAndOnceWhenStoppedBefore) {
  makeSessionsVerbose();
  const auto session = makeStartedSession();
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "stop", "ending session 7"),
                                         sessionLine(debug, "stop", "ending session 7"),
                                         traceEntry(kTraceSessionStopped)));
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "stop", "ending session 7")));
}

TEST_F(QVReportingSessionTest, WritesItsEndOnceAndChangesNothingWhenItWasNeverStarted) {
  makeSessionsVerbose();
  const auto session = makeSession();
  send(*session, {{"a", 1}});
  runUntilIdle();
  journal_.forget();
  takeBeaconStory();
  const auto aggregated = session->aggregatedPayloadData();
  const auto nested = session->nestedAggregatedPayloadData();
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "stop", "ending session 7")));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_EQ(session->aggregatedPayloadData(), aggregated);
  EXPECT_EQ(session->nestedAggregatedPayloadData(), nested);
  EXPECT_THAT(entriesOf(*aggregated), ElementsAre(Pair("", QVDictionary{{"a", 1}})));
  EXPECT_THAT(entriesOf(*nested),
              ElementsAre(Pair("Session_Playback_Start_1", QVDictionary{{"a", 1}})));
}

TEST_F(QVReportingSessionTest, WritesAFlushThatFailed) {
  const auto session = makeStartedSession();
  platform_.beacon().setFlushError(QVError{"disk", 28, {{"failureReason", "No space left"}}});
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceSessionStopped),
                                         sessionLine(error, "stop", "flush error No space left")));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("failed flush 1", "end 1")) << "dropped all the same";
}

TEST_F(QVReportingSessionTest, FlushesAfterEverythingThatWasQueuedBefore) {
  const auto session = makeStartedSession();
  for (int i = 0; i < 3; ++i) send(*session, {{"n", i}});
  session->stop();
  send(*session, {{"n", 4}});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 3/1 {"n":0})", R"(message 1: 3/1 {"n":1})",
                          R"(message 1: 3/1 {"n":2})",
                          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1","n":"0,1,2"})",
                          "flush 1", "end 1", R"(single: 3/1 {"n":4})"));
}

TEST_F(QVReportingSessionTest, StartsAgainWithNewArraysAndANewFrameworkSession) {
  const auto session = makeStartedSession();
  session->setConfiguration({{"kept", true}});
  send(*session, {{"a", 1}});
  session->stop();
  session->start();
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 0u);
  send(*session, {{"b", 2}});
  session->stop();
  runUntilIdle();
  EXPECT_THAT(
      takeBeaconStory(),
      ElementsAre(R"(message 1: 3/1 {"a":1})",
                  R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1","a":"1"})", "flush 1",
                  "end 1", "session 2", "configuration 2", R"(message 2: 3/1 {"b":2})",
                  R"(message 2: 65535/65535 {"QV_Session_Summary_Event":"1","b":"2"})", "flush 2",
                  "end 2"));
  EXPECT_THAT(session->messageTypeCounts(),
              ElementsAre(Pair("Session_Playback_Start", 2), Pair("Undefined_Unknown", 2)));
  EXPECT_TRUE(session->userInfo().contains("kept"));
}

TEST_F(QVReportingSessionTest, NeitherStopsNorSummarisesWhenItIsDropped) {
  auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  session.reset();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})", "end 1"));
  EXPECT_THAT(takeJournal(),
              Not(Contains(sessionLine(standard, "stop", "sending summary event for reporter 7"))));
}

// ---- test sessions

TEST_F(QVReportingSessionTest, GivesATestSessionNoFrameworkSessionAndWaitsForNothing) {
  platform_.beacon().setBackends(QVFakeBeacon::Backends::never);
  const auto session = makeSession(7, kTest);
  session->start();
  runUntilIdle();
  EXPECT_EQ(platform_.clock().steadyTime(), 0s);
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceSessionStarted)))
      << "neither a line about waiting nor one about backends";
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_EQ(platform_.beacon().liveTokens(), 0);
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceSessionStopped)));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
}

TEST_F(QVReportingSessionTest, DropsEveryMessageOfATestSessionButCountsAndRecordsIt) {
  const auto session = makeStartedSession(kTest);
  const auto aggregated = session->aggregatedPayloadData();
  const auto nested = session->nestedAggregatedPayloadData();
  send(*session, {{"a b", 1}});
  session->sendMessage({{"frames", 480}}, 9, 0, {});
  send(*session, {});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceMessageSent), traceEntry(kTraceMessageSent),
                          traceEntry(kTraceMessageSent), kNotAllowed, kNotAllowed, kNotAllowed));
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent), kNotAllowed));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_THAT(session->messageTypeCounts(),
              ElementsAre(Pair("Session_Playback_Start", 2), Pair("Tallying_Generic", 1),
                          Pair("Undefined_Unknown", 1)));
  const QVDictionary summary{{"QV_Session_Summary_Event", "11"}, {"a_b", "1"}, {"frames", "480"}};
  EXPECT_THAT(entriesOf(*aggregated), ElementsAre(Pair("", QVDictionary{{"a_b", 1}}),
                                                  Pair("", QVDictionary{{"frames", 480}}),
                                                  Pair("", QVDictionary{}), Pair("", summary)));
  EXPECT_THAT(entriesOf(*nested),
              ElementsAre(Pair("Session_Playback_Start_1", QVDictionary{{"a_b", 1}}),
                          Pair("Tallying_Generic_1", QVDictionary{{"frames", 480}}),
                          Pair("Session_Playback_Start_2", QVDictionary{}),
                          Pair("Undefined_Unknown_1", summary)));
}

TEST_F(QVReportingSessionTest, GoesByTheTypeOfTheMomentForSends) {
  const auto session = makeStartedSession(1);
  session->setServiceType(kTest);
  send(*session, {{"dropped", 1}});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type test"),
                          traceEntry(kTraceMessageSent), kNotAllowed));
  session->setServiceType(1);
  send(*session, {{"sent", 2}});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type voxa"),
                          traceEntry(kTraceMessageSent)));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"sent":2})"));
}

TEST_F(QVReportingSessionTest, GoesByTheTypeOfTheMomentForTheFlush) {
  const auto session = makeStartedSession(1);
  session->setServiceType(kTest);
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type test"),
                          traceEntry(kTraceSessionStopped)));
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "there is a framework session, it is not flushed";
  session->setServiceType(1);
  session->start();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre("session 2", "end 1", "configuration 2"))
      << "the first framework session lasts until the next takes its place";
}

TEST_F(QVReportingSessionTest, GoesByTheTypeOfTheStartForTheSetUp) {
  const auto session = makeSession(7, kTest);
  session->start();
  session->setServiceType(1);
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  journal_.forget();
  send(*session, {{"a", 1}});
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent),
                                         sessionLine(error, "sendMessage:category:type:sync:reply:",
                                                     "No valid BeaconSession")));
}

}  // namespace
