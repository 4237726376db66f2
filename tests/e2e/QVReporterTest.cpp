// Programs that keep their connection, with the real service: it is killed, stopped, switched off,
// and the examples run against it.

#include "client/QVReporter.h"
#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <filesystem>
#include <fstream>
#include <memory>

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;
using Code = QVClientError::Code;

constexpr std::chrono::milliseconds kPatience{60'000};
constexpr QVClientCategory kPlayback{QVClientComponent::session, QVClientKind::playback};

class QVReporterTest : public QVEndToEndTest {
 protected:
  void open(std::size_t maximumQueuedMessages = 16'384) {
    QVReporterOptions options;
    options.socketPath = root_.socket();
    options.configurationDirectory = root_.configuration();
    options.runtimeDirectory = root_.runtime();
    options.maximumQueuedMessages = maximumQueuedMessages;
    options.shortestReconnectDelay = std::chrono::milliseconds(1);
    options.longestReconnectDelay = std::chrono::milliseconds(50);
    options.endTimeLimit = std::chrono::milliseconds(0);
    auto opened = QVReporter::open(std::move(options));
    ASSERT_TRUE(opened) << opened.error().text();
    reporter_ = std::move(opened.value());
  }
  std::unique_ptr<QVReporterSession> startSession(int64_t reporterID) {
    auto opened = reporter_->openSession(
        {.reporterID = reporterID, .serviceType = QVClientServiceType::telephony});
    EXPECT_TRUE(opened) << opened.error().text();
    EXPECT_EQ(opened.value()->start(), Code::none);
    return std::move(opened.value());
  }
  static Code send(QVReporterSession& session, int64_t number) {
    QVClientPayload payload;
    payload.set("n", number);
    return session.sendMessage(payload, kPlayback, QVClientMessageType::generic);
  }
  void flush() { EXPECT_EQ(reporter_->flush(kPatience), Code::none); }

  // Switches reporting and returns when the service has heard of it.
  void switchReporting(bool on) {
    root_.configure("preferences/net.quillon.quietvox.json",
                    on ? "{}" : R"({"disable_reporting": true})");
    std::ofstream(root_.runtime() / "notify" / "net.quillon.quietvox.reporting") << "posted";
    expectLogged(on ? R"(defaults {"disable_reporting":0})"
                    : R"(defaults {"disable_reporting":true})");
  }
  // The messages of a session but its summary, in their order.
  std::vector<std::string> messages(int64_t reporterID) const {
    return store().rows("SELECT payload FROM beacon_message WHERE category = 3 AND session_id = " +
                        std::to_string(reporterID) + " ORDER BY id");
  }
  // A program that finds this service.
  QVSubprocess::Output runCommand(const std::vector<std::string>& program) {
    std::vector<std::string> command{
        "env", "QUIETVOX_SOCKET=" + root_.socket().string(),
        "QUIETVOX_RUNTIME_DIRECTORY=" + root_.runtime().string(),
        "QUIETVOX_CONFIGURATION_DIRECTORY=" + root_.configuration().string()};
    command.insert(command.end(), program.begin(), program.end());
    return QVSubprocess::run(command);
  }
  // One of the build.
  QVSubprocess::Output run(const std::string& program, const std::string& argument = {}) {
    std::vector<std::string> command{QVDaemonProcess::program(program)};
    if (!argument.empty()) command.push_back(argument);
    return runCommand(command);
  }

  std::unique_ptr<QVReporter> reporter_;
};

TEST_F(QVReporterTest, ReportsASession) {
  service();
  open();
  auto session = startSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  EXPECT_EQ(send(*session, 2), Code::none);
  session.reset();
  flush();
  EXPECT_EQ(reporter_->counters().sent, 2U);
  endService();
  EXPECT_THAT(messages(7), ElementsAre(R"({"n":1})", R"({"n":2})"));
  EXPECT_THAT(store().rows("SELECT user_info FROM beacon_session WHERE session_id = 7"),
              ElementsAre(HasSubstr("telephony_session")));
}

TEST_F(QVReporterTest, RestoresItsSessionsWhenTheServiceWasKilled) {
  service();
  open();
  const auto started = startSession(7);
  const auto stopped = startSession(8);
  QVClientPayload configuration;
  configuration.set("room", "kitchen");
  EXPECT_EQ(started->setConfiguration(configuration), Code::none);
  EXPECT_EQ(send(*started, 1), Code::none);
  EXPECT_EQ(stopped->stop(), Code::none);
  flush();
  service().signal(SIGKILL);
  ASSERT_EQ(service().wait(), -SIGKILL);
  forgetService();
  const std::string created = "session created for reporter 8";
  const std::size_t before = log().count(created);

  service();
  // Nobody asks for it: the sessions are there again.
  expectLogged(created, before + 1);
  EXPECT_EQ(send(*started, 2), Code::none);
  EXPECT_EQ(started->stop(), Code::none);
  flush();
  // A process that is being killed may still take a connection.
  EXPECT_GE(reporter_->counters().connections, 2U);
  QVPeerClient other(root_.socket());
  EXPECT_THAT(other.reporters(), ElementsAre(7, 8));
  EXPECT_EQ(other.serviceType(8), 2);
  endService();
  EXPECT_THAT(messages(7), ::testing::Contains(R"({"n":2})"));
  EXPECT_THAT(store().rows("SELECT user_info FROM beacon_session WHERE session_id = 7 "
                           "ORDER BY id DESC LIMIT 1"),
              ElementsAre(HasSubstr(R"("room":"kitchen")")));
}

TEST_F(QVReporterTest, LosesNothingWhenTheServiceEndsInGoodOrder) {
  service();
  open();
  const auto session = startSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  flush();
  endService();
  forgetService();
  for (int i = 2; i <= 500; ++i) EXPECT_EQ(send(*session, i), Code::none);
  service();
  flush();
  endService();
  const auto counters = reporter_->counters();
  // What left before the loss was noticed is counted; all else is there.
  EXPECT_EQ(counters.sent + counters.dropped.of(QVDropReason::connectionLost), 500U);
  EXPECT_EQ(messages(7).size(), counters.sent);
  EXPECT_EQ(messages(7).back(), R"({"n":500})");
}

TEST_F(QVReporterTest, SendsNothingWhileReportingIsOff) {
  service();
  open();
  const auto session = startSession(7);
  EXPECT_EQ(send(*session, 1), Code::none);
  flush();
  switchReporting(false);
  // The service has heard of it; the reporter has when it says so.
  while (send(*session, 2) != Code::disabled) {
  }
  EXPECT_FALSE(reporter_->isReportingEnabled());
  flush();
  const uint64_t sentBefore = reporter_->counters().sent;
  switchReporting(true);
  while (send(*session, 3) != Code::none) {
  }
  flush();
  EXPECT_EQ(reporter_->counters().sent, sentBefore + 1);
  EXPECT_GE(reporter_->counters().dropped.of(QVDropReason::disabled), 1U);
  endService();
  EXPECT_THAT(messages(7), ElementsAre(R"({"n":1})", R"({"n":3})"));
}

TEST_F(QVReporterTest, KnowsTheSwitchBeforeTheServiceRuns) {
  // The service itself reads it when it is posted; a program that starts goes by it at once.
  root_.configure("preferences/net.quillon.quietvox.json", R"({"disable_reporting": true})");
  open();
  const auto session = startSession(7);
  EXPECT_EQ(send(*session, 1), Code::disabled);
  service();
  flush();
  // The service's directory of notifications is new, and heard all the same.
  switchReporting(true);
  while (send(*session, 2) != Code::none) {
  }
  flush();
  endService();
  EXPECT_THAT(messages(7), ElementsAre(R"({"n":2})"));
}

TEST_F(QVReporterTest, AServiceThatHangsBlocksNobody) {
  service();
  open(100);
  auto session = startSession(7);
  flush();
  service().signal(SIGSTOP);
  uint64_t taken = 0;
  while (send(*session, 1) == Code::none) ++taken;
  // What may be under way and what may be queued.
  EXPECT_LE(taken, 256U + 100U);
  EXPECT_LE(reporter_->counters().queuedMessages, 100U);
  EXPECT_GE(reporter_->counters().dropped.of(QVDropReason::queueFull), 1U);
  EXPECT_EQ(session->stop(), Code::none);
  EXPECT_EQ(reporter_->flush(std::chrono::milliseconds(0)), Code::timedOut);

  service().signal(SIGCONT);
  flush();
  EXPECT_EQ(reporter_->counters().sent, taken);
  session.reset();
  endService();
  EXPECT_EQ(messages(7).size(), taken);
}

TEST_F(QVReporterTest, EndsInTimeWhileTheServiceHangs) {
  service();
  open();
  const auto session = startSession(7);
  flush();
  service().signal(SIGSTOP);
  EXPECT_EQ(send(*session, 1), Code::none);
  reporter_.reset();
  service().signal(SIGCONT);
  endService();
}

TEST_F(QVReporterTest, ARealtimeQueueReachesTheStore) {
  service();
  open();
  const auto session = startSession(7);
  const auto queue = std::move(session->makeRealtimeQueue().value());
  for (int i = 1; i <= 200; ++i) {
    QVClientPayload* message = queue->begin();
    ASSERT_NE(message, nullptr);
    message->set("n", i);
    ASSERT_TRUE(queue->commit(kPlayback, QVClientMessageType::generic));
  }
  EXPECT_EQ(session->stop(), Code::none);
  flush();
  endService();
  EXPECT_EQ(messages(7).size(), 200U);
  EXPECT_EQ(messages(7).back(), R"({"n":200})");
}

// ---- Examples

TEST_F(QVReporterTest, TheTenLinesReport) {
  service();
  for (const char* program : {"qv-ten-lines", "qv-ten-lines-c"}) {
    const auto output = run(program);
    EXPECT_EQ(output.status, 0) << output.text;
  }
  endService();
  const std::string message = R"({"frames":480,"route":"speaker"})";
  EXPECT_THAT(store().rows("SELECT payload FROM beacon_message WHERE category = 3 AND type = 1"),
              ElementsAre(message, message));
  EXPECT_THAT(store().rows("SELECT * FROM loss"), IsEmpty());
}

TEST_F(QVReporterTest, ThePlayerInCReports) {
  service();
  const auto output = run("quietvox-player", "250");
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_EQ(output.text, "sent 27, dropped 0\n");
  endService();
  EXPECT_THAT(store().rows("SELECT user_info FROM beacon_session"),
              ElementsAre(HasSubstr(R"("channels":["left","right"])")));
  EXPECT_THAT(store().rows("SELECT type, payload FROM beacon_message WHERE category = 3"),
              ElementsAre(R"(1|{"frames":0})", R"(2|{"frames":120000})"));
  const auto progress =
      store().rows("SELECT payload FROM beacon_message WHERE category = 10 ORDER BY id");
  EXPECT_EQ(progress.size(), 25U);
  EXPECT_THAT(progress, Each(EndsWith(R"("volume":0.8,"xruns":0})")));
}

TEST_F(QVReporterTest, ThePlayerInCSaysWhatIsWrong) {
  const auto usage = run("quietvox-player", "many");
  EXPECT_EQ(usage.status, 2);
  EXPECT_THAT(usage.text, HasSubstr("usage: quietvox-player"));
  root_.configure("preferences/net.quillon.quietvox.json", R"({"disable_reporting": true})");
  service();
  const auto off = run("quietvox-player", "10");
  EXPECT_EQ(off.status, 1) << off.text;
  EXPECT_THAT(off.text, AllOf(HasSubstr("sent 0, dropped 1\n"),
                              HasSubstr("quietvox-player: reporting is switched off\n")));
}

// ---- Another language

// No part of the library's is compiled here. (An interpreter that is not instrumented cannot load
// an instrumented library; the presets with sanitizers run none of these tests.)
TEST_F(QVReporterTest, ReportsByForeignFunctionCallsAlone) {
  service();
  const auto output =
      runCommand({"/usr/bin/python3", QV_PEER_SCRIPTS "/quietvox_ctypes.py", QV_CLIENT_LIBRARY});
  EXPECT_EQ(output.status, 0) << output.text;
  EXPECT_EQ(output.text,
            "open no error\n"
            "enabled 1\n"
            "session no error\n"
            "reporter 7\n"
            "configure no error\n"
            "start no error\n"
            "open array the payload is not in order\n"
            "send no error\n"
            "queue no error\n"
            "commit no error\n"
            "stop no error\n"
            "flush no error\n"
            "counters no error\n"
            "sent 2 invalid 1\n"
            "told of 1\n"
            "nothing an argument is out of its limits\n");
  endService();
  EXPECT_THAT(store().rows("SELECT user_info FROM beacon_session WHERE session_id = 7"),
              ElementsAre(AllOf(HasSubstr(R"("HostApplicationDisplayID":"net.example.ctypes")"),
                                HasSubstr("telephony_session"))));
  EXPECT_THAT(messages(7),
              UnorderedElementsAre(R"({"frames":480,"levels":[-3.5]})", R"({"frames":960})"));
  EXPECT_THAT(store().rows("SELECT * FROM loss"), IsEmpty());
}

}  // namespace
