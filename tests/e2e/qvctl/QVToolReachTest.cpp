// What qvctl says of a service that it cannot reach, or that does not answer.

#include "tests/e2e/qvctl/QVToolTest.h"

#include <csignal>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <grp.h>
#include <unistd.h>

namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;

class QVToolReachTest : public QVToolTest {
 protected:
  // What the messages call this program's group.
  static std::string ownGroup() {
    const group* const found = ::getgrgid(::getegid());  // NOLINT(concurrency-mt-unsafe)
    return found == nullptr ? std::to_string(::getegid()) : found->gr_name;
  }
  // The same socket for all: commands that need the service, and what they say.
  void expectUnreachable(const std::string& socket, const std::string& reason) const {
    for (const Arguments& arguments : {Arguments{"sessions"},
                                       {"kill"},
                                       {"send", "--all", "a=1"},
                                       {"session", "create", "7"},
                                       {"session", "start", "7"},
                                       {"session", "stop", "7"}}) {
      Arguments whole = arguments;
      whole.insert(whole.end(), {"--socket", socket});
      const Output output = qvctl(whole);
      EXPECT_EQ(output.status, 3) << testing::PrintToString(whole) << output.error;
      EXPECT_THAT(output.error, AllOf(HasSubstr(reason), HasSubstr(socket)));
      EXPECT_THAT(output.error, Not(HasSubstr("not running"))) << testing::PrintToString(whole);
    }
    const Output status = qvctl({"status", "--socket", socket});
    EXPECT_EQ(status.status, 3);
    EXPECT_THAT(status.out, AllOf(HasSubstr("cannot be reached"), HasSubstr(reason)));
    EXPECT_THAT(status.out, Not(HasSubstr("not running")));
    const Output shown = qvctl({"reporting", "show", "--socket", socket});
    EXPECT_EQ(shown.status, 3);
    EXPECT_THAT(shown.out, AllOf(HasSubstr(reason), HasSubstr("preference  on")));
  }
};

TEST_F(QVToolReachTest, SaysThatAFileIsNoSocket) {
  const auto file = root_.path() / "file";
  std::ofstream(file) << "no socket";
  expectUnreachable(file, "not a socket");
}

TEST_F(QVToolReachTest, SaysThatADirectoryIsNoSocket) {
  expectUnreachable(root_.path(), "a directory, not a socket");
}

TEST_F(QVToolReachTest, SaysThatAPathIsTooLongForASocket) {
  expectUnreachable("/nowhere/" + std::string(99, 'x'), "107 bytes at the most");
  EXPECT_THAT(qvctl({"sessions", "--socket", "/nowhere/" + std::string(98, 'x')}).error,
              HasSubstr("not running"));
}

TEST_F(QVToolReachTest, SaysThatItWaitsForASilentService) {
  const int silent = listenInstead();
  // What would not connect to a service that does not run finds that this one does.
  const Connection connection = connectTo(silent);
  for (const Arguments& arguments :
       {Arguments{"send", "--session", "7", "a=1"}, {"kill"}, {"reporting", "show"}}) {
    const auto waiting = terminal(arguments);
    EXPECT_TRUE(waiting->await("qvctl: waiting for the service")) << waiting->shown();
    waiting->type("\x03");
    EXPECT_EQ(waiting->wait(), -SIGINT) << arguments[0];
  }
  ::close(connection.client);
  ::close(connection.accepted);
  ::close(silent);
}

TEST_F(QVToolReachTest, NamesTheGroupThatMayConnect) {
  service();
  // The group's right is none of the owner's.
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0060));
  for (const Arguments& arguments : {Arguments{"sessions"}, {"send", "--all", "a=1"}, {"kill"}}) {
    const Output output = qvctl(arguments, withoutPrivilege());
    EXPECT_EQ(output.status, 4) << arguments[0] << output.error;
    EXPECT_THAT(output.error, HasSubstr("members of the group " + ownGroup() + " may"));
  }
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0600));
}

TEST_F(QVToolReachTest, NamesTheGroupThatMayRead) {
  service();
  endService();
  std::filesystem::permissions(root_.state(), std::filesystem::perms(0070));
  const Output output = qvctl({"events"}, withoutPrivilege());
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.error, HasSubstr("members of the group " + ownGroup() + " may"));
  std::filesystem::permissions(root_.state(), std::filesystem::perms(0700));
}

TEST_F(QVToolReachTest, NamesTheGroupThatMayPost) {
  service();
  const auto notifications = root_.runtime() / "notify";
  std::filesystem::permissions(notifications, std::filesystem::perms(0070));
  const Output output = qvctl({"reporting", "off"}, withoutPrivilege());
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.error, HasSubstr("members of the group " + ownGroup() + " may"));
  std::filesystem::permissions(notifications, std::filesystem::perms(0700));
}

TEST_F(QVToolReachTest, ShowsThePreferenceToWhoMayNotConnect) {
  root_.configure("preferences/net.quillon.quietvox.json", R"({"disable_reporting": true})");
  service();
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0060));
  const Output output = qvctl({"reporting", "show"}, withoutPrivilege());
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.out, StartsWith("service     cannot be asked: "));
  EXPECT_THAT(output.out, AllOf(HasSubstr("ermission denied"),
                                HasSubstr("members of the group " + ownGroup() + " may"),
                                HasSubstr("\npreference  off\n")));
  const Output asJSON = qvctl({"reporting", "show", "--json"}, withoutPrivilege());
  EXPECT_EQ(asJSON.status, 4);
  EXPECT_THAT(asJSON.error, IsEmpty());
  const auto values = parseLines(asJSON.out);
  ASSERT_THAT(values, SizeIs(1));
  EXPECT_TRUE(at(values[0], {"reporting"}).isAbsent());
  EXPECT_EQ(at(values[0], {"reportingPreference"}), QVValue(false));
  EXPECT_THAT(std::string(at(values[0], {"problem"}).string()), HasSubstr("ermission denied"));
  // Nor whether there is a socket at all.
  std::filesystem::permissions(root_.runtime(), std::filesystem::perms(0));
  const Output closed = qvctl({"reporting", "show"}, withoutPrivilege());
  EXPECT_EQ(closed.status, 4);
  EXPECT_THAT(closed.out, HasSubstr("\npreference  off\n"));
  std::filesystem::permissions(root_.runtime(), std::filesystem::perms(0700));
  std::filesystem::permissions(root_.socket(), std::filesystem::perms(0600));
}

}  // namespace
