// Which sessions and sinks a client's message reaches, and in which order.

#include "tests/support/QVServiceFixture.h"

namespace {

using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr const char* kEventName = "countwise net.quillon.quietvox.Session_Playback.Start";
constexpr const char* kPowerEvent = "joulewell Vidra_Haptics";

std::string routingLine(std::string_view text) {
  return clientLine(standard, "sendMessage:withCategory:andType:forReportingIDs:reply:", text);
}
std::string sendingLine(int64_t reporterID) {
  return sessionLine(debug, "sendMessage:category:type:sync:reply:",
                     QVText("sending message for session owned by ", reporterID));
}

class QVReportingRoutingTest : public QVServiceFixture {
 protected:
  QVReportingRoutingTest() { makeSessionsVerbose(); }

  // Reaches both sinks without an error line of theirs.
  const QVDictionary haptics_{{"EngineOnTime", 12.5}, {"qvreporting_timestamp", 1000}};
};

// ---- listed sessions

TEST_F(QVReportingRoutingTest, ReachesAListedSessionSinksFirst) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.send(haptics_, {7});
  EXPECT_THAT(takeJournal(), IsEmpty());
  runServerQueue();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceRouted), kEventName, kPowerEvent, sendingLine(7),
                          traceEntry(kTraceMessageSent), "reply 42 send: nil"))
      << "answered before the session's queue has run";
}

TEST_F(QVReportingRoutingTest, SkipsZeroAndUnknownIDsOnTheWayToAnothersSession) {
  clientWithStartedSession(43, 8);
  QVTestClient& client = registeredClient(42);
  client.send(haptics_, {0, 99, 8});
  runServerQueue();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceRouted), lookupFailure(99),
                                         lookupHit(8, 43), kEventName, kPowerEvent, sendingLine(8),
                                         traceEntry(kTraceMessageSent), "reply 42 send: nil"));
}

TEST_F(QVReportingRoutingTest, SendsNothingToAnEmptyList) {
  clientWithStartedSession(43, 8);
  QVTestClient& client = registeredClient(42);
  takeBeaconStory();
  client.send(haptics_, {});
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceRouted), "reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
}

TEST_F(QVReportingRoutingTest, SendsNothingToUnknownSessions) {
  QVTestClient& client = registeredClient(42);
  client.send(haptics_, {99, 0});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceRouted), lookupFailure(99), "reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "nor a stand-alone message";
}

TEST_F(QVReportingRoutingTest, SendsTwiceToASessionThatIsListedTwice) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  takeBeaconStory();
  client.send({{"a", 1}, {"EngineOnTime", 1}, {"qvreporting_timestamp", 2}}, {7, 7});
  runServerQueue();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceRouted), kEventName, kPowerEvent, sendingLine(7),
                          traceEntry(kTraceMessageSent), kEventName, kPowerEvent, sendingLine(7),
                          traceEntry(kTraceMessageSent), "reply 42 send: nil"));
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), SizeIs(2));
}

TEST_F(QVReportingRoutingTest, ReplacesBlanksOnceForAllSessions) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.create(8);
  client.start(8);
  runUntilIdle();
  for (const bool listed : {true, false}) {
    platform_.beacon().forgetEvents();
    const QVDictionary message{{"buffer size", 512}};
    if (listed) {
      client.send(message, {7, 8});
    } else {
      client.sendToAll(message);
    }
    runUntilIdle();
    const auto events = platform_.beacon().events();
    ASSERT_THAT(events, SizeIs(2));
    EXPECT_EQ(QVText(events[0].payload), R"({"buffer_size":512})");
    EXPECT_EQ(events[0].payload.begin(), events[1].payload.begin()) << "the same block";
  }
}

TEST_F(QVReportingRoutingTest, ReachesAListedSessionThatIsNotStarted) {
  QVTestClient& client = clientWithSession(42, 7, 3);
  client.send({{"a", 1}}, {7});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a":1})"));
  EXPECT_THAT(platform_.countwise().sentNames(), SizeIs(1));
}

TEST_F(QVReportingRoutingTest, HandsTheMessageOnAsItCame) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  takeBeaconStory();
  const QVDictionary message{{"buffer size", 512}, {"text", "a b"}};
  client.send(message, {7}, 0x10000008, 4);
  runUntilIdle();
  ASSERT_THAT(platform_.countwise().events(), SizeIs(1));
  EXPECT_EQ(platform_.countwise().events()[0].name, "net.quillon.quietvox.DSP_Error.Error");
  EXPECT_EQ(platform_.countwise().events()[0].payload,
            message.merging({{"HostApplicationDisplayID", "Unknown"}}));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 8/4 {"buffer_size":512,"text":"a b"})"));
}

TEST_F(QVReportingRoutingTest, LogsOnePowerEventForEachTargetSession) {
  QVTestClient& client = clientWithSession(42, 7);
  client.create(8);
  client.setConfiguration({{"HostApplicationDisplayID", "A"}}, 7);
  client.setConfiguration({{"HostApplicationDisplayID", "B"}}, 8);
  client.send(haptics_, {8, 7});
  runUntilIdle();
  const auto events = platform_.joulewell().events();
  ASSERT_THAT(events, SizeIs(2));
  EXPECT_EQ(*events[0].event.find("ApplicationName"), QVValue("B"));
  EXPECT_EQ(*events[1].event.find("ApplicationName"), QVValue("A"));
}

// ---- broadcast

TEST_F(QVReportingRoutingTest, ReachesEveryStartedSessionOfEveryClientSessionFirst) {
  QVTestClient& first = clientWithStartedSession(42, 7);
  first.create(6);
  QVTestClient& second = clientWithStartedSession(43, 5);
  second.create(9);
  second.start(9);
  runUntilIdle();
  QVTestClient& sender = registeredClient(44);
  sender.sendToAll(haptics_);
  runServerQueue();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(
          traceEntry(kTraceRouted),
          routingLine("sessions for client 42 : [<QVReportingSession 6>,<QVReportingSession 7>]"),
          routingLine("sessions for client 43 : [<QVReportingSession 5>,<QVReportingSession 9>]"),
          routingLine("sessions for client 44 : []"),
          routingLine("active reporting sessions 3 : [<QVReportingSession 7>,"
                      "<QVReportingSession 5>,<QVReportingSession 9>]"),
          sendingLine(7), traceEntry(kTraceMessageSent), kEventName, kPowerEvent,  //
          sendingLine(5), traceEntry(kTraceMessageSent), kEventName, kPowerEvent,  //
          sendingLine(9), traceEntry(kTraceMessageSent), kEventName, kPowerEvent,
          "reply 44 send: nil"));
}

TEST_F(QVReportingRoutingTest, SendsNothingToSessionsThatAreNotStartedOnBroadcast) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.create(8);
  runUntilIdle();
  takeBeaconStory();
  client.sendToAll({{"a", 1}});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
  EXPECT_THAT(client.session(8)->messageTypeCounts(), IsEmpty());
}

TEST_F(QVReportingRoutingTest, SendsAStandAloneMessageWhereNothingIsStarted) {
  QVTestClient& client = clientWithSession(42, 7);
  client.sendToAll(haptics_);
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceRouted),
                  routingLine("sessions for client 42 : [<QVReportingSession 7>]"),
                  routingLine("active reporting sessions 0 : []"),
                  routingLine("no active reporting sessions found, sending as standalone"),
                  singleLine(debug, "sending single message after delta 0 for service 5"),
                  "reply 42 send: nil", traceEntry(kTraceMessageSent),
                  singleLine(debug, "sending single message"),
                  singleLine(debug, R"(message {"EngineOnTime":12.5,"qvreporting_timestamp":1000})"
                                    " : category 134217731 : type 1")));
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(single: 3/1 {"EngineOnTime":12.5,"qvreporting_timestamp":1000})"));
  EXPECT_THAT(platform_.countwise().sentNames(), IsEmpty());
  EXPECT_THAT(platform_.joulewell().events(), IsEmpty());
}

TEST_F(QVReportingRoutingTest, SendsAStandAloneMessageOfTheStandAloneService) {
  platform_.preferences().setValue(kPreferencesDomain, "device_name", "Kitchen");
  switchReporting(true);
  QVTestClient& client = registeredClient(42);
  client.sendToAll({{"a b", 1}});
  runUntilIdle();
  const auto message = latestBeaconEvent(QVFakeBeaconEvent::Kind::singleMessage);
  EXPECT_EQ(message.userInfo, (QVDictionary{{"kBeaconUserInfoClientName", "net.quillon.quietvox"},
                                            {"kBeaconUserInfoServiceName", "standalone"}}))
      << "the defaults are not told";
  EXPECT_EQ(message.sessionInfo, (QVDictionary{{"kBeaconSessionInfoClientType", 19},
                                               {"kBeaconSessionInfoClientVersion", 2.0},
                                               {"kBeaconSessionInfoSessionID", -1}}));
  EXPECT_EQ(message.payload, (QVDictionary{{"a_b", 1}}));
}

TEST_F(QVReportingRoutingTest, AnswersWithoutWaitingForTheStandAloneMessage) {
  QVTestClient& client = registeredClient(42);
  client.sendToAll({{"a", 1}});
  runServerQueue();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
}

TEST_F(QVReportingRoutingTest, DecidesAfreshForEachMessage) {
  QVTestClient& client = clientWithSession(42, 7, 3);
  client.sendToAll({{"n", 1}});
  client.start(7);
  client.sendToAll({{"n", 2}});
  client.stop(7);
  client.sendToAll({{"n", 3}});
  runUntilIdle();
  EXPECT_THAT(platform_.beacon().count(QVFakeBeaconEvent::Kind::singleMessage), 2u);
  EXPECT_THAT(takeBeaconStory(), Contains(R"(message 1: 3/1 {"n":2})"));
}

TEST_F(QVReportingRoutingTest, DoesNotReachTheSessionsOfARemovedClient) {
  QVTestClient& dead = clientWithStartedSession(42, 7);
  QVTestClient& sender = registeredClient(43);
  takeBeaconStory();
  dead.interrupt();
  sender.sendToAll({{"a", 1}});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), Contains(R"(single: 3/1 {"a":1})"));
}

// ---- switched off

TEST_F(QVReportingRoutingTest, RefusesEveryMessageWhileReportingIsSwitchedOff) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  takeBeaconStory();
  switchReporting(false);
  client.send(haptics_, {7});
  client.send(haptics_, {});
  client.sendToAll(haptics_);
  runUntilIdle();
  const std::string refusal = "reply 42 send: net.quillon.audio.reporting 1 {}";
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceRouted), refusal, traceEntry(kTraceRouted), refusal,
                          traceEntry(kTraceRouted), refusal));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_THAT(client.session(7)->messageTypeCounts(), IsEmpty()) << "not even counted";

  switchReporting(true);
  client.send(haptics_, {7});
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil"));
}

TEST_F(QVReportingRoutingTest, RefusesAMessageAlsoWhenTheServiceIsGone) {
  QVTestClient& client = clientWithStartedSession(42, 7);
  client.send(haptics_, {7});
  endService();
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: net.quillon.audio.reporting 1 {}"))
      << "exactly one answer, whatever happens";
}

}  // namespace
