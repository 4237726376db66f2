// The file that a session writes when it stops on an internal build.

#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "tests/support/QVServiceFixture.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <chrono>
#include <cmath>

namespace {

using namespace std::chrono_literals;
using enum QVLogLevel;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::Pair;
using testing::SizeIs;
using Step = QVFakeFileSystem::Step;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kTest = 11;
constexpr uint16_t kNameless = 13;

const std::string kDirectory = "/logs/DiagnosticLogs/Audio/Reporting";

class QVReportingSummaryFileTest : public QVServiceFixture {
 protected:
  QVReportingSummaryFileTest() { makeInternalBuild(); }

  std::shared_ptr<QVReportingSession> makeSession(const QVDictionary& configuration = {},
                                                  uint16_t serviceType = kTelephony,
                                                  int64_t reporterID = 7) {
    auto session = QVReportingSession::initWithID(reporterID, {42});
    session->setServiceType(serviceType);
    session->setConfiguration(configuration);
    return session;
  }
  std::shared_ptr<QVReportingSession> makeStartedSession(const QVDictionary& configuration = {},
                                                         uint16_t serviceType = kTelephony,
                                                         int64_t reporterID = 7) {
    auto session = makeSession(configuration, serviceType, reporterID);
    session->start();
    runUntilIdle();
    journal_.forget();
    takeBeaconStory();
    return session;
  }
  static void send(QVReportingSession& session, const QVDictionary& message) {
    session.sendMessage(message, kSessionPlayback, kStart, {});
  }
  // A session that sends one message and stops.
  void runSession(const QVDictionary& configuration = {}, uint16_t serviceType = kTelephony) {
    const auto session = makeStartedSession(configuration, serviceType);
    send(*session, {{"a", 1}});
    session->stop();
  }
  // A stop of a telephony session with one message before it, whose file fails with these lines.
  void expectStopWithFailures(const std::shared_ptr<QVReportingSession>& session,
                              const std::vector<std::string>& failures) {
    journal_.forget();
    session->stop();
    std::vector<std::string> expected{
        "unregister device QVReportingService 7", "unregister ui QVReportingService 7",
        traceEntry(kTraceSessionStopped),
        sessionLine(standard, "stop", "sending summary event for reporter 7"),
        traceEntry(kTraceMessageSent)};
    for (const std::string& failure : failures) {
      expected.push_back(sessionLine(error, "writeSummaryJson", failure));
    }
    EXPECT_EQ(takeJournal(), expected);
    EXPECT_FALSE(session->started());
    runUntilIdle();
    EXPECT_EQ(takeBeaconStory().back(), "end 1") << "flushed as ever";
    EXPECT_EQ(files().openFiles(), 0u);
  }

  QVFakeFileSystem& files() { return platform_.fileSystem(); }
  std::vector<std::string> lines() { return platform_.log().renderings(); }
  // The names of the files in the directory, and nothing anywhere else.
  std::vector<std::string> names() {
    std::vector<std::string> names;
    for (const std::string& path : files().files()) {
      EXPECT_EQ(path.substr(0, path.rfind('/')), kDirectory);
      names.push_back(path.substr(path.rfind('/') + 1));
    }
    return names;
  }
  std::string onlyFile() {
    const std::vector<std::string> paths = files().files();
    EXPECT_THAT(paths, SizeIs(1));
    return paths.empty() ? "" : files().contents(paths[0]).value_or("");
  }
};

// ---- what is in the file

TEST_F(QVReportingSummaryFileTest, BeginsWithTheConfigurationAndEndsWithTheSummaryEvent) {
  const auto session = makeStartedSession({{"HostApplicationDisplayID", "net.quillon.player"}});
  send(*session, {{"buffer size", 480}, {"rate", 44100.0}});
  session->sendMessage({{"route", QVArray{"speaker", 2}}, {"ok", true}}, 0x08000001, 2, {});
  send(*session, {{"rate", 48000.0}});
  session->setConfiguration({{"late", 1}});
  session->stop();
  EXPECT_EQ(onlyFile(), R"([
  {
    "HostApplicationDisplayID": "net.quillon.player",
    "late": 1
  },
  {
    "Session_Playback_Start_1": {
      "buffer_size": 480,
      "rate": 44100.0
    }
  },
  {
    "Session_Generic_Stop_1": {
      "ok": true,
      "route": [
        "speaker",
        2
      ]
    }
  },
  {
    "Session_Playback_Start_2": {
      "rate": 48000.0
    }
  },
  {
    "Undefined_Unknown_1": {
      "QV_Session_Summary_Event": "2",
      "buffer_size": "480",
      "ok": "1",
      "rate": "44100,48000",
      "route": "[\"speaker\",2]"
    }
  }
])");
}

TEST_F(QVReportingSummaryFileTest, HasAnEmptyConfigurationWhereNoneWasGiven) {
  runSession();
  EXPECT_THAT(onlyFile(), testing::StartsWith("[\n  {},\n  {\n    \"Session_Playback_Start_1\""));
}

TEST_F(QVReportingSummaryFileTest, LacksWhatWasSentBeforeTheStart) {
  const auto session = makeSession();
  send(*session, {{"early", 1}});
  session->start();
  send(*session, {{"a", 1}});
  session->stop();
  EXPECT_THAT(onlyFile(), Not(HasSubstr("early")));
  EXPECT_THAT(onlyFile(), HasSubstr("Session_Playback_Start_2")) << "but it was counted";
}

TEST_F(QVReportingSummaryFileTest, CountsOnOverAStopAndANewStart) {
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  session->stop();
  advance(1s);
  session->start();
  send(*session, {{"b", 2}});
  session->stop();
  ASSERT_THAT(files().files(), SizeIs(2));
  const std::string second = files().contents(files().files()[1]).value();
  EXPECT_THAT(second, HasSubstr("\"Session_Playback_Start_2\""));
  EXPECT_THAT(second, HasSubstr("\"Undefined_Unknown_2\""));
  EXPECT_THAT(second, Not(HasSubstr("\"a\"")));
}

TEST_F(QVReportingSummaryFileTest, HasNoOrientationEntries) {
  const auto session = makeStartedSession();
  platform_.orientation().setDeviceOrientation(QVOrientation::kNormal);
  send(*session, {{"a", 1}});
  session->stop();
  EXPECT_EQ(onlyFile(), R"([
  {},
  {
    "Session_Playback_Start_1": {
      "a": 1
    }
  },
  {
    "Undefined_Unknown_1": {
      "QV_Session_Summary_Event": "2",
      "a": "1",
      "device_orientation": "normal",
      "device_orientation_time": "0"
    }
  }
])");
}

// The summary event is sent, and so recorded, before the file is written.
TEST_F(QVReportingSummaryFileTest, HoldsTheSummaryAloneWhereOnlyTheOrientationChanged) {
  const auto session = makeStartedSession();
  platform_.orientation().setUIOrientation(QVOrientation::kNormal);
  session->stop();
  EXPECT_EQ(onlyFile(), R"([
  {},
  {
    "Undefined_Unknown_1": {
      "QV_Session_Summary_Event": "2",
      "ui_orientation": "normal",
      "ui_orientation_time": "0"
    }
  }
])");
}

TEST_F(QVReportingSummaryFileTest, IsWrittenForTestSessionsToo) {
  runSession({}, kTest);
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-unknown-test.json"));
}

// ---- when there is a file

TEST_F(QVReportingSummaryFileTest, IsNotWrittenForASessionWithoutMessages) {
  const auto session = makeStartedSession();
  session->stop();
  EXPECT_THAT(takeJournal(),
              ElementsAre("unregister device QVReportingService 7",
                          "unregister ui QVReportingService 7", traceEntry(kTraceSessionStopped)));
  EXPECT_THAT(files().files(), IsEmpty());
  EXPECT_EQ(files().permissions(kDirectory), std::nullopt);
}

TEST_F(QVReportingSummaryFileTest, IsNotWrittenWhereNothingWasNamed) {
  const auto session = makeStartedSession();
  platform_.orientation().setDeviceOrientation(QVOrientation::kNormal);
  ASSERT_EQ(session->aggregatedPayloadData()->size(), 1u);
  session->writeSummaryJson();
  EXPECT_TRUE(session->nestedAggregatedPayloadData()->empty());
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, IsNotWrittenAfterAStop) {
  const auto session = makeStartedSession();
  session->stop();
  session->writeSummaryJson();
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, PutsTheConfigurationBeforeWhatWasRecorded) {
  const auto session = makeStartedSession({{"c", 1}});
  send(*session, {{"a", 1}});
  const auto nested = session->nestedAggregatedPayloadData();
  const auto aggregated = session->aggregatedPayloadData();
  session->stop();
  EXPECT_THAT(entriesOf(*nested),
              ElementsAre(Pair("", QVDictionary{{"c", 1}}),
                          Pair("Session_Playback_Start_1", QVDictionary{{"a", 1}}),
                          Pair("Undefined_Unknown_1", testing::_)));
  EXPECT_EQ(aggregated->size(), 2u) << "only the one array is changed";
}

TEST_F(QVReportingSummaryFileTest, IsNotWrittenOnOtherBuilds) {
  for (const QVValue& answer : {QVValue(false), QVValue()}) {
    QVFakePlatform other;
    if (!answer.isAbsent()) other.deviceInformation().setAnswer("InternalBuild", answer);
    const auto session = QVReportingSession::initWithID(7, {42});
    session->setConfiguration({{"c", 1}});
    session->start();
    send(*session, {{"a", 1}});
    const auto nested = session->nestedAggregatedPayloadData();
    session->stop();
    EXPECT_THAT(other.fileSystem().files(), IsEmpty());
    EXPECT_EQ(other.fileSystem().permissions("/logs"), std::nullopt);
    EXPECT_THAT(entriesOf(*nested), ElementsAre(Pair("Session_Playback_Start_1", testing::_),
                                                Pair("Undefined_Unknown_1", testing::_)));
  }
}

// ---- its place and name

TEST_F(QVReportingSummaryFileTest, LiesInADirectoryThatEverybodyMayWriteTo) {
  runSession();
  for (const char* path : {"/logs/DiagnosticLogs/Audio/Reporting", "/logs/DiagnosticLogs/Audio",
                           "/logs/DiagnosticLogs", "/logs"}) {
    EXPECT_EQ(files().permissions(path), 0777u) << path;
  }
}

TEST_F(QVReportingSummaryFileTest, LeavesDirectoriesThatAreThereAlone) {
  ASSERT_EQ(files().createDirectory("/logs/DiagnosticLogs", 0750), std::nullopt);
  runSession();
  EXPECT_EQ(files().permissions("/logs/DiagnosticLogs"), 0750u);
  EXPECT_EQ(files().permissions(kDirectory), 0777u);
  EXPECT_THAT(names(), SizeIs(1));
}

TEST_F(QVReportingSummaryFileTest, IsNamedAfterDateApplicationAndService) {
  runSession({{"HostApplicationDisplayID", "net.quillon.player"}});
  EXPECT_THAT(names(),
              ElementsAre("20240102-030405+0000-quietvox-net.quillon.player-telephony.json"));
}

TEST_F(QVReportingSummaryFileTest, IsNamedUnknownWithoutAnApplication) {
  runSession({{"other", "net.quillon.player"}});
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-unknown-telephony.json"));
}

TEST_F(QVReportingSummaryFileTest, IsNamedByTheTextOfAnApplicationOfAnotherKind) {
  runSession({{"HostApplicationDisplayID", 12.0}});
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-12-telephony.json"));
}

TEST_F(QVReportingSummaryFileTest, SaysWhereTheServiceHasNoName) {
  runSession({}, kNameless);
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-unknown-(null).json"));
}

TEST_F(QVReportingSummaryFileTest, SaysWhereTheServiceWasNeverSet) {
  const auto session = QVReportingSession::initWithID(7, {42});
  session->start();
  send(*session, {{"a", 1}});
  session->stop();
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-unknown-unknown.json"));
}

TEST_F(QVReportingSummaryFileTest, StaysInItsDirectoryWhateverTheApplicationIsCalled) {
  runSession({{"HostApplicationDisplayID", "../../../etc/passwd"}});
  advance(1s);
  runSession({{"HostApplicationDisplayID", std::string_view("a\0b/c", 5)}});
  EXPECT_THAT(names(),
              ElementsAre("20240102-030405+0000-quietvox-.._.._.._etc_passwd-telephony.json",
                          "20240102-030406+0000-quietvox-a_b_c-telephony.json"));
}

TEST_F(QVReportingSummaryFileTest, LeavesTheApplicationsNameAsItIsInTheFile) {
  runSession({{"HostApplicationDisplayID", "net/quillon"}});
  EXPECT_THAT(onlyFile(), HasSubstr("\"HostApplicationDisplayID\": \"net/quillon\""));
}

TEST_F(QVReportingSummaryFileTest, ReplacesThatOfTheSameSecondApplicationAndService) {
  runSession({{"run", 1}});
  platform_.clock().advance(999ms);
  runSession({{"run", 2}});
  EXPECT_THAT(onlyFile(), HasSubstr("\"run\": 2"));
  platform_.clock().advance(1ms);
  runSession({{"run", 3}});
  EXPECT_THAT(names(), SizeIs(2));
}

TEST_F(QVReportingSummaryFileTest, IsNamedAfterTheTimeOfTheStop) {
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  advance(60s);
  session->stop();
  EXPECT_THAT(names(), ElementsAre(HasSubstr("20240102-030505+0000")));
}

TEST_F(QVReportingSummaryFileTest, IsNamedAfterLocalTime) {
  struct Zone {
    QVDate date;
    std::chrono::seconds offset;
    const char* name;
  };
  using std::chrono::sys_days;
  const Zone zones[] = {
      {sys_days(2026y / 11 / 16) + 6h + 13min, 0s, "20261116-061300+0000"},
      {sys_days(2026y / 11 / 16) + 6h + 13min, 5h + 45min, "20261116-115800+0545"},
      {sys_days(2026y / 11 / 16) + 6h + 13min, -3h - 30min, "20261116-024300-0330"},
      {sys_days(2026y / 11 / 16) + 6h + 13min, -30min, "20261116-054300-0030"},
      // Another day, month and year.
      {sys_days(2023y / 12 / 31) + 23h + 59min + 59s, 14h, "20240101-135959+1400"},
      {sys_days(2024y / 3 / 1), -12h, "20240229-120000-1200"},
      {sys_days(1970y / 1 / 1), -1h, "19691231-230000-0100"},
      // Zones of old have seconds, for which the name has no place.
      {sys_days(1890y / 1 / 1), 53min + 28s, "18900101-005328+0053"},
      {sys_days(1890y / 1 / 1), -30s, "18891231-235930+0000"},
      // The first and last moments that there are.
      {QVDate::min(), -12h, "16770920-121243-1200"},
      {QVDate::max(), 14h, "22620412-134716+1400"},
  };
  for (const Zone& zone : zones) {
    platform_.clock().setCurrentDate(zone.date);
    platform_.clock().setOffsetFromUTC(zone.offset);
    runSession();
    EXPECT_THAT(names(), Contains(QVText(zone.name, "-quietvox-unknown-telephony.json")));
  }
  EXPECT_THAT(names(), SizeIs(std::size(zones)));
}

// ---- when it fails

TEST_F(QVReportingSummaryFileTest, IsNotWrittenWhereAPayloadHasNoJSON) {
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  send(*session, {{"list", QVArray{QVDictionary{{"rate", std::nan("")}}}}});
  send(*session, {{"b", 1}});
  expectStopWithFailures(session,
                         {"dataWithJSONObject: Session_Playback_Start_2: \"rate\" is nan, which "
                          "JSON has no word for"});
  EXPECT_THAT(files().files(), IsEmpty());
  EXPECT_EQ(files().permissions(kDirectory), 0777u) << "it is made all the same";
}

TEST_F(QVReportingSummaryFileTest, IsNotWrittenWhereTheConfigurationHasNoJSON) {
  const auto session = makeStartedSession({{"gain", -INFINITY}});
  send(*session, {{"a", 1}});
  expectStopWithFailures(session,
                         {"dataWithJSONObject: \"gain\" is -inf, which JSON has no word for"});
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, KeepsTheOldFileWhereTheNewOneHasNoJSON) {
  runSession();
  const std::string old = onlyFile();
  const auto session = makeStartedSession();
  send(*session, {{"rate", std::nan("")}});
  session->stop();
  EXPECT_EQ(onlyFile(), old);
}

TEST_F(QVReportingSummaryFileTest, IsTriedWhereItsDirectoryCannotBeMade) {
  files().addFile("/logs", "a file");
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  expectStopWithFailures(
      session,
      {"can't create logging directory at /logs/DiagnosticLogs/Audio/Reporting: /logs: Not a "
       "directory",
       "jsonOutput writeToURL: /logs/DiagnosticLogs/Audio/Reporting/"
       "20240102-030405+0000-quietvox-unknown-telephony.json: Not a directory"});
  EXPECT_THAT(files().files(), ElementsAre("/logs"));
  EXPECT_EQ(files().contents("/logs"), "a file");
}

TEST_F(QVReportingSummaryFileTest, IsNotWrittenToARootThatIsReadOnly) {
  ASSERT_EQ(files().createDirectory("/logs", 0755), std::nullopt);
  files().fail(Step::createDirectory, std::errc::read_only_file_system);
  files().fail(Step::open, std::errc::read_only_file_system);
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  expectStopWithFailures(
      session, {"can't create logging directory at /logs/DiagnosticLogs/Audio/Reporting: "
                "/logs/DiagnosticLogs: Read-only file system",
                "jsonOutput writeToURL: /logs/DiagnosticLogs/Audio/Reporting/"
                "20240102-030405+0000-quietvox-unknown-telephony.json: Read-only file system"});
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, SaysThatThereIsNoJSONBeforeItSaysThatThereIsNoDirectory) {
  files().addFile("/logs", "a file");
  const auto session = makeStartedSession();
  send(*session, {{"rate", std::nan("")}});
  expectStopWithFailures(
      session,
      {"dataWithJSONObject: Session_Playback_Start_1: \"rate\" is nan, which JSON has no word for",
       "can't create logging directory at /logs/DiagnosticLogs/Audio/Reporting: /logs: Not a "
       "directory"});
}

TEST_F(QVReportingSummaryFileTest, IsGivenUpWhereTheDiskIsFull) {
  files().fail(Step::write, std::errc::no_space_on_device, 100);
  const auto session = makeStartedSession();
  for (int i = 0; i < 100; ++i) send(*session, {{"i", i}});
  expectStopWithFailures(
      session, {"jsonOutput writeToURL: /logs/DiagnosticLogs/Audio/Reporting/"
                "20240102-030405+0000-quietvox-unknown-telephony.json: No space left on device"});
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, IsGivenUpWhereItCannotTakeItsPlace) {
  files().fail(Step::rename, std::errc::permission_denied);
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  expectStopWithFailures(
      session, {"jsonOutput writeToURL: /logs/DiagnosticLogs/Audio/Reporting/"
                "20240102-030405+0000-quietvox-unknown-telephony.json: Permission denied"});
}

TEST_F(QVReportingSummaryFileTest, IsGivenUpWhereTheApplicationsNameIsTooLong) {
  const std::string application(4'000, 'a');
  const auto session = makeStartedSession({{"HostApplicationDisplayID", application}});
  send(*session, {{"a", 1}});
  expectStopWithFailures(session,
                         {QVText("jsonOutput writeToURL: /logs/DiagnosticLogs/Audio/Reporting/"
                                 "20240102-030405+0000-quietvox-",
                                 application, "-telephony.json: File name too long")});
  EXPECT_THAT(files().files(), IsEmpty());
}

TEST_F(QVReportingSummaryFileTest, IsWrittenAgainWhenTheTroubleIsOver) {
  files().fail(Step::open, std::errc::permission_denied);
  runSession();
  files().recover(Step::open);
  runSession();
  EXPECT_THAT(names(), SizeIs(1));
}

// ---- beside the rest of the stop

TEST_F(QVReportingSummaryFileTest, IsThereBeforeTheSessionIsFlushed) {
  const auto session = makeStartedSession();
  send(*session, {{"a", 1}});
  session->stop();
  EXPECT_THAT(names(), SizeIs(1));
  EXPECT_THAT(takeBeaconStory(), IsEmpty());
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(),
              ElementsAre("message 1: 3/1 {\"a\":1}",
                          "message 1: 65535/65535 {\"QV_Session_Summary_Event\":\"2\",\"a\":\"1\"}",
                          "flush 1", "end 1"));
}

TEST_F(QVReportingSummaryFileTest, IsWrittenForASessionWhoseClientVanished) {
  QVTestClient& client = clientWithStartedSession(42, 7, kTelephony);
  client.send({{"a", 1}}, {7});
  client.disconnect();
  runUntilIdle();
  EXPECT_THAT(names(), ElementsAre("20240102-030405+0000-quietvox-unknown-telephony.json"));
}

}  // namespace
