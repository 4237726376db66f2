// What a session records of the orientation of device and user interface.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"

#include <chrono>
#include <thread>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kLongFormAudio = 7;

class QVReportingOrientationTest : public QVServiceFixture {
 protected:
  QVReportingOrientationTest() { makeInternalBuild(); }

  std::shared_ptr<QVReportingSession> makeSession(int64_t reporterID = 7,
                                                  uint16_t serviceType = kTelephony) {
    auto session = QVReportingSession::initWithID(reporterID, {42});
    session->setServiceType(serviceType);
    return session;
  }
  std::shared_ptr<QVReportingSession> makeStartedSession(int64_t reporterID = 7,
                                                         uint16_t serviceType = kTelephony) {
    auto session = makeSession(reporterID, serviceType);
    session->start();
    runUntilIdle();
    journal_.forget();
    takeBeaconStory();
    return session;
  }
  // The entries that the session collected, in order: "KEY=VALUE KEY=VALUE".
  static std::vector<std::string> recorded(const QVReportingSession& session) {
    std::vector<std::string> texts;
    if (const auto array = session.aggregatedPayloadData()) {
      array->forEach([&texts](std::string_view, const QVReportingPayloadArray::Payload& payload) {
        std::string& text = texts.emplace_back();
        for (const auto& [key, value] : payload.entries) {
          text += QVText(text.empty() ? "" : " ", key, '=', value);
        }
      });
    }
    return texts;
  }
  QVFakeOrientation& orientation() { return platform_.orientation(); }
};

// ---- which sessions report

TEST_F(QVReportingOrientationTest, IsReportedByTwoServiceTypesOnInternalBuilds) {
  for (uint16_t type = 0; type < 16; ++type) {
    EXPECT_EQ(makeSession(7, type)->shouldReportOrientation(), type == 2 || type == 7) << type;
  }
  EXPECT_FALSE(makeSession(7, 65535)->shouldReportOrientation());
}

TEST_F(QVReportingOrientationTest, IsReportedOnEveryDeviceClassButSix) {
  const auto session = makeSession();
  for (const int deviceClass : {0, 1, 5, 6, 7, -6}) {
    platform_.deviceInformation().setAnswer("DeviceClassNumber", deviceClass);
    EXPECT_EQ(session->shouldReportOrientation(), deviceClass != 6) << "asked anew each time";
  }
}

TEST_F(QVReportingOrientationTest, IsFollowedOnOtherDeviceClasses) {
  const auto session = makeSession();
  for (const int deviceClass : {0, 1, 5, 7, -6}) {
    platform_.deviceInformation().setAnswer("DeviceClassNumber", deviceClass);
    journal_.forget();
    session->start();
    session->stop();
    EXPECT_THAT(
        takeJournal(),
        ElementsAre(traceEntry(kTraceSessionStarted), "register device QVReportingService 7",
                    "register ui QVReportingService 7", "unregister device QVReportingService 7",
                    "unregister ui QVReportingService 7", traceEntry(kTraceSessionStopped)))
        << deviceClass;
  }
}

TEST_F(QVReportingOrientationTest, IsNotFollowedOnDeviceClassSix) {
  const auto session = makeSession();
  platform_.deviceInformation().setAnswer("DeviceClassNumber", 6);
  session->start();
  session->stop();
  EXPECT_THAT(orientation().calls(), IsEmpty());
  EXPECT_EQ(session->startDate(), std::nullopt);
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
}

TEST_F(QVReportingOrientationTest, IsNotReportedOnOtherBuilds) {
  platform_.deviceInformation().setAnswer("InternalBuild", false);
  const auto session = makeSession();
  EXPECT_FALSE(session->shouldReportOrientation());
  session->start();
  session->stop();
  EXPECT_THAT(orientation().calls(), IsEmpty());
  EXPECT_EQ(session->startDate(), std::nullopt);
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
}

TEST_F(QVReportingOrientationTest, IsNotReportedByAGenericSession) {
  const auto session = makeStartedSession(7, 0);
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*session), IsEmpty());
  session->stop();
  EXPECT_THAT(orientation().calls(), IsEmpty());
}

// ---- registration

TEST_F(QVReportingOrientationTest, RegistersUnderItsReporterIDFromStartToStop) {
  makeSessionsVerbose();
  const auto session = makeSession(-42, kLongFormAudio);
  journal_.forget();
  const auto starting = sessionLine(debug, "start", "starting session owned by -42");
  const auto ending = sessionLine(debug, "stop", "ending session -42");
  advance(5s);
  session->start();
  EXPECT_THAT(takeJournal(), ElementsAre(starting, traceEntry(kTraceSessionStarted),
                                         "register device QVReportingService -42",
                                         "register ui QVReportingService -42"));
  EXPECT_EQ(session->orientationCallbackID(), "QVReportingService -42");
  EXPECT_EQ(session->startDate(), QVFakeClock::kStart + 5s);
  session->start();
  EXPECT_THAT(takeJournal(),
              ElementsAre(starting, sessionLine(info, "start", "-42 is already started")));
  session->stop();
  EXPECT_THAT(takeJournal(), ElementsAre(ending, "unregister device QVReportingService -42",
                                         "unregister ui QVReportingService -42", ending,
                                         traceEntry(kTraceSessionStopped)));
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
  EXPECT_EQ(session->startDate(), QVFakeClock::kStart + 5s) << "stays until the next start";
  session->stop();
  EXPECT_THAT(takeJournal(), ElementsAre(ending)) << "there is nothing left to end";
}

TEST_F(QVReportingOrientationTest, UnregistersNothingOfASessionThatWasNeverStarted) {
  makeSessionsVerbose();
  const auto session = makeSession();
  ASSERT_TRUE(session->shouldReportOrientation());
  journal_.forget();
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(), ElementsAre(sessionLine(debug, "stop", "ending session 7")));
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
}

TEST_F(QVReportingOrientationTest, RegistersAnewWithEachStart) {
  const auto session = makeStartedSession();
  session->stop();
  advance(3s);
  session->start();
  EXPECT_EQ(session->startDate(), QVFakeClock::kStart + 3s);
  EXPECT_THAT(orientation().deviceCallbackIDs(), ElementsAre("QVReportingService 7"));
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*session),
              ElementsAre("device_orientation=normal device_orientation_time=0"));
}

TEST_F(QVReportingOrientationTest, StaysRegisteredWhereTheTypeChangedBeforeTheStop) {
  const auto session = makeStartedSession();
  session->setServiceType(1);
  session->stop();
  EXPECT_THAT(takeJournal(),
              ElementsAre(sessionLine(info, "setServiceType:", "setting service type voxa"),
                          traceEntry(kTraceSessionStopped)));
  EXPECT_EQ(session->orientationCallbackID(), "QVReportingService 7");
  EXPECT_THAT(orientation().deviceCallbackIDs(), ElementsAre("QVReportingService 7"));
  EXPECT_THAT(orientation().uiCallbackIDs(), ElementsAre("QVReportingService 7"));
  session->setServiceType(kTelephony);
  session->stop();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(sessionLine(info, "setServiceType:", "setting service type telephony"),
                  "unregister device QVReportingService 7", "unregister ui QVReportingService 7"))
      << "also when it is not started";
  EXPECT_EQ(session->orientationCallbackID(), std::nullopt);
  EXPECT_THAT(orientation().deviceCallbackIDs(), IsEmpty());
  EXPECT_THAT(orientation().uiCallbackIDs(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, RegistersNothingWhereTheTypeChangesOnlyAfterTheStart) {
  const auto session = makeStartedSession(7, 1);
  session->setServiceType(kTelephony);
  session->stop();
  EXPECT_THAT(orientation().calls(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, KeepsTheSessionUntilItIsStopped) {
  auto session = makeStartedSession();
  const std::weak_ptr<QVReportingSession> watched = session;
  session.reset();
  EXPECT_FALSE(watched.expired()) << "dropping it does not unregister";
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*watched.lock()), SizeIs(1));
  watched.lock()->stop();
  runUntilIdle();
  EXPECT_TRUE(watched.expired());
}

TEST_F(QVReportingOrientationTest, EndsWithTheClientsConnection) {
  QVTestClient& client = clientWithStartedSession(42, 7, kTelephony);
  const std::weak_ptr<QVReportingSession> session = client.session(7);
  EXPECT_THAT(orientation().uiCallbackIDs(), ElementsAre("QVReportingService 7"));
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(orientation().deviceCallbackIDs(), IsEmpty());
  EXPECT_THAT(orientation().uiCallbackIDs(), IsEmpty());
  EXPECT_TRUE(session.expired());
}

// ---- changes

TEST_F(QVReportingOrientationTest, RecordsChangesOfDeviceAndUserInterface) {
  const auto session = makeStartedSession();
  orientation().setDeviceOrientation(QVOrientation::kLeftUp);
  advance(1500ms);
  orientation().setUIOrientation(QVOrientation::kRightUp);
  advance(500ms);
  orientation().setDeviceOrientation(QVOrientation::kUndefined);
  orientation().setUIOrientation(99);
  EXPECT_THAT(recorded(*session),
              ElementsAre("device_orientation=left-up device_orientation_time=0",
                          "ui_orientation=right-up ui_orientation_time=1.5",
                          "device_orientation=undefined device_orientation_time=2",
                          "ui_orientation=undefined ui_orientation_time=2"));
  EXPECT_TRUE(session->nestedAggregatedPayloadData()->empty()) << "no member of the session's file";
  EXPECT_THAT(session->messageTypeCounts(), IsEmpty()) << "and no message";
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, RecordsATextAndAFloatingPointNumber) {
  const auto session = makeStartedSession();
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  std::vector<QVValue::Kind> kinds;
  session->aggregatedPayloadData()->forEach(
      [&kinds](std::string_view, const QVReportingPayloadArray::Payload& payload) {
        for (const auto& entry : payload.entries) kinds.push_back(entry.value.kind());
      });
  EXPECT_THAT(kinds, ElementsAre(QVValue::Kind::string, QVValue::Kind::real));
}

TEST_F(QVReportingOrientationTest, RoundsTheTimeToMillisecondsHalvesAwayFromZero) {
  const auto session = makeStartedSession();
  int32_t value = QVOrientation::kUndefined;
  const auto timeAfter = [&](QVDuration elapsed) {
    platform_.clock().setCurrentDate(QVFakeClock::kStart +
                                     std::chrono::duration_cast<QVDate::duration>(elapsed));
    value = value == QVOrientation::kNormal ? QVOrientation::kLeftUp : QVOrientation::kNormal;
    orientation().setUIOrientation(value);
    const std::string entry = recorded(*session).back();
    return entry.substr(entry.rfind('=') + 1);
  };
  EXPECT_EQ(timeAfter(1234600us), "1.235");
  EXPECT_EQ(timeAfter(1234400us), "1.234");
  EXPECT_EQ(timeAfter(62500us), "0.063") << "a half that a double holds exactly";
  EXPECT_EQ(timeAfter(187500us), "0.188");
  EXPECT_EQ(timeAfter(400us), "0");
  EXPECT_EQ(timeAfter(30h), "108000");
  EXPECT_EQ(timeAfter(-1234600us), "1.235") << "never negative, also when the date was set back";
}

TEST_F(QVReportingOrientationTest, WritesEachChangeWhenVerbose) {
  makeSessionsVerbose();
  const auto session = makeSession(-42);
  session->setConfiguration({{"HostApplicationDisplayID", "net.example.player"}});
  session->start();
  runUntilIdle();
  journal_.forget();
  platform_.log().clear();
  advance(1235ms);
  orientation().setDeviceOrientation(QVOrientation::kBottomUp);
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(
          sessionLine(debug, "start",
                      R"(Orientation handler callback mode=device orientation="bottom-up" )"
                      R"(app="net.example.player", time=1.235, id="QVReportingService -42")"),
          sessionLine(debug, "start",
                      R"(Orientation handler callback mode=ui orientation="normal" )"
                      R"(app="net.example.player", time=1.235, id="QVReportingService -42")")));
  EXPECT_EQ(platform_.log().lines().at(0).file, "QVReportingSessionOrientation.cpp");
}

TEST_F(QVReportingOrientationTest, WritesWhateverTheApplicationIs) {
  makeSessionsVerbose();
  const auto session = makeStartedSession();
  orientation().setUIOrientation(QVOrientation::kNormal);
  session->setConfiguration({{"HostApplicationDisplayID", 12}});
  orientation().setUIOrientation(QVOrientation::kLeftUp);
  const auto line = [](std::string_view text, std::string_view application) {
    return sessionLine(debug, "start",
                       QVText("Orientation handler callback mode=ui orientation=\"", text,
                              "\" app=\"", application, "\", time=0, id=\"QVReportingService 7\""));
  };
  EXPECT_THAT(takeJournal(), ElementsAre(line("normal", "(null)"), line("left-up", "12")));
}

TEST_F(QVReportingOrientationTest, MakesColumnsOfTheSummaryEvent) {
  const auto session = makeStartedSession();
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  advance(2s);
  orientation().setDeviceOrientation(QVOrientation::kLeftUp);
  orientation().setUIOrientation(QVOrientation::kRightUp);
  session->sendMessage({{"a", 1}}, kSessionPlayback, kStart, {});
  session->stop();
  runUntilIdle();
  EXPECT_THAT(
      takeBeaconStory(),
      ElementsAre(R"(message 1: 3/1 {"a":1})",
                  R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"2","a":"1",)"
                  R"("device_orientation":"normal,left-up","device_orientation_time":"0,2",)"
                  R"("ui_orientation":"right-up","ui_orientation_time":"2"})",
                  "flush 1", "end 1"));
}

TEST_F(QVReportingOrientationTest, MakesASummaryEventWithoutAnyMessage) {
  const auto session = makeStartedSession();
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  advance(1500ms);
  orientation().setDeviceOrientation(QVOrientation::kLeftUp);
  orientation().setUIOrientation(QVOrientation::kRightUp);
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeJournal(),
              ElementsAre("unregister device QVReportingService 7",
                          "unregister ui QVReportingService 7", traceEntry(kTraceSessionStopped),
                          sessionLine(standard, "stop", "sending summary event for reporter 7"),
                          traceEntry(kTraceMessageSent)));
  EXPECT_THAT(
      takeBeaconStory(),
      ElementsAre(R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"2",)"
                  R"("device_orientation":"normal,left-up","device_orientation_time":"0,1.5",)"
                  R"("ui_orientation":"right-up","ui_orientation_time":"1.5"})",
                  "flush 1", "end 1"));
}

TEST_F(QVReportingOrientationTest, MakesColumnsOfWhatTurnedAlone) {
  const auto session = makeStartedSession();
  advance(250ms);
  orientation().setDeviceOrientation(QVOrientation::kBottomUp);
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre(R"(message 1: 65535/65535 {"QV_Session_Summary_Event":"2",)"
                          R"("device_orientation":"bottom-up","device_orientation_time":"0.25"})",
                          "flush 1", "end 1"));
}

TEST_F(QVReportingOrientationTest, IsNotRecordedOnceTheSessionHasStopped) {
  const auto session = makeStartedSession();
  session->setServiceType(1);
  session->stop();
  runUntilIdle();
  takeBeaconStory();
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_EQ(session->aggregatedPayloadData(), nullptr) << "the callback is still registered";
  session->stop();
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, IsRecordedByALaterStartWhereItStayedRegistered) {
  const auto session = makeStartedSession();
  session->setServiceType(1);
  session->stop();
  advance(2s);
  session->start();
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*session), ElementsAre("ui_orientation=normal ui_orientation_time=2"))
      << "the start of a session that does not report leaves the date as it is";
}

TEST_F(QVReportingOrientationTest, IsRecordedOnceByALaterStartThatRegistersAnew) {
  const auto session = makeStartedSession();
  session->setServiceType(1);
  session->stop();
  session->setServiceType(kTelephony);
  session->start();
  EXPECT_THAT(
      orientation().calls(),
      ElementsAre("register device QVReportingService 7", "register ui QVReportingService 7",
                  "unregister device QVReportingService 7", "unregister ui QVReportingService 7",
                  "register device QVReportingService 7", "register ui QVReportingService 7"));
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  orientation().setUIOrientation(QVOrientation::kLeftUp);
  EXPECT_THAT(recorded(*session), ElementsAre("device_orientation=normal device_orientation_time=0",
                                              "ui_orientation=left-up ui_orientation_time=0"));
  session->stop();
  EXPECT_THAT(orientation().deviceCallbackIDs(), IsEmpty());
  EXPECT_THAT(orientation().uiCallbackIDs(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, TellsSessionsOfTheSameReporterApart) {
  const auto first = makeStartedSession(7);
  const auto second = makeStartedSession(7);
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*first), SizeIs(1));
  EXPECT_THAT(recorded(*second), SizeIs(1));
  first->stop();
  EXPECT_THAT(orientation().uiCallbackIDs(), ElementsAre("QVReportingService 7"));
  orientation().setUIOrientation(QVOrientation::kLeftUp);
  EXPECT_THAT(recorded(*second), SizeIs(2)) << "the oldest registration of the ID was ended";
  second->stop();
  EXPECT_THAT(orientation().uiCallbackIDs(), IsEmpty());
}

TEST_F(QVReportingOrientationTest, EndsTheOldestRegistrationOfAReporterThatHasTwoSessions) {
  const auto first = makeStartedSession(7);
  const auto second = makeStartedSession(7);
  second->stop();
  EXPECT_THAT(orientation().uiCallbackIDs(), ElementsAre("QVReportingService 7"));
  orientation().setUIOrientation(QVOrientation::kNormal);
  EXPECT_THAT(recorded(*first), IsEmpty()) << "the stop of the other ended its registration";
  EXPECT_EQ(second->aggregatedPayloadData(), nullptr) << "what is registered records nothing";
  first->stop();
  EXPECT_THAT(orientation().deviceCallbackIDs(), IsEmpty());
  EXPECT_THAT(orientation().uiCallbackIDs(), IsEmpty());
}

// Shows nothing by itself but what was recorded; the thread sanitizer watches it.
TEST_F(QVReportingOrientationTest, ComesFromAThreadOfItsOwnWhileTheSessionStartsAndStops) {
  constexpr int kChanges = 500;
  const auto session = makeSession();
  session->start();
  std::thread turning([this] {
    for (int change = 1; change <= kChanges; ++change) orientation().setDeviceOrientation(change);
  });
  for (int round = 0; round < 50; ++round) {
    session->sendMessage({{"n", round}}, kSessionPlayback, kStart, {});
    session->stop();
    session->start();
  }
  turning.join();
  const auto before = recorded(*session).size();
  orientation().setDeviceOrientation(QVOrientation::kNormal);
  EXPECT_EQ(recorded(*session).size(), before + 1);
  session->stop();
  EXPECT_THAT(orientation().deviceCallbackIDs(), IsEmpty());
}

}  // namespace
