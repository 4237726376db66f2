// Preferences, and the notification that makes the service read them.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <filesystem>
#include <fstream>
#include <optional>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::SizeIs;

constexpr const char* kFile = "preferences/net.quillon.quietvox.json";
constexpr const char* kNotification = "net.quillon.quietvox.reporting";
constexpr const char* kRefusal = "net.quillon.audio.reporting.Code1";
// The first and the last line of a reading.
constexpr const char* kBegins = "listenForDefaultsNotification]: re-reading quietvox defaults";
constexpr const char* kRead = "listenForDefaultsNotification]: defaults ";
constexpr const char* kOff = R"({"disable_reporting": true})";
constexpr uint16_t kTelephony = 2;

class QVPreferencesTest : public QVEndToEndTest {
 protected:
  std::filesystem::path directory() const { return root_.runtime() / "notify"; }
  std::filesystem::path notification() const { return directory() / kNotification; }
  void setPreferences(const std::string& text) const { root_.configure(kFile, text); }
  void removePreferences() const { std::filesystem::remove(root_.configuration() / kFile); }

  QVPeerClient& client() {
    if (!client_) client_.emplace(root_.socket());
    return *client_;
  }
  // The service, with a notification that was posted once, before it started.
  void startPosted() {
    std::filesystem::create_directory(directory());
    std::ofstream(notification()).flush();
    startService({});
  }
  // Posts what was posted before, by one event alone, and returns when the service has read its
  // preferences.
  void post() {
    const std::size_t before = log().count(kRead);
    ASSERT_EQ(::utimensat(AT_FDCWD, notification().c_str(), nullptr, 0), 0);
    expectLogged(kRead, before + 1);
  }
  // What the next message is answered with; empty where that is no error.
  std::string sendingError() {
    const auto reply = client().call(sendToAllCall({{"a", 1}}, kSessionPlayback, kStart));
    return reply.isReturn() ? std::string() : reply.errorName;
  }
  // The user information that each start of the session left in the store.
  std::vector<std::string> userInformation(int64_t reporterID) const {
    return store().rows("SELECT user_info FROM beacon_session WHERE session_id = " +
                        std::to_string(reporterID) + " ORDER BY id");
  }

  std::optional<QVPeerClient> client_;
};

TEST_F(QVPreferencesTest, HaveNoEffectBeforeAPost) {
  setPreferences(kOff);
  startPosted();
  EXPECT_EQ(sendingError(), "");
  endService();
  EXPECT_EQ(store().count("beacon_message"), 1);
  EXPECT_EQ(log().count(kBegins), 0U);
  EXPECT_EQ(log().count("listenForDefaultsNotification]: notify setup result 0"), 1U);
}

TEST_F(QVPreferencesTest, SwitchReportingOffAndOnAgain) {
  setPreferences(kOff);
  startPosted();
  post();
  const auto refusal = client().call(sendToAllCall({{"a", 1}}, kSessionPlayback, kStart));
  EXPECT_EQ(refusal.errorName, kRefusal);
  EXPECT_EQ(refusal.string(), "reporting is switched off");
  setPreferences(R"({"device_name": "kitchen"})");
  EXPECT_EQ(sendingError(), kRefusal);
  post();
  EXPECT_EQ(sendingError(), "");
  setPreferences(kOff);
  post();
  EXPECT_EQ(sendingError(), kRefusal);
  removePreferences();
  post();
  EXPECT_EQ(sendingError(), "");
  endService();
  EXPECT_EQ(store().count("beacon_message"), 2);
  EXPECT_THAT(log().lines(kRead),
              ElementsAre(EndsWith(R"(defaults {"disable_reporting":true})"),
                          EndsWith(R"(defaults {"device_name":"kitchen","disable_reporting":0})"),
                          EndsWith(R"(defaults {"disable_reporting":true})"),
                          EndsWith(R"(defaults {"disable_reporting":0})")));
}

TEST_F(QVPreferencesTest, ReadTheSwitchFromOtherKindsOfValues) {
  startPosted();
  for (const char* on : {"1", "-0.5", "\"true\"", "\"YES\"", "\"1\""}) {
    setPreferences(std::string(R"({"disable_reporting": )") + on + "}");
    post();
    EXPECT_EQ(sendingError(), kRefusal) << on;
  }
  for (const char* off : {"false", "0", "0.0", "\"on\"", "\"\"", "null", "[true]", "{}"}) {
    setPreferences(std::string(R"({"disable_reporting": )") + off + "}");
    post();
    EXPECT_EQ(sendingError(), "") << off;
  }
}

TEST_F(QVPreferencesTest, LeaveRunningSessionsAlone) {
  setPreferences(kOff);
  startPosted();
  client().create(7, kTelephony);
  client().start(7);
  client().sendMessage({{"a", 1}}, {7});
  post();
  EXPECT_EQ(sendingError(), kRefusal);
  client().stop(7);
  endService();
  EXPECT_THAT(store().rows("SELECT category FROM beacon_message ORDER BY id"),
              ElementsAre("3", "65535"));
}

TEST_F(QVPreferencesTest, ReachTheSessionsThatThereAre) {
  setPreferences(R"({"device_name": "kitchen"})");
  startPosted();
  client().create(7, kTelephony);
  client().create(8, kTelephony);
  client().start(8);
  // What is stored of a session is from its start.
  expectStored("SELECT * FROM beacon_session WHERE session_id = 8", 1);
  post();
  client().start(7);
  client().create(9, kTelephony);
  client().start(9);
  for (const int64_t reporter : {7, 8, 9}) client().stop(reporter);
  client().start(8);
  client().stop(8);
  endService();

  const auto named = HasSubstr(R"("device_name":"kitchen","disable_reporting":0)");
  EXPECT_THAT(userInformation(7), ElementsAre(named));
  EXPECT_THAT(userInformation(8), ElementsAre(Not(named), named));
  EXPECT_THAT(userInformation(9), ElementsAre(Not(named)));
}

TEST_F(QVPreferencesTest, ReadANumbersTextForTheDevicesName) {
  startPosted();
  client().create(7, kTelephony);
  setPreferences(R"({"device_name": 12})");
  post();
  client().start(7);
  client().stop(7);
  endService();
  EXPECT_THAT(userInformation(7), ElementsAre(HasSubstr(R"("device_name":"12")")));
}

TEST_F(QVPreferencesTest, CountAsEmptyWhereTheFileIsBroken) {
  startPosted();
  setPreferences(kOff);
  post();
  EXPECT_EQ(sendingError(), kRefusal);
  setPreferences("{\n  \"device_name\": \"kitchen\",\n  \"disable_reporting\": yes\n}\n");
  post();
  EXPECT_EQ(sendingError(), "");
  post();
  endService();
  const std::string place = (root_.configuration() / kFile).string() + ": line 3, column 24: ";
  EXPECT_THAT(log().lines("cannot read preferences"), SizeIs(1));
  EXPECT_THAT(log().lines("<3>"),
              ElementsAre(HasSubstr(
                  "-[QVJSONPreferences valuesInDomain:]: cannot read preferences " + place)));
  EXPECT_EQ(log().lines(kRead).at(1).substr(log().lines(kRead).at(1).find("defaults ")),
            R"(defaults {"disable_reporting":0})");
}

TEST_F(QVPreferencesTest, AreReadForVerboseLinesAsTheServiceStarts) {
  const std::string verbose = "<7>[qvrs] ";
  startPosted();
  setPreferences(R"({"reporting_server_verbose": true})");
  post();
  client().isValid(7);
  endService();
  EXPECT_EQ(log().count(verbose), 0U);
  forgetService();
  client_.reset();
  startService({});
  client().isValid(7);
  endService();
  EXPECT_GT(log().count(verbose), 0U);
}

TEST_F(QVPreferencesTest, TurnAnalyticsEventsOffByName) {
  root_.configure("preferences/net.quillon.countwise.json",
                  R"({"unwanted": ["net.quillon.quietvox.Session_Playback.Start"]})");
  startService({});
  client().create(7, kTelephony);
  client().start(7);
  client().sendMessage({{"a", 1}}, {7});
  client().sendMessage({{"a", 2}}, {7}, 0x40000007, 0);
  endService();
  EXPECT_THAT(store().rows("SELECT payload FROM countwise_event WHERE name NOT LIKE '%uptime'"),
              ElementsAre(HasSubstr(R"("a":2)")));
}

// ---- How a notification is posted

class QVPostingTest : public QVPreferencesTest,
                      public ::testing::WithParamInterface<std::vector<std::string>> {};

TEST_P(QVPostingTest, IsHeard) {
  setPreferences(kOff);
  std::filesystem::create_directory(directory());
  if (GetParam().front() != "create") std::ofstream(notification()) << "text";
  startService({});
  EXPECT_EQ(sendingError(), "");
  const std::string command = GetParam().back();
  const auto posted = QVSubprocess::run(
      {"/bin/sh", "-ec", "cd \"$0\"; FILE=$1; " + command, directory().string(), kNotification});
  ASSERT_EQ(posted.status, 0) << posted.text;
  expectLogged(kRead);
  EXPECT_EQ(sendingError(), kRefusal);
}

using Ways = std::vector<std::vector<std::string>>;
INSTANTIATE_TEST_SUITE_P(Ways, QVPostingTest,
                         ::testing::ValuesIn(Ways{{"create", "touch \"$FILE\""},
                                                  {"touch", "touch \"$FILE\""},
                                                  {"setTimes", "touch -d yesterday \"$FILE\""},
                                                  {"write", "echo text >\"$FILE\""},
                                                  {"append", "echo text >>\"$FILE\""},
                                                  {"replace", "echo text >new; mv new \"$FILE\""}}),
                         [](const auto& given) { return given.param.front(); });

TEST_F(QVPreferencesTest, AreReadForTheirOwnNotificationAlone) {
  setPreferences(kOff);
  startPosted();
  std::ofstream(directory() / "net.quillon.quietvox.other").flush();
  std::filesystem::create_directory(directory() / "directory");
  post();
  std::filesystem::remove(notification());
  EXPECT_EQ(sendingError(), kRefusal);
  endService();
  EXPECT_EQ(log().count(kBegins), 1U);
}

TEST_F(QVPreferencesTest, HearPostsInADirectoryOfTheServicesOwn) {
  const mode_t before = ::umask(0077);
  startService({});
  ::umask(before);
  struct stat status {};
  ASSERT_EQ(::stat(directory().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0775U);
  setPreferences(kOff);
  std::filesystem::remove_all(directory());
  // That may have been a post.
  expectLogged(kRead);
  EXPECT_EQ(sendingError(), kRefusal);
  expectLogged(directory().string() + " was deleted or moved away: it is there again");
  removePreferences();
  std::ofstream(notification()).flush();
  expectLogged(kRead, 2);
  EXPECT_EQ(sendingError(), "");
}

TEST_F(QVPreferencesTest, AreNeverReadWhereNotificationsCannotBeHeard) {
  std::ofstream(directory()) << "a file";
  setPreferences(kOff);
  startService({});
  EXPECT_EQ(sendingError(), "");
  endService();
  EXPECT_THAT(log().lines("<3>"),
              ElementsAre(EndsWith("cannot watch for notifications: " + directory().string() +
                                   ": Not a directory")));
  EXPECT_EQ(log().count("listenForDefaultsNotification]: notify setup result 1000000"), 1U);
}

}  // namespace
