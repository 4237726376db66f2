// What the service writes to its standard error.

#include "tests/e2e/QVEndToEndTest.h"

#include <regex>

#include <gmock/gmock.h>
#include <sys/prctl.h>

namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAre;

constexpr uint16_t kTelephony = 2;

class QVLogFormatTest : public QVEndToEndTest {
 protected:
  void runSession(QVPeerClient& client) {
    client.create(7, kTelephony);
    client.configure({{"HostApplicationDisplayID", "net.example\n<3>[qvrs] forged"}}, 7);
    client.start(7);
    client.sendMessage({{"note", "line\nbreak\x1b[31m\x7f"}}, {7});
    client.stop(7);
    client.destroy(7);
  }
  // The scope and text of each line, its place left out; every line must be in order.
  std::vector<std::string> entries() const {
    static const std::regex kLine(
        R"(^(<[3567]>\[(?:default|qv[a-z]{2})\]) [A-Za-z]+\.(?:cpp|h):[1-9][0-9]*:([^\n]+)$)");
    std::vector<std::string> found;
    for (const std::string& line : log().lines()) {
      std::smatch parts;
      if (std::regex_match(line, parts, kLine)) {
        found.push_back(parts[1].str() + " " + parts[2].str());
      } else {
        ADD_FAILURE() << "not a log line: " << line;
      }
    }
    return found;
  }
};

TEST_F(QVLogFormatTest, TellsASessionsLife) {
  const std::string pid = std::to_string(::getpid());
  {
    auto client = connectClient();
    runSession(client);
  }
  expectLogged("dealloc ");
  endService();

  std::vector<std::string> connection;
  std::vector<std::string> server;
  std::vector<std::string> session;
  for (const std::string& line : entries()) {
    if (line.find("[qvrs]") != std::string::npos) {
      // Of the IPC thread, and of the server's queue.
      (line.find("ServiceDelegate") != std::string::npos ? connection : server).push_back(line);
    }
    // The store may be quicker than the wait for it, which is then not told of.
    if (line.find("[qvrr]") != std::string::npos &&
        line.find("QVReportingUtilityWait") == std::string::npos) {
      session.push_back(line);
    }
  }
  const std::string delegate =
      "<5>[qvrs] -[QVReportingServiceDelegate listener:shouldAcceptNewConnection:]: ";
  EXPECT_THAT(
      connection,
      ElementsAre(
          AllOf(StartsWith(delegate + "newConnection: "), HasSubstr(pid)),
          delegate + "InvalidationHandler: connection exited process=qv_e2e_tests uptime_sec=0"));
  const std::string instance = "<5>[qvrs] -[QVReportingServerInstance ";
  EXPECT_THAT(
      server,
      ElementsAre(
          instance + "initWithPID:delegate:]: new client with pid " + pid,
          instance + "createReportingSession:reply:]: session created for reporter 7",
          instance + "setServiceType:reportingSession:reply:]: service type 2 set for reporter  7",
          instance + "stopReportingSessionForID:reply:]: "
                     "nothing interesting to fetch from the drivers",
          instance + "stopReportingSessionForID:reply:]: stopping 7",
          instance + "destroyReportingSession:reply:]: destroying 7",
          instance + "handleConnectionError]: removing " + pid + " from the server client list",
          instance + "dealloc]: dealloc " + pid + " from the server client list"));
  const std::string prefix = "[qvrr] -[QVReportingSession ";
  EXPECT_THAT(
      session,
      UnorderedElementsAre(
          "<6>" + prefix + "initWithID:processIdentifiers:]: created reporting session for ID: 7",
          "<6>" + prefix + "setServiceType:]: setting service type telephony",
          "<5>" + prefix + "start]: List of backends [\"store\"]",
          "<5>" + prefix + "stop]: sending summary event for reporter 7",
          "<6>" + prefix + "dealloc]: deallocing this session 7"));
}

TEST_F(QVLogFormatTest, SaysMoreWhereThePreferencesWantIt) {
  root_.configure("preferences/net.quillon.quietvox.json",
                  R"({"reporting_server_verbose": true, "reporting_session_verbose": "yes"})");
  auto client = connectClient();
  runSession(client);
  client.isValid(7);
  endService();

  const std::string instance = "<7>[qvrs] -[QVReportingServerInstance ";
  const auto lines = entries();
  for (const char* text :
       {"createReportingSession:reply:]: creating session for reporter 7",
        "setServiceType:reportingSession:reply:]: setting service type 2 for reporter 7",
        "setConfiguration:forReporterID:reply:]: setting configuration",
        "startReportingSessionForID:reply:]: starting session for reporter 7",
        "sendMessage:withCategory:andType:forReportingIDs:reply:]: "
        "sending message for reporter [7]",
        "stopReportingSessionForID:reply:]: stopping session for reporter 7",
        "destroyReportingSession:reply:]: destroying session for reporter 7",
        "reporterID:valid:]: validating reporter 7"}) {
    EXPECT_THAT(lines, Contains(instance + text));
  }
  const std::string session = "<7>[qvrr] -[QVReportingSession ";
  EXPECT_THAT(lines, Contains(session + "start]: starting session owned by 7"));
  EXPECT_THAT(lines, Contains(session + "stop]: ending session 7").Times(2));
  // The message as the client sent it, on one line whatever is in it.
  EXPECT_THAT(lines, Contains(AllOf(StartsWith(session + "sendMessage:category:type:sync:reply:]: "
                                                         "BeaconAgent "),
                                    HasSubstr(R"("note":"line\n)"),
                                    EndsWith(" : category 134217731 : type 1"))));
}

TEST_F(QVLogFormatTest, SaysNoMoreThanThat) {
  auto client = connectClient();
  runSession(client);
  endService();
  EXPECT_EQ(log().count("<7>"), 0U);
}

TEST_F(QVLogFormatTest, KeepsAProcessNameOnOneLine) {
  char name[16] = {};
  ASSERT_EQ(::prctl(PR_GET_NAME, name), 0);
  ASSERT_EQ(::prctl(PR_SET_NAME, "e\n<3>[qvrs] \x1b"), 0);
  {
    auto client = connectClient();
    client.awaitOperations();
  }
  ::prctl(PR_SET_NAME, name);
  expectLogged("InvalidationHandler: connection exited process=e\\n<3>[qvrs] \\x1b uptime_sec=");
  endService();
  entries();
  EXPECT_EQ(store().rows("SELECT json_extract(payload, '$.processName') FROM countwise_event"),
            std::vector<std::string>{"e\n<3>[qvrs] \x1b"});
}

}  // namespace
