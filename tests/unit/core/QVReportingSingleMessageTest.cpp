// Messages that belong to no session.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"

#include <chrono>
#include <optional>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using Kind = QVFakeBeaconEvent::Kind;

class QVReportingSingleMessageTest : public QVServiceFixture {
 protected:
  void sendSingle(const QVDictionary& message, uint16_t serviceType,
                  uint32_t category = kSessionPlayback, uint16_t type = kStart) {
    QVReportingSession::sendSingleMessage(
        message, category, type, serviceType, {{"kBeaconUserInfoClientName", "ignored"}},
        [this](const std::optional<QVError>& error) {
          journal_.note(error ? "reply " + error->description() : "reply nil");
        });
  }
  // Registers the sessions' scope, which is the first session's to do.
  void makeAndDropASession() {
    QVReportingSession::initWithID(1, {});
    journal_.forget();
  }
};

TEST_F(QVReportingSingleMessageTest, GoesOutOnTheBackgroundQueue) {
  sendSingle({{"a b", 1}}, 9);
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_EQ(platform_.queues().pendingCount(QVFakeWorkQueues::kBackgroundLabel), 1u);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), "reply nil"));
  const auto message = latestBeaconEvent(Kind::singleMessage);
  EXPECT_EQ(message.sessionInfo, (QVDictionary{{"kBeaconSessionInfoClientType", 19},
                                               {"kBeaconSessionInfoClientVersion", 2.0},
                                               {"kBeaconSessionInfoSessionID", -1}}));
  EXPECT_EQ(message.userInfo, (QVDictionary{{"kBeaconUserInfoClientName", "net.quillon.quietvox"},
                                            {"kBeaconUserInfoServiceName", "audiodeviceusage"}}));
  EXPECT_EQ(message.category, 3);
  EXPECT_EQ(message.type, 1);
  EXPECT_EQ(message.payload, (QVDictionary{{"a_b", 1}}));
}

TEST_F(QVReportingSingleMessageTest, NamesAServiceWithoutANameNull) {
  sendSingle({{"a", 1}}, 13);
  runUntilIdle();
  EXPECT_EQ(*latestBeaconEvent(Kind::singleMessage).userInfo.find("kBeaconUserInfoServiceName"),
            QVValue("(null)"));
}

TEST_F(QVReportingSingleMessageTest, NeedsNoReply) {
  QVReportingSession::sendSingleMessage({{"a", 1}}, 3, 1, 5, {}, {});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a":1})"));
}

TEST_F(QVReportingSingleMessageTest, WritesItsWayWhenVerbose) {
  makeSessionsVerbose();
  makeAndDropASession();
  sendSingle({{"a b", 1}}, 5, 0xFFFF0005, 65535);
  EXPECT_THAT(takeJournal(),
              ElementsAre(singleLine(debug, "sending single message after delta 0 for service 5")));
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceMessageSent), singleLine(debug, "sending single message"),
                  singleLine(debug, R"(message {"a b":1} : category -65531 : type 65535)"),
                  "reply nil"));
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 5/65535 {"a_b":1})"));
}

TEST_F(QVReportingSingleMessageTest, IsNotVerboseBeforeTheFirstSession) {
  makeSessionsVerbose();
  sendSingle({{"a", 1}}, 5);
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), "reply nil"))
      << "the default log never is";
}

TEST_F(QVReportingSingleMessageTest, WritesAndAnswersARefusalWithAnError) {
  makeSessionsVerbose();
  makeAndDropASession();
  platform_.beacon().refuseMessages(QVError{"beacon", 28, {{"failureReason", "No space left"}}});
  sendSingle({{"a", 1}}, 5);
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(singleLine(debug, "sending single message after delta 0 for service 5"),
                  traceEntry(kTraceMessageSent), singleLine(debug, "sending single message"),
                  singleLine(error, "sendOneMessageWithSessionInfo No space left"),
                  "reply No space left"));
}

TEST_F(QVReportingSingleMessageTest, DescribesAnErrorWithoutAReasonByItsCode) {
  makeAndDropASession();
  platform_.beacon().refuseMessages(QVError{"beacon", 28, {}});
  sendSingle({{"a", 1}}, 5);
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceMessageSent),
                          singleLine(error, "sendOneMessageWithSessionInfo beacon error 28"),
                          "reply beacon error 28"));
}

TEST_F(QVReportingSingleMessageTest, WritesARefusalToTheDefaultLogBeforeTheFirstSession) {
  platform_.beacon().refuseMessages(QVError{"beacon", 28, {}});
  sendSingle({{"a", 1}}, 5);
  runUntilIdle();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(traceEntry(kTraceMessageSent),
                  singleLine(error, "sendOneMessageWithSessionInfo beacon error 28", "default"),
                  "reply beacon error 28"));
}

TEST_F(QVReportingSingleMessageTest, WritesNothingOfARefusalWithoutAnError) {
  makeSessionsVerbose();
  makeAndDropASession();
  platform_.beacon().refuseMessages(std::nullopt);
  sendSingle({{"a", 1}}, 5);
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(singleLine(debug, "sending single message after delta 0 for service 5"),
                          traceEntry(kTraceMessageSent),
                          singleLine(debug, "sending single message"), "reply nil"));
}

TEST_F(QVReportingSingleMessageTest, SpreadsAlarmsOverAMinute) {
  makeSessionsVerbose();
  makeAndDropASession();
  platform_.random().script({59, 0, 7});
  for (int n = 1; n <= 3; ++n) sendSingle({{"n", n}}, 4);
  EXPECT_THAT(platform_.random().bounds(), ElementsAre(60, 60, 60));
  EXPECT_THAT(takeJournal(),
              ElementsAre(singleLine(debug, "sending single message after delta 59 for service 4"),
                          singleLine(debug, "sending single message after delta 0 for service 4"),
                          singleLine(debug, "sending single message after delta 7 for service 4")));
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"n":2})"));
  advance(6999ms);
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  advance(1ms);
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"n":3})"));
  advance(52s - 1ns);
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  advance(1ns);
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"n":1})"));
}

TEST_F(QVReportingSingleMessageTest, DrawsNoDelayForOtherServices) {
  for (const uint16_t type : std::initializer_list<uint16_t>{0, 3, 5, 10, 12, 13, 65535}) {
    sendSingle({{"type", type}}, type);
  }
  runUntilIdle();
  EXPECT_THAT(platform_.random().bounds(), IsEmpty());
  EXPECT_EQ(platform_.beacon().count(Kind::singleMessage), 7u);
  EXPECT_EQ(platform_.clock().steadyTime(), 0s);
}

TEST_F(QVReportingSingleMessageTest, DelaysTheMessagesOfAnAlarmsSessionThatIsNotStarted) {
  platform_.random().script({30});
  QVTestClient& client = clientWithSession(42, 7, 4);
  client.send({{"a", 1}}, {7});
  runUntilIdle();
  EXPECT_THAT(replies(), ElementsAre("reply 42 send: nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  advance(30s);
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a":1})"));
}

TEST_F(QVReportingSingleMessageTest, DoesNotDelayTheMessagesOfAStartedAlarmsSession) {
  QVTestClient& client = clientWithStartedSession(42, 7, 4);
  takeBeaconStory();
  client.send({{"a", 1}}, {7});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
}

TEST_F(QVReportingSingleMessageTest, OutlivesItsClientWhileItIsDelayed) {
  platform_.random().script({30});
  QVTestClient& client = clientWithSession(42, 7, 4);
  const std::weak_ptr<QVReportingSession> session = client.session(7);
  client.send({{"a", 1}}, {7});
  client.disconnect();
  runUntilIdle();
  EXPECT_TRUE(session.expired());
  advance(30s);
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a":1})"));
}

}  // namespace
