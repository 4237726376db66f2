// The operations that create, configure, stop, destroy and query sessions, through the connection.

#include "tests/support/QVServiceFixture.h"

namespace {

using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;

constexpr std::string_view kCreate = "createReportingSession:reply:";
constexpr std::string_view kSetType = "setServiceType:reportingSession:reply:";
constexpr std::string_view kGetType = "getServiceNameForReporterID:reply:";
constexpr std::string_view kConfigure = "setConfiguration:forReporterID:reply:";
constexpr std::string_view kStartOperation = "startReportingSessionForID:reply:";
constexpr std::string_view kStop = "stopReportingSessionForID:reply:";
constexpr std::string_view kDestroy = "destroyReportingSession:reply:";
constexpr std::string_view kValid = "reporterID:valid:";

class QVReportingSessionControlTest : public QVServiceFixture {
 protected:
  std::vector<std::string> run() {
    runUntilIdle();
    return takeJournal();
  }
};

// ---- create

TEST_F(QVReportingSessionControlTest, CreatesASession) {
  QVTestClient& client = registeredClient(42);
  client.create(7);
  EXPECT_THAT(takeJournal(), IsEmpty()) << "all work is the server queue's";
  EXPECT_THAT(run(), ElementsAre(traceEntry(kTraceCreate),
                                 sessionLine(info, "initWithID:processIdentifiers:",
                                             "created reporting session for ID: 7"),
                                 traceEntry(kTraceSessionCreated),
                                 clientLine(standard, kCreate, "session created for reporter 7"),
                                 "reply 42 create 7: YES"));
  EXPECT_EQ(client.session(7)->reporterID(), 7);
  EXPECT_THAT(client.session(7)->processIdentifiers(), ElementsAre(42));
}

TEST_F(QVReportingSessionControlTest, CreatesSessionsOfAnyID) {
  QVTestClient& client = registeredClient(42);
  for (const int64_t reporterID : {int64_t{0}, int64_t{-1}, INT64_MIN, INT64_MAX}) {
    client.create(reporterID);
  }
  client.listReporters();
  runUntilIdle();
  EXPECT_EQ(replies().back(), "reply 42 reporters: -9223372036854775808 -1 0 9223372036854775807");
}

TEST_F(QVReportingSessionControlTest, ReplacesASessionWithoutStoppingIt) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  const std::weak_ptr<QVReportingSession> first = client.session(7);
  takeBeaconStory();
  client.create(7);
  EXPECT_THAT(run(), ElementsAre(traceEntry(kTraceCreate),
                                 sessionLine(info, "initWithID:processIdentifiers:",
                                             "created reporting session for ID: 7"),
                                 traceEntry(kTraceSessionCreated),
                                 sessionLine(info, "dealloc", "deallocing this session 7"),
                                 traceEntry(kTraceSessionDestroyed),
                                 clientLine(standard, kCreate, "session created for reporter 7"),
                                 "reply 42 create 7: YES"));
  EXPECT_TRUE(first.expired());
  EXPECT_FALSE(client.session(7)->started());
  EXPECT_THAT(takeBeaconStory(), ElementsAre("end 1")) << "no summary, no flush";
}

TEST_F(QVReportingSessionControlTest, CreatesASessionThatAnotherClientHasToo) {
  QVTestClient& first = clientWithSession(42, 7);
  QVTestClient& second = clientWithSession(43, 7);
  EXPECT_NE(first.session(7), nullptr);
  EXPECT_NE(first.session(7), second.session(7));
}

// ---- service type

TEST_F(QVReportingSessionControlTest, SetsTheServiceType) {
  QVTestClient& client = clientWithSession(42, 7);
  client.setServiceType(2, 7);
  EXPECT_THAT(takeJournal(), IsEmpty());
  EXPECT_THAT(run(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type telephony"),
                          clientLine(standard, kSetType, "service type 2 set for reporter  7"),
                          "reply 42 setServiceType 7: YES"));
  EXPECT_EQ(client.session(7)->serviceType(), 2);
}

TEST_F(QVReportingSessionControlTest, PrintsLargeServiceTypesUnsigned) {
  QVTestClient& client = clientWithSession(42, 7);
  client.setServiceType(65534, 7);
  EXPECT_THAT(run(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type (null)"),
                          clientLine(standard, kSetType, "service type 65534 set for reporter  7"),
                          "reply 42 setServiceType 7: YES"));
}

TEST_F(QVReportingSessionControlTest, SetsNoServiceTypeOfSessionZeroOrOfOthers) {
  clientWithSession(43, 7);
  QVTestClient& client = registeredClient(42);
  client.create(0);
  runUntilIdle();
  takeJournal();
  client.setServiceType(2, 0);
  client.setServiceType(2, 7);
  client.setServiceType(2, 99);
  EXPECT_THAT(run(), ElementsAre("reply 42 setServiceType 0: YES", "reply 42 setServiceType 7: YES",
                                 "reply 42 setServiceType 99: YES"));
  EXPECT_EQ(client.session(0)->serviceType(), 65535);
}

TEST_F(QVReportingSessionControlTest, AnswersTheServiceType) {
  QVTestClient& client = clientWithSession(42, 7, 12);
  client.getServiceType(7);
  EXPECT_THAT(run(), ElementsAre("reply 42 getServiceType 7: 12",
                                 clientLine(standard, kGetType,
                                            "returnning service type 12 for reporter  7")));
}

TEST_F(QVReportingSessionControlTest, AnswersTheServiceTypeOfAnotherClientsSession) {
  clientWithSession(42, 7, 3);
  QVTestClient& other = registeredClient(43);
  other.getServiceType(7);
  EXPECT_THAT(run(), ElementsAre(lookupHit(7, 42), "reply 43 getServiceType 7: 3",
                                 clientLine(standard, kGetType,
                                            "returnning service type 3 for reporter  7")));
}

TEST_F(QVReportingSessionControlTest, AnswersUnknownForASessionThatNobodyHas) {
  QVTestClient& client = registeredClient(42);
  client.getServiceType(-8);
  EXPECT_THAT(run(), ElementsAre(lookupFailure(-8), "reply 42 getServiceType -8: 65535",
                                 clientLine(standard, kGetType,
                                            "returnning service type 65535 for reporter  -8")));
}

TEST_F(QVReportingSessionControlTest, AnswersForSessionZeroTwice) {
  QVTestClient& client = registeredClient(42);
  clientWithSession(43, 7).create(0);
  runUntilIdle();
  takeJournal();
  client.getServiceType(0);
  EXPECT_THAT(
      run(),
      ElementsAre("reply 42 getServiceType 0: 65535", "reply 42 getServiceType 0: 65535",
                  clientLine(standard, kGetType, "returnning service type 65535 for reporter  0")));
}

TEST_F(QVReportingSessionControlTest, AnswersForAnOwnSessionZeroTwiceTheSecondTimeWithItsType) {
  QVTestClient& client = registeredClient(42);
  client.create(0);
  runUntilIdle();
  client.session(0)->setServiceType(4);
  takeJournal();
  client.getServiceType(0);
  EXPECT_THAT(run(), ElementsAre("reply 42 getServiceType 0: 65535", "reply 42 getServiceType 0: 4",
                                 clientLine(standard, kGetType,
                                            "returnning service type 4 for reporter  0")));
}

// ---- configuration

TEST_F(QVReportingSessionControlTest, MergesConfigurationsIntoTheUserInformation) {
  QVTestClient& client = clientWithSession(42, 7);
  client.setConfiguration({{"HostApplicationDisplayID", "player"}, {"rate", 44100}}, 7);
  client.setConfiguration({{"rate", 48000}}, 7);
  EXPECT_THAT(run(),
              ElementsAre("reply 42 setConfiguration 7: YES", "reply 42 setConfiguration 7: YES"));
  EXPECT_EQ(client.session(7)->userInfo(),
            (QVDictionary{{"HostApplicationDisplayID", "player"}, {"rate", 48000}}));
}

TEST_F(QVReportingSessionControlTest, AnswersAConfigurationOnceTheSessionHasIt) {
  QVTestClient& client = clientWithSession(42, 7);
  client.connection().call().setConfiguration({{"rate", 48000}}, 7, [&](bool) {
    journal_.note(QVText("reply with ", client.session(7)->userInfo()));
  });
  EXPECT_THAT(run(), ElementsAre(R"(reply with {"rate":48000})"));
}

TEST_F(QVReportingSessionControlTest, ConfiguresSessionZero) {
  QVTestClient& client = registeredClient(42);
  client.create(0);
  client.setConfiguration({{"a", 1}}, 0);
  EXPECT_THAT(run(), ElementsAre(traceEntry(kTraceCreate),
                                 sessionLine(info, "initWithID:processIdentifiers:",
                                             "created reporting session for ID: 0"),
                                 traceEntry(kTraceSessionCreated),
                                 clientLine(standard, kCreate, "session created for reporter 0"),
                                 "reply 42 create 0: YES", "reply 42 setConfiguration 0: YES"));
  EXPECT_EQ(client.session(0)->userInfo(), (QVDictionary{{"a", 1}}));
}

TEST_F(QVReportingSessionControlTest, ConfiguresNobodyElsesSession) {
  QVTestClient& owner = clientWithSession(42, 7);
  QVTestClient& other = registeredClient(43);
  other.setConfiguration({{"a", 1}}, 7);
  EXPECT_THAT(run(), ElementsAre("reply 43 setConfiguration 7: YES"));
  EXPECT_TRUE(owner.session(7)->userInfo().empty());
}

// ---- stop

TEST_F(QVReportingSessionControlTest, StopsASession) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.stop(7);
  EXPECT_THAT(
      run(),
      ElementsAre(traceEntry(kTraceStop),
                  clientLine(standard, kStop, "nothing interesting to fetch from the drivers"),
                  traceEntry(kTraceSessionStopped), "reply 42 start 7: YES",
                  clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
  EXPECT_FALSE(client.session(7)->started());
  EXPECT_EQ(client.session(7)->driverSnapShot(), nullptr);
}

TEST_F(QVReportingSessionControlTest, StopsASessionThatWasNeverStarted) {
  QVTestClient& client = clientWithSession(42, 7);
  client.stop(7);
  EXPECT_THAT(
      run(),
      ElementsAre(traceEntry(kTraceStop),
                  clientLine(standard, kStop, "nothing interesting to fetch from the drivers"),
                  clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
}

TEST_F(QVReportingSessionControlTest, StopsNobodyElsesSession) {
  QVTestClient& owner = clientWithStartedSession(42, 7);
  QVTestClient& other = registeredClient(43);
  other.stop(7);
  EXPECT_THAT(run(), ElementsAre(traceEntry(kTraceStop), clientLine(standard, kStop, "stopping 7"),
                                 "reply 43 stop 7: YES"));
  EXPECT_TRUE(owner.session(7)->started());
}

TEST_F(QVReportingSessionControlTest, NeitherStartsNorStopsNorDestroysSessionZero) {
  QVTestClient& client = registeredClient(42);
  client.create(0);
  runUntilIdle();
  takeJournal();
  client.start(0);
  client.stop(0);
  client.destroy(0);
  EXPECT_THAT(run(), ElementsAre(traceEntry(kTraceStart), "reply 42 start 0: YES",
                                 traceEntry(kTraceStop), "reply 42 stop 0: YES",
                                 traceEntry(kTraceDestroy), "reply 42 destroy 0: YES"));
  ASSERT_NE(client.session(0), nullptr);
  EXPECT_FALSE(client.session(0)->started());
}

// ---- destroy

TEST_F(QVReportingSessionControlTest, DestroysASession) {
  makeSessionsVerbose();
  QVTestClient& client = clientWithSession(42, 7);
  client.destroy(7);
  EXPECT_THAT(
      run(), ElementsAre(traceEntry(kTraceDestroy),
                         sessionLine(info, "dealloc", "deallocing this session 7"),
                         traceEntry(kTraceSessionDestroyed),
                         clientLine(standard, kDestroy, "destroying 7"), "reply 42 destroy 7: YES"))
      << "not stopped, since it was not started";
  EXPECT_EQ(client.session(7), nullptr);
}

TEST_F(QVReportingSessionControlTest, StopsAStartedSessionThatItDestroys) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  const std::weak_ptr<QVReportingSession> session = client.session(7);
  takeBeaconStory();
  client.destroy(7);
  runServerQueue();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceDestroy), traceEntry(kTraceSessionStopped),
                  clientLine(standard, kDestroy, "destroying 7"), "reply 42 destroy 7: YES"))
      << "no driver statistics, and the start is not answered";
  EXPECT_FALSE(session.expired()) << "its flush is under way";
  EXPECT_THAT(run(), ElementsAre(sessionLine(info, "dealloc", "deallocing this session 7"),
                                 traceEntry(kTraceSessionDestroyed)));
  EXPECT_THAT(takeBeaconStory(), ElementsAre("flush 1", "end 1"));
  EXPECT_TRUE(session.expired());
}

TEST_F(QVReportingSessionControlTest, DestroysNobodyElsesSession) {
  QVTestClient& owner = clientWithSession(42, 7);
  QVTestClient& other = registeredClient(43);
  other.destroy(7);
  EXPECT_THAT(run(),
              ElementsAre(traceEntry(kTraceDestroy), clientLine(standard, kDestroy, "destroying 7"),
                          "reply 43 destroy 7: YES"));
  EXPECT_NE(owner.session(7), nullptr);
}

// ---- queries

TEST_F(QVReportingSessionControlTest, ValidatesASession) {
  QVTestClient& client = clientWithSession(42, 7, 3);
  client.validate(7);
  EXPECT_THAT(run(), ElementsAre(clientLine(standard, kValid, "validating reporter 7"),
                                 R"(reply 42 validate 7: {"reporterID":7,"serviceType":3})"));
}

TEST_F(QVReportingSessionControlTest, ValidatesAnotherClientsSession) {
  clientWithSession(42, 7, 3);
  QVTestClient& other = registeredClient(43);
  other.validate(7);
  EXPECT_THAT(run(),
              ElementsAre(lookupHit(7, 42), clientLine(standard, kValid, "validating reporter 7"),
                          R"(reply 43 validate 7: {"reporterID":7,"serviceType":3})"));
}

TEST_F(QVReportingSessionControlTest, AnswersZeroForASessionThatNobodyHas) {
  QVTestClient& client = registeredClient(42);
  client.validate(7);
  EXPECT_THAT(run(),
              ElementsAre(lookupFailure(7), clientLine(standard, kValid, "validating reporter 7"),
                          R"(reply 42 validate 7: {"reporterID":0,"serviceType":65535})"));
}

TEST_F(QVReportingSessionControlTest, ValidatesAnOwnSessionZero) {
  QVTestClient& client = registeredClient(42);
  client.validate(0);
  client.create(0);
  runUntilIdle();
  client.session(0)->setServiceType(9);
  client.validate(0);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre(R"(reply 42 validate 0: {"reporterID":0,"serviceType":65535})",
                                     "reply 42 create 0: YES",
                                     R"(reply 42 validate 0: {"reporterID":0,"serviceType":9})"));
}

TEST_F(QVReportingSessionControlTest, ListsTheReportersOfAllClientsInTheirOrder) {
  QVTestClient& first = clientWithStartedSession(42, 9);
  QVTestClient& second = clientWithSession(43, 5);
  first.create(-3);
  second.create(9);
  second.listReporters();
  runUntilIdle();
  EXPECT_EQ(replies().back(), "reply 43 reporters: -3 9 5 9");
}

TEST_F(QVReportingSessionControlTest, ListsTheReportersOfAClientThatIsNotYetRemoved) {
  QVTestClient& dead = clientWithSession(42, 7);
  QVTestClient& other = registeredClient(43);
  other.listReporters();
  dead.disconnect();
  other.listReporters();
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 43 reporters: 7", "reply 43 reporters:"));
}

TEST_F(QVReportingSessionControlTest, FindsOnlyOwnSessionsWhileReportingIsSwitchedOff) {
  QVTestClient& owner = clientWithSession(42, 7, 3);
  QVTestClient& other = clientWithSession(43, 8, 4);
  switchReporting(false);
  other.validate(7);
  other.validate(8);
  other.getServiceType(7);
  other.start(7);
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre(R"(reply 43 validate 7: {"reporterID":0,"serviceType":65535})",
                                     R"(reply 43 validate 8: {"reporterID":8,"serviceType":4})",
                                     "reply 43 getServiceType 7: 65535", "reply 43 start 7: YES"));
  EXPECT_FALSE(owner.session(7)->started());
  EXPECT_THAT(takeJournal(), Not(Contains(lookupFailure(7))));
}

// ---- the debug lines of the IPC thread

class QVReportingServerVerboseTest : public QVReportingSessionControlTest {
 protected:
  // One call of every operation that another client could make, without running them.
  static void callEverything(QVTestClient& client) {
    client.create(7);
    client.setServiceType(65535, 7);
    client.getServiceType(7);
    client.setConfiguration({{"a", 1}}, 7);
    client.start(7);
    client.send({{"a", 1}}, {7, -8});
    client.send({{"a", 1}}, {});
    client.sendToAll({{"a", 1}});
    client.stop(7);
    client.destroy(7);
    client.validate(7);
    client.listReporters();
  }
};

TEST_F(QVReportingServerVerboseTest, WritesOneLinePerOperationBeforeItsWork) {
  makeServerVerbose();
  QVTestClient& client = registeredClient(42);
  callEverything(client);
  constexpr std::string_view kSend = "sendMessage:withCategory:andType:forReportingIDs:reply:";
  EXPECT_THAT(takeJournal(),
              ElementsAre(clientLine(debug, kCreate, "creating session for reporter 7"),
                          clientLine(debug, kSetType, "setting service type 65535 for reporter 7"),
                          clientLine(debug, kGetType, "fetching seviceType"),
                          clientLine(debug, kConfigure, "setting configuration"),
                          clientLine(debug, kStartOperation, "starting session for reporter 7"),
                          clientLine(debug, kSend, "sending message for reporter [7,-8]"),
                          clientLine(debug, kSend, "sending message for reporter []"),
                          clientLine(debug, kSend, "sending message for reporter (null)"),
                          clientLine(debug, kStop, "stopping session for reporter 7"),
                          clientLine(debug, kDestroy, "destroying session for reporter 7"),
                          clientLine(debug, kValid, "validating reporter 7")))
      << "listing all reporters has none";
}

TEST_F(QVReportingServerVerboseTest, WritesNoneUnlessItIsVerbose) {
  makeSessionsVerbose();
  QVTestClient& client = registeredClient(42);
  callEverything(client);
  EXPECT_THAT(takeJournal(), IsEmpty());
  runUntilIdle();
  EXPECT_THAT(platform_.log().renderingsOfScope("qvrs"), Not(Contains(testing::StartsWith("7["))));
}

}  // namespace
