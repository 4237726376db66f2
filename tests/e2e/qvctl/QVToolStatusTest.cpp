// qvctl status, sessions, reporting, kill.

#include "tests/e2e/qvctl/QVToolTest.h"

#include <csignal>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>

namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr uint16_t kTelephony = 2;

// A user that this program does not run as.
constexpr uid_t kSomebody = 4711;

class QVToolStatusTest : public QVToolTest {
 protected:
  // A session that is seen to be started: its row is in the store.
  void startStoredSession(int64_t reporterID, uint16_t serviceType,
                          const QVDictionary& configuration = {}) {
    startSession(reporterID, serviceType, configuration);
    expectStored("SELECT id FROM beacon_session WHERE session_id = " + std::to_string(reporterID),
                 1);
  }
  std::filesystem::path preferences() const {
    return root_.configuration() / "preferences/net.quillon.quietvox.json";
  }
};

TEST_F(QVToolStatusTest, SaysThatTheServiceDoesNotRun) {
  const Output output = qvctl({"status"});
  EXPECT_EQ(output.status, 3);
  EXPECT_THAT(output.out, HasSubstr("not running"));
  const Output asJSON = qvctl({"status", "--json"});
  EXPECT_EQ(asJSON.status, 3);
  const auto values = parseLines(asJSON.out);
  ASSERT_THAT(values, SizeIs(1));
  EXPECT_EQ(at(values[0], {"running"}), QVValue(false));
  EXPECT_EQ(at(values[0], {"store", "present"}), QVValue(false));
  EXPECT_TRUE(at(values[0], {"reporting"}).isAbsent());
}

TEST_F(QVToolStatusTest, SaysHowTheServiceFares) {
  startStoredSession(7, kTelephony);
  client().sendMessage({{"frames", 480}}, {7});
  expectStored("SELECT id FROM beacon_message", 1);
  const QVValue status = json({"status"});
  EXPECT_EQ(at(status, {"running"}), QVValue(true));
  EXPECT_EQ(at(status, {"pid"}), QVValue(service().pid()));
  EXPECT_EQ(at(status, {"socket"}), QVValue(root_.socket().string()));
  EXPECT_EQ(at(status, {"sessions"}), QVValue(1));
  EXPECT_EQ(at(status, {"reporting"}), QVValue(true));
  EXPECT_EQ(at(status, {"reportingPreference"}), QVValue(true));
  EXPECT_EQ(at(status, {"store", "messages"}), QVValue(1));
  EXPECT_EQ(at(status, {"store", "losses"}), QVValue(QVDictionary{}));
  EXPECT_GT(at(status, {"store", "bytes"}).integerValue(), 0);
  // This program is the one client; qvctl does not count itself.
  ASSERT_EQ(at(status, {"clients"}).array().size(), 1U);
  EXPECT_EQ(at(at(status, {"clients"}).array()[0], {"pid"}), QVValue(::getpid()));
}

TEST_F(QVToolStatusTest, ShowsTheStatusOnATerminal) {
  startStoredSession(7, kTelephony);
  EXPECT_THAT(
      show({"status"}),
      AllOf(HasSubstr("\033[32mrunning, process " + std::to_string(service().pid())),
            HasSubstr("qv_tool_e2e_tes"), HasSubstr("sessions   \033[0m1"), HasSubstr("losses")));
  EXPECT_THAT(show({"status"}, {{"NO_COLOR", "1"}}), Not(HasSubstr("\033")));
  EXPECT_THAT(show({"status"}, {{"TERM", "dumb"}}), Not(HasSubstr("\033")));
  EXPECT_THAT(run({"status"}), Not(HasSubstr("\033")));
}

TEST_F(QVToolStatusTest, DoesNotStartTheServiceByAsking) {
  const int listener = listenInstead();
  for (const Arguments& arguments :
       {Arguments{"status"}, {"sessions"}, {"kill"}, {"reporting", "show"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, arguments[0] == "reporting" ? 0 : 3) << output.error;
    EXPECT_LT(::accept(listener, nullptr, nullptr), 0) << arguments[0] << " connected";
  }
  EXPECT_THAT(qvctl({"status"}).out, HasSubstr("not running, starts on demand"));
  EXPECT_THAT(qvctl({"sessions"}).error, HasSubstr("--start"));

  startService({.inheritedSocket = listener});
  EXPECT_EQ(at(json({"status"}), {"pid"}), QVValue(service().pid()));
  EXPECT_EQ(json({"sessions"}), QVValue(QVArray{}));
  ::close(listener);
}

TEST_F(QVToolStatusTest, KnowsASocketThatWasLeftBehind) {
  service().signal(SIGKILL);
  ASSERT_EQ(service().wait(), -SIGKILL);
  ASSERT_TRUE(std::filesystem::exists(root_.socket()));
  EXPECT_EQ(qvctl({"status"}).status, 3);
  EXPECT_EQ(qvctl({"sessions"}).status, 3);
}

TEST_F(QVToolStatusTest, ListsSessions) {
  startStoredSession(7, kTelephony, {{"HostApplicationDisplayID", "net.example.\033x"}});
  client().create(-9, 4711);
  const QVValue sessions = json({"sessions"});
  ASSERT_EQ(sessions.array().size(), 2U);
  const QVValue idle = sessions.array()[0];
  EXPECT_EQ(at(idle, {"session"}), QVValue(-9));
  EXPECT_EQ(at(idle, {"service"}), QVValue("4711"));
  EXPECT_EQ(at(idle, {"started"}), QVValue(false));
  const QVValue started = sessions.array()[1];
  EXPECT_EQ(at(started, {"session"}), QVValue(7));
  EXPECT_EQ(at(started, {"service"}), QVValue("telephony"));
  EXPECT_EQ(at(started, {"serviceType"}), QVValue(kTelephony));
  EXPECT_EQ(at(started, {"started"}), QVValue(true));
  EXPECT_EQ(at(started, {"application"}), QVValue("net.example.\033x"));
  EXPECT_EQ(at(started, {"owner", "pid"}), QVValue(::getpid()));
  EXPECT_THAT(show({"sessions"}),
              AllOf(HasSubstr("SESSION"), HasSubstr("telephony"), HasSubstr("net.example.\\x1Bx")));
}

TEST_F(QVToolStatusTest, KeepsLongApplicationsFromPushingTheOwnerAway) {
  startStoredSession(7, kTelephony, {{"HostApplicationDisplayID", std::string(200, 'a')}});
  auto all = environment();
  all["TERM"] = "dumb";
  QVTerminal shown({.arguments = command({"sessions"}), .environment = all, .columns = 80});
  ASSERT_EQ(shown.wait(), 0);
  EXPECT_THAT(shown.shown(), AllOf(HasSubstr("aaa…"), HasSubstr("qv_tool_e2e")));
}

TEST_F(QVToolStatusTest, EndsTheService) {
  service();
  EXPECT_EQ(run({"kill"}), "");
  EXPECT_EQ(service().wait(), 2);
  EXPECT_EQ(qvctl({"kill"}).status, 3);
}

TEST_F(QVToolStatusTest, SwitchesReportingOffAndOn) {
  root_.configure("preferences/net.quillon.quietvox.json", R"({"device_name": "kitchen"})");
  ASSERT_EQ(::chmod(preferences().c_str(), 0640), 0);
  service();
  EXPECT_EQ(json({"reporting", "off"}),
            QVValue(QVDictionary{{"reportingPreference", false}, {"posted", true}}));
  expectLogged("defaults {\"device_name\":\"kitchen\",\"disable_reporting\":true}");
  EXPECT_EQ(json({"reporting", "show"}),
            QVValue(QVDictionary{{"reportingPreference", false}, {"reporting", false}}));
  EXPECT_THAT(show({"reporting", "show"}), HasSubstr("service     off"));
  EXPECT_EQ(at(json({"status"}), {"reporting"}), QVValue(false));
  struct stat status {};
  ASSERT_EQ(::stat(preferences().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0640U);
  const Output refused = qvctl({"send", "--all", "a=1"});
  EXPECT_EQ(refused.status, 1);
  EXPECT_THAT(refused.error, HasSubstr("reporting is switched off"));

  EXPECT_EQ(run({"reporting", "on"}), "");
  expectLogged("defaults {\"device_name\":\"kitchen\",\"disable_reporting\":false}");
  EXPECT_EQ(at(json({"reporting", "show"}), {"reporting"}), QVValue(true));
}

TEST_F(QVToolStatusTest, PostsInThePlaceOfAFileThatNobodyElseMayTouch) {
  service();
  const auto directory = root_.runtime() / "notify";
  // Whose the directory is shows where this is somebody else: where the test may give it away.
  const uid_t owner = ::geteuid() == 0 ? kSomebody : ::geteuid();
  ASSERT_EQ(::chown(directory.c_str(), owner, static_cast<gid_t>(-1)), 0);
  const auto notification = directory / "net.quillon.quietvox.reporting";
  root_.configure("elsewhere", "as it was");
  std::filesystem::create_symlink(root_.configuration() / "elsewhere", notification);
  EXPECT_EQ(run({"reporting", "off"}), "");
  expectLogged("defaults {\"disable_reporting\":true}");
  ASSERT_EQ(::chmod(notification.c_str(), 0400), 0);
  const mode_t before = ::umask(0077);
  EXPECT_EQ(run({"reporting", "on"}), "");
  ::umask(before);
  expectLogged("defaults {\"disable_reporting\":false}");

  struct stat file {};
  struct stat place {};
  ASSERT_EQ(::lstat(notification.c_str(), &file), 0);
  ASSERT_EQ(::stat(directory.c_str(), &place), 0);
  EXPECT_TRUE(S_ISREG(file.st_mode));
  EXPECT_EQ(file.st_mode & 07777U, 0660U);
  EXPECT_EQ(file.st_uid, place.st_uid);
  EXPECT_EQ(file.st_gid, place.st_gid);
  EXPECT_EQ(std::filesystem::file_size(root_.configuration() / "elsewhere"), 9U);
}

TEST_F(QVToolStatusTest, WritesTheSwitchWhileTheServiceDoesNotRun) {
  const Output output = qvctl({"reporting", "off"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.error, HasSubstr("does not run"));
  EXPECT_EQ(json({"reporting", "show"}),
            QVValue(QVDictionary{{"reportingPreference", false}, {"reporting", QVValue()}}));
  struct stat status {};
  ASSERT_EQ(::stat(preferences().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0644U);
}

TEST_F(QVToolStatusTest, WritesTheSwitchThroughALink) {
  root_.configure("shared/switch.json", R"({"device_name": "kitchen"})");
  const auto target = root_.configuration() / "shared/switch.json";
  ASSERT_EQ(::chmod(target.c_str(), 0640), 0);
  std::filesystem::create_directories(preferences().parent_path());
  std::filesystem::create_symlink("../shared/link.json", preferences());
  std::filesystem::create_symlink("switch.json", root_.configuration() / "shared/link.json");
  EXPECT_EQ(qvctl({"reporting", "off"}).status, 0);
  EXPECT_TRUE(std::filesystem::is_symlink(preferences()));
  EXPECT_TRUE(std::filesystem::is_symlink(root_.configuration() / "shared/link.json"));
  std::ifstream stream(target);
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  EXPECT_EQ(text, "{\"device_name\":\"kitchen\",\"disable_reporting\":true}\n");
  struct stat status {};
  ASSERT_EQ(::stat(target.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0640U);
}

TEST_F(QVToolStatusTest, MakesTheFileThatALinkNames) {
  std::filesystem::create_directories(preferences().parent_path());
  std::filesystem::create_symlink(root_.path() / "switch.json", preferences());
  EXPECT_EQ(qvctl({"reporting", "off"}).status, 0);
  EXPECT_TRUE(std::filesystem::is_symlink(preferences()));
  EXPECT_TRUE(std::filesystem::is_regular_file(root_.path() / "switch.json"));
  EXPECT_EQ(at(json({"reporting", "show"}), {"reportingPreference"}), QVValue(false));
}

TEST_F(QVToolStatusTest, SaysThatALinkLeadsNowhere) {
  std::filesystem::create_directories(preferences().parent_path());
  std::filesystem::create_symlink("/nowhere/switch.json", preferences());
  const Output nowhere = qvctl({"reporting", "off"});
  EXPECT_EQ(nowhere.status, 1);
  EXPECT_THAT(nowhere.error, HasSubstr("/nowhere/switch.json"));
  std::filesystem::remove(preferences());
  std::filesystem::create_symlink(preferences(), preferences());
  const Output circle = qvctl({"reporting", "off"});
  EXPECT_EQ(circle.status, 1);
  EXPECT_THAT(circle.error, HasSubstr(preferences().string()));
  EXPECT_TRUE(std::filesystem::is_symlink(preferences()));
}

TEST_F(QVToolStatusTest, FollowsNoLinkOutOfAnotherRootDirectory) {
  const auto root = root_.path() / "image";
  const auto link = root / "etc/quietvox/preferences/net.quillon.quietvox.json";
  std::filesystem::create_directories(link.parent_path());
  std::filesystem::create_symlink(root_.path() / "outside.json", link);
  const Output output = qvctl({"reporting", "off", "--root", root});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, AllOf(HasSubstr(link.string()), HasSubstr("link")));
  EXPECT_FALSE(std::filesystem::exists(root_.path() / "outside.json"));
}

TEST_F(QVToolStatusTest, LeavesABrokenPreferencesFileAlone) {
  root_.configure("preferences/net.quillon.quietvox.json", "{\"device_name\": ");
  const Output output = qvctl({"reporting", "off"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr("line 1"));
  EXPECT_EQ(std::filesystem::file_size(preferences()), 16U);
}

TEST_F(QVToolStatusTest, ChangesNothingWhereItMayNotPost) {
  service();
  const auto notifications = root_.runtime() / "notify";
  std::filesystem::permissions(notifications, std::filesystem::perms(0500));
  const Output output = qvctl({"reporting", "off"}, withoutPrivilege());
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.error, AllOf(HasSubstr(notifications.string()), HasSubstr("ermission")));
  EXPECT_FALSE(std::filesystem::exists(preferences()));
  std::filesystem::permissions(notifications, std::filesystem::perms(0700));
}

TEST_F(QVToolStatusTest, ChangesNothingWhereItMayNotPostInAnothersPlace) {
  const auto notifications = root_.runtime() / "notify";
  const auto notification = notifications / "net.quillon.quietvox.reporting";
  std::filesystem::create_directories(notifications);
  std::ofstream(notification) << "as it was";
  // In a directory with the sticky bit only the file's owner and the directory's may remove it:
  // both are somebody else where the test may give them away.
  const bool isForeign = ::geteuid() == 0;
  if (isForeign) {
    ASSERT_EQ(::chown(notification.c_str(), kSomebody, kSomebody), 0);
    ASSERT_EQ(::chown(notifications.c_str(), kSomebody, kSomebody), 0);
  }
  ASSERT_EQ(::chmod(notifications.c_str(), 01777), 0);
  const Arguments wrapper =
      isForeign ? Arguments{"setpriv", "--bounding-set=-dac_override,-fowner", "--inh-caps=-all"}
                : Arguments{};
  const Output output = qvctl({"reporting", "off"}, wrapper);
  EXPECT_EQ(output.status, isForeign ? 4 : 0) << output.error;
  EXPECT_EQ(std::filesystem::exists(preferences()), !isForeign);
  EXPECT_EQ(std::filesystem::file_size(notification), isForeign ? 9U : 0U);
}

TEST_F(QVToolStatusTest, ChangesNothingWhereTheNotificationIsADirectory) {
  const auto notifications = root_.runtime() / "notify";
  // Where the file would be is a directory, which is not unlinked.
  std::filesystem::create_directories(notifications / "net.quillon.quietvox.reporting");
  const Output output = qvctl({"reporting", "off"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr((notifications / "net.quillon.quietvox.reporting").string()));
  EXPECT_FALSE(std::filesystem::exists(preferences()));
}

TEST_F(QVToolStatusTest, GivesThePreferenceNoRightsButThoseOfReadingAndWriting) {
  root_.configure("preferences/net.quillon.quietvox.json", R"({"device_name": "kitchen"})");
  ASSERT_EQ(::chmod(preferences().c_str(), 06755), 0);
  EXPECT_EQ(qvctl({"reporting", "off"}).status, 0);
  struct stat status {};
  ASSERT_EQ(::stat(preferences().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0755U);
}

TEST_F(QVToolStatusTest, SaysWhereItIsNotPermitted) {
  service();
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0));
  for (const Arguments& arguments : {Arguments{"sessions"}, {"send", "--all", "a=1"}, {"kill"}}) {
    const Output output = qvctl(arguments, withoutPrivilege());
    EXPECT_EQ(output.status, 4) << arguments[0] << output.error;
    EXPECT_THAT(output.error, HasSubstr("ermission denied"));
  }
  std::filesystem::permissions(root_.runtime(), std::filesystem::perms(0));
  EXPECT_EQ(qvctl({"status"}, withoutPrivilege()).status, 4);
  std::filesystem::permissions(root_.runtime(), std::filesystem::perms(0700));
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0600));
}

TEST_F(QVToolStatusTest, SaysWhatIsWrongWithACommandLine) {
  for (const Arguments& arguments : {Arguments{},
                                     {"nothing"},
                                     {"status", "--nothing"},
                                     {"session"},
                                     {"session", "start", "x"},
                                     {"send", "a=1"},
                                     {"send", "--all", "--session", "7", "a=1"},
                                     {"send", "--all", "a"},
                                     {"send", "--all", "--category", "Nothing", "a=1"},
                                     {"events", "--kind", "nothing"},
                                     {"events", "--since", "nothing"},
                                     {"events", "--service", "nothing"},
                                     {"watch", "--for", "nothing"},
                                     {"channels", "--count", "2"},
                                     {"channels", "--interval", "1us"},
                                     {"session", "run", "--service", "nothing", "--", "true"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 2) << testing::PrintToString(arguments) << output.error;
    EXPECT_THAT(output.error, Not(IsEmpty()));
    EXPECT_EQ(output.out, "");
  }
}

TEST_F(QVToolStatusTest, NamesTheWordThatIsWrong) {
  const std::vector<std::pair<Arguments, std::string>> wrong{
      {{"nonsense"}, "\"nonsense\""},
      {{"reporting", "maybe"}, "\"maybe\""},
      {{"events", "--last", "-5"}, "\"-5\""},
      {{"events", "--since", "2026-02-30"}, "\"2026-02-30\""},
      {{"watch", "--count", "-1"}, "\"-1\""},
      {{"channels", "--interval", "1s", "--count", "-1"}, "\"-1\""},
      {{"summary", "plot", "--width", "-5"}, "\"-5\""},
      {{"summary", "plot", "--height", "0"}, "\"0\""},
      {{"session", "create", "99999999999999999999"}, "\"99999999999999999999\""},
      {{"session", "destroy", "7x"}, "\"7x\""},
      {{"session", "create", "--configuration", "{}", "--set", "a"}, "KEY=VALUE"}};
  for (const auto& [arguments, word] : wrong) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 2) << testing::PrintToString(arguments) << output.error;
    EXPECT_THAT(output.error, AllOf(StartsWith("qvctl: "), HasSubstr(word)));
  }
  const Output output = qvctl({"send", "a=1"}, {"env", "QUIETVOX_SESSION=abc"});
  EXPECT_EQ(output.status, 2);
  EXPECT_THAT(output.error, HasSubstr("\"abc\""));
}

TEST_F(QVToolStatusTest, TakesNoEmptyValueForNone) {
  for (const Arguments& arguments : {Arguments{"status", "--socket", ""},
                                     {"status", "--root", ""},
                                     {"events", "--since", ""},
                                     {"events", "--until", ""},
                                     {"events", "--last", ""},
                                     {"events", "--kind", ""},
                                     {"events", "--name", ""},
                                     {"watch", "--for", ""},
                                     {"watch", "--for", "", "--count", "1"},
                                     {"channels", "--interval", ""},
                                     {"channels", "--group", ""},
                                     {"summary", "show", ""},
                                     {"summary", "plot", "--key", ""},
                                     {"send", "--session", "", "a=1"},
                                     {"send", "--all", "--payload", ""},
                                     {"send", "--all", "--category", "", "a=1"},
                                     {"session", "create", "--service", ""},
                                     {"session", "create", "--configuration", ""},
                                     {"session", "run", "--configuration", "", "--", "true"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 2) << testing::PrintToString(arguments) << output.error;
    EXPECT_THAT(output.error, AllOf(StartsWith("qvctl: "), HasSubstr("\"\"")));
  }
  // A command's own arguments are its own.
  EXPECT_EQ(qvctl({"session", "run", "--anyway", "--", "test", "-z", ""}).status, 0);
}

TEST_F(QVToolStatusTest, SaysThatItsHelpCouldNotBeWritten) {
  for (const char* option : {"--help", "--version"}) {
    const std::string tool = QVDaemonProcess::program("qvctl").string();
    QVSubprocess process({.arguments = {tool, option},
                          .environment = environment(),
                          .standardOutputFile = "/dev/full",
                          .standardErrorFile = root_.path() / "error"});
    EXPECT_EQ(process.wait(std::chrono::seconds(60)), 1) << option;
  }
}

TEST_F(QVToolStatusTest, LooksBelowAnotherRootDirectory) {
  const std::string root = root_.path() / "image";
  std::filesystem::create_directory(root);
  const Output output = qvctl({"status", "--json", "--root", root});
  EXPECT_EQ(output.status, 3);
  const auto values = parseLines(output.out);
  ASSERT_THAT(values, SizeIs(1));
  EXPECT_EQ(at(values[0], {"socket"}), QVValue(root + "/run/quietvox/reporting.socket"));
  EXPECT_EQ(at(values[0], {"store", "path"}), QVValue(root + "/var/lib/quietvox/reporting.db"));
}

}  // namespace
