// What the service writes to its standard error.

#include "tests/support/QVEndToEndTest.h"

#include <regex>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/stat.h>

namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAre;

constexpr uint16_t kTelephony = 2;

constexpr const char* kSendingLine =
    "sendMessage:withCategory:andType:forReportingIDs:reply:]: sending message for reporter [7]";

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
  const std::string service = "<5>[qvrs] -[QVReportingServiceDelegate ";
  const std::string delegate = service + "listener:shouldAcceptNewConnection:]: ";
  EXPECT_THAT(
      connection,
      ElementsAre(
          service + "listenForDefaultsNotification]: notify setup result 0",
          AllOf(StartsWith(delegate + "newConnection: "), HasSubstr(pid)),
          StartsWith(delegate +
                     "InvalidationHandler: connection exited process=qv_e2e_tests uptime_sec=")));
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
        "startReportingSessionForID:reply:]: starting session for reporter 7", kSendingLine,
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

// ---- A log that nobody reads

class QVUnreadLogTest : public QVEndToEndTest {
 protected:
  // The service's standard error is a pipe; this end of it.
  void SetUp() override {
    const std::string pipe = root_.path() / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    // For writing, too: so it opens at once and has no end.
    reader_ = ::open(pipe.c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_GE(reader_, 0);
    startService({.wrapper = {"/bin/sh", "-c", "exec \"$0\" 2>" + pipe}});
  }
  void TearDown() override { ::close(reader_); }

  // More lines than pipe and queue have room for.
  static void makeLines(QVPeerClient& client) {
    constexpr uint32_t kCalls = 10'000;
    std::string batch;
    for (uint32_t serial = 1; serial <= kCalls; ++serial) batch += createCall(7).bytes(serial);
    ASSERT_TRUE(client.send(batch));
    for (uint32_t serial = 1; serial <= kCalls; ++serial) {
      ASSERT_TRUE(client.awaitReply(serial).boolean());
    }
  }
  // Reads the pipe until one of the texts has come; which one, or, after a minute, none.
  std::string readUntil(const std::vector<std::string>& texts) const {
    std::string seen;
    for (;;) {
      for (const std::string& text : texts) {
        if (seen.find(text) != std::string::npos) return text;
      }
      pollfd event{reader_, POLLIN, 0};
      if (::poll(&event, 1, 60'000) != 1) return {};
      char buffer[65536];
      const ssize_t length = ::read(reader_, buffer, sizeof buffer);
      if (length <= 0) return {};
      // A text may lie across two pieces.
      constexpr std::size_t kLongestText = 100;
      if (seen.size() > kLongestText) seen.erase(0, seen.size() - kLongestText);
      seen.append(buffer, static_cast<std::size_t>(length));
    }
  }

  int reader_ = -1;
};

TEST_F(QVUnreadLogTest, HoldsNobodyUpAndSaysWhatItLost) {
  auto client = connectClient();
  makeLines(client);
  expectServes(client);
  const std::string lost = " log lines were lost";
  EXPECT_EQ(readUntil({lost}), lost);
  // What comes from now on is written again, once the writer has put its work aside: a line that is
  // quicker finds the queue still full, and is told of.
  const std::string first = "created reporting session for ID: 4711";
  const std::string second = "created reporting session for ID: 4712";
  client.create(4711);
  if (readUntil({first, lost}) != first) {
    client.create(4712);
    EXPECT_EQ(readUntil({second}), second);
  }
}

TEST_F(QVUnreadLogTest, DoesNotKeepTheServiceFromEnding) {
  auto client = connectClient();
  makeLines(client);
  endService();
}

TEST_F(QVUnreadLogTest, DoesNotKeepTheServiceFromBeingKilled) {
  auto client = connectClient();
  makeLines(client);
  client.post(killCall());
  EXPECT_EQ(service().wait(), 2);
}

}  // namespace
