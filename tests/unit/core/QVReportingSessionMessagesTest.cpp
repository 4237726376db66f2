// How a session numbers, records and sends a message.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <optional>

namespace {

using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

constexpr std::string_view kSend = "sendMessage:category:type:sync:reply:";

class QVReportingSessionMessagesTest : public QVServiceFixture {
 protected:
  std::shared_ptr<QVReportingSession> makeSession(uint16_t serviceType = 1) {
    auto session = QVReportingSession::initWithID(7, {42});
    session->setServiceType(serviceType);
    journal_.forget();
    return session;
  }
  std::shared_ptr<QVReportingSession> makeStartedSession(uint16_t serviceType = 1) {
    auto session = makeSession(serviceType);
    session->start();
    runUntilIdle();
    journal_.forget();
    takeBeaconStory();
    return session;
  }
  // Notes the reply in the journal.
  QVReportingSession::SendReply reply() {
    return [this](const std::optional<QVError>& error) {
      journal_.note(error ? "reply " + error->description() : "reply nil");
    };
  }
  // Sends {"a b": 1} in a session of service type 3 that is not started, where sessions are
  // verbose.
  void expectSentAsASingleMessage(QVReportingSession& session) {
    session.sendMessage({{"a b", 1}}, kSessionPlayback, kStart, reply());
    EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "asynchronous all the same";
    runUntilIdle();
    EXPECT_THAT(
        takeJournal(),
        ElementsAre(sessionLine(debug, kSend, "sending message for session owned by 7"),
                    traceEntry(kTraceMessageSent), "reply nil",
                    sessionLine(debug, kSend, "session not started, will send as a single message"),
                    singleLine(debug, "sending single message after delta 0 for service 3"),
                    traceEntry(kTraceMessageSent), singleLine(debug, "sending single message"),
                    singleLine(debug, R"(message {"a_b":1} : category 134217731 : type 1)")))
        << "two marks: one in the session, one for the single message; no second reply";
    const auto message = latestBeaconEvent(QVFakeBeaconEvent::Kind::singleMessage);
    EXPECT_EQ(message.sessionInfo, (QVDictionary{{"kBeaconSessionInfoClientType", 19},
                                                 {"kBeaconSessionInfoClientVersion", 2.0},
                                                 {"kBeaconSessionInfoSessionID", -1}}));
    EXPECT_EQ(message.userInfo, (QVDictionary{{"kBeaconUserInfoClientName", "net.quillon.quietvox"},
                                              {"kBeaconUserInfoServiceName", "haptics"}}));
    EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a_b":1})"));
  }
  static std::vector<std::string> recorded(const QVReportingPayloadArray& array) {
    std::vector<std::string> texts;
    for (const auto& [identifier, payload] : entriesOf(array)) {
      texts.push_back(QVText(identifier, '=', payload));
    }
    return texts;
  }
};

// ---- identifiers

TEST_F(QVReportingSessionMessagesTest, NumbersMessagesOfEachCategoryAndTypeFromOne) {
  const auto session = makeSession();
  EXPECT_EQ(session->messageIdForCategory(0x08000001, 1), "Session_Generic_Start_1");
  EXPECT_EQ(session->messageIdForCategory(0x08000001, 1), "Session_Generic_Start_2");
  EXPECT_EQ(session->messageIdForCategory(0x08000001, 2), "Session_Generic_Stop_1");
  EXPECT_EQ(session->messageIdForCategory(0x10000001, 1), "DSP_Generic_Start_1");
  EXPECT_EQ(session->messageIdForCategory(0x08000001, 1), "Session_Generic_Start_3");
  EXPECT_EQ(session->messageIdForCategory(0xFFFFFFFF, 0xFFFF), "Undefined_Unknown_1");
}

TEST_F(QVReportingSessionMessagesTest, CountsByNameSoThatEqualNamesShareACount) {
  const auto session = makeSession();
  EXPECT_EQ(session->messageIdForCategory(0, 6), "Undefined_Undefined_1");
  EXPECT_EQ(session->messageIdForCategory(12, 7), "Undefined_Undefined_2");
  EXPECT_EQ(session->messageIdForCategory(0x00010005, 3), "_Setup_Setup_1");
  EXPECT_EQ(session->messageIdForCategory(0x18000005, 3), "_Setup_Setup_2");
}

TEST_F(QVReportingSessionMessagesTest, CountsEachSessionByItself) {
  const auto first = makeSession();
  const auto second = makeSession();
  first->messageIdForCategory(1, 1);
  EXPECT_EQ(second->messageIdForCategory(1, 1), "Generic_Start_1");
}

TEST_F(QVReportingSessionMessagesTest, ContinuesItsCountsAfterAStop) {
  const auto session = makeStartedSession();
  session->sendMessage({{"a", 1}}, 3, 1, {});
  session->stop();
  session->start();
  session->sendMessage({{"a", 2}}, 3, 1, {});
  EXPECT_THAT(recorded(*session->nestedAggregatedPayloadData()),
              ElementsAre(R"(Playback_Start_2={"a":2})"));
}

// ---- recording

TEST_F(QVReportingSessionMessagesTest, RecordsNormalisedPayloadsUnderTheirIdentifiers) {
  const auto session = makeStartedSession();
  session->sendMessage({{"buffer size", 512}}, kSessionPlayback, kStart, {});
  session->sendMessage({{"text", "a b"}}, kSessionPlayback, kStart, {});
  EXPECT_THAT(recorded(*session->aggregatedPayloadData()),
              ElementsAre(R"(={"buffer_size":512})", R"(={"text":"a b"})"));
  EXPECT_THAT(recorded(*session->nestedAggregatedPayloadData()),
              ElementsAre(R"(Session_Playback_Start_1={"buffer_size":512})",
                          R"(Session_Playback_Start_2={"text":"a b"})"));
}

TEST_F(QVReportingSessionMessagesTest, CountsButDoesNotCollectAfterAStop) {
  const auto session = makeStartedSession();
  session->stop();
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  runUntilIdle();
  EXPECT_EQ(session->aggregatedPayloadData(), nullptr);
  EXPECT_EQ(session->nestedAggregatedPayloadData(), nullptr);
  EXPECT_THAT(session->messageTypeCounts(), ElementsAre(Pair("Session_Playback_Start", 1)));
}

TEST_F(QVReportingSessionMessagesTest, LeavesTheMessageAsItIs) {
  const auto session = makeStartedSession();
  const QVDictionary message{{"a b", 1}};
  session->sendMessage(message, kSessionPlayback, kStart, {});
  session->stop();
  runUntilIdle();
  EXPECT_EQ(message, (QVDictionary{{"a b", 1}}));
}

// ---- sending

TEST_F(QVReportingSessionMessagesTest, AnswersBeforeTheFrameworkSeesTheMessage) {
  const auto session = makeStartedSession();
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, reply());
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), "reply nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  runUntilIdle();
  EXPECT_THAT(takeJournal(), IsEmpty());
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 3/1 {"a":1})"));
}

TEST_F(QVReportingSessionMessagesTest, AnswersOnceWithNoErrorAlsoWhenTheFrameworkRefuses) {
  const auto session = makeStartedSession();
  platform_.beacon().refuseMessages(QVError{"beacon", 5, {}});
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, reply());
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), "reply nil"));
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "not yet refused";
  runUntilIdle();
  EXPECT_THAT(takeJournal(), IsEmpty()) << "a refusal writes nothing";
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(refused 1: 3/1 {"a":1})")) << "and is not retried";
}

TEST_F(QVReportingSessionMessagesTest, WritesNothingOfARefusalEvenWhenVerbose) {
  makeSessionsVerbose();
  const auto session = makeStartedSession();
  platform_.beacon().refuseMessages(std::nullopt);
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(debug, kSend, "sending message for session owned by 7"),
                          traceEntry(kTraceMessageSent)));
}

TEST_F(QVReportingSessionMessagesTest, IgnoresTheSyncFlag) {
  const auto session = makeStartedSession();
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, true, reply());
  EXPECT_THAT(takeBeaconStory(), IsEmpty()) << "asynchronous all the same";
  EXPECT_THAT(takeJournal(), ElementsAre(traceEntry(kTraceMessageSent), "reply nil"));
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), SizeIs(1));
}

TEST_F(QVReportingSessionMessagesTest, HandsOnlyTheKindOfTheCategoryToTheFramework) {
  makeSessionsVerbose();
  const auto session = makeStartedSession();
  session->sendMessage({{"a b", 1}}, 0x00010005, 3, {});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(message 1: 5/3 {"a_b":1})"));
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(sessionLine(debug, kSend, "sending message for session owned by 7"),
                  traceEntry(kTraceMessageSent),
                  sessionLine(debug, kSend,
                              R"(BeaconAgent session 1 : message {"a b":1} : category 65541)"
                              " : type 3")))
      << "the line has the message as received";
}

TEST_F(QVReportingSessionMessagesTest, PrintsLargeCategoriesSigned) {
  makeSessionsVerbose();
  const auto session = makeStartedSession();
  session->sendMessage({{"a", 1}}, 0x80000003, 65535, {});
  runUntilIdle();
  EXPECT_EQ(takeJournal().back(),
            sessionLine(debug, kSend,
                        R"(BeaconAgent session 1 : message {"a":1} : category -2147483645)"
                        " : type 65535"));
}

TEST_F(QVReportingSessionMessagesTest, WritesItsDebugLinesOnlyWhenVerbose) {
  const auto session = makeStartedSession();
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  session->stop();
  session->sendMessage({{"a", 2}}, kSessionPlayback, kStart, {});
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceMessageSent), traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent), traceEntry(kTraceMessageSent),
                          traceEntry(kTraceMessageSent)));
}

TEST_F(QVReportingSessionMessagesTest, SendsAMessageBeforeTheStartAsASingleOne) {
  makeSessionsVerbose();
  const auto session = makeSession(3);
  session->setConfiguration({{"HostApplicationDisplayID", "player"}});
  expectSentAsASingleMessage(*session);
}

TEST_F(QVReportingSessionMessagesTest, SendsAStoppedSessionsMessageAsASingleOne) {
  makeSessionsVerbose();
  const auto session = makeStartedSession(3);
  session->setConfiguration({{"HostApplicationDisplayID", "player"}});
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  session->stop();
  runUntilIdle();
  journal_.forget();
  takeBeaconStory();
  expectSentAsASingleMessage(*session);
}

TEST_F(QVReportingSessionMessagesTest, DecidesAtTheTimeOfTheSend) {
  const auto session = makeStartedSession();
  session->sendMessage({{"n", 1}}, kSessionPlayback, kStart, {});
  session->stop();
  session->sendMessage({{"n", 2}}, kSessionPlayback, kStart, {});
  session->start();
  session->sendMessage({{"n", 3}}, kSessionPlayback, kStart, {});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 3/1 {"n":1})",
                          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1","n":"1"})",
                          "flush 1", "end 1", "session 2", "configuration 2",
                          R"(message 2: 3/1 {"n":3})", R"(single: 3/1 {"n":2})"));
}

TEST_F(QVReportingSessionMessagesTest, TakesTheServiceTypeOfTheMomentForASingleMessage) {
  const auto session = makeSession(3);
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  session->setServiceType(10);
  runUntilIdle();
  EXPECT_EQ(*latestBeaconEvent(QVFakeBeaconEvent::Kind::singleMessage)
                 .userInfo.find("kBeaconUserInfoServiceName"),
            QVValue("alerts"));
}

TEST_F(QVReportingSessionMessagesTest, SendsATestSessionsMessageAsASingleOneBeforeItsStart) {
  const auto session = makeSession(11);
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 3/1 {"a":1})"));
}

TEST_F(QVReportingSessionMessagesTest, SendsAnEmptyAndAnAbsentMessage) {
  const auto session = makeStartedSession();
  session->sendMessage({}, kSessionPlayback, kStart, {});
  session->sendMessage(QVDictionary(), kSessionPlayback, kStart, {});
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre("message 1: 3/1 {}", "message 1: 3/1 {}",
                          R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"1"})", "flush 1",
                          "end 1"));
}

// ---- what a session collects

TEST_F(QVReportingSessionMessagesTest, CollectsNoMoreThanItsMaximumAndSendsAllTheSame) {
  const auto session = QVReportingSession::initWithID(7, {42}, 1000);
  session->start();
  runUntilIdle();
  journal_.forget();
  takeBeaconStory();
  const std::string large(2000, 'x');
  session->sendMessage({{"text", large}}, 0x08000001, 1, {});
  EXPECT_THAT(journal_.entries("3["), IsEmpty());
  session->sendMessage({{"n", 1}}, 0x08000001, 1, {});
  session->sendMessage({{"n", 2}}, 0x08000001, 1, reply());
  const auto line =
      sessionLine(error, kSend, "messages of reporter 7 take 1000 bytes, no more are collected");
  EXPECT_THAT(journal_.entries("3["), ElementsAre(line));
  EXPECT_THAT(journal_.entries("reply "), ElementsAre("reply nil"));
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 1u);
  EXPECT_EQ(session->nestedAggregatedPayloadData()->size(), 1u);
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), SizeIs(3));

  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"65535","text":")" +
                              large + "\"}",
                          "flush 1", "end 1"));
  session->start();
  session->sendMessage({{"n", 3}}, 0x08000001, 1, {});
  EXPECT_EQ(session->aggregatedPayloadData()->size(), 1u) << "each start collects anew";
  EXPECT_THAT(journal_.entries("3["), ElementsAre(line));
}

}  // namespace
