// qvctl send and session.

#include "platform/QVText.h"
#include "tests/e2e/qvctl/QVToolTest.h"

#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr uint16_t kTelephony = 2;

// A user without rights.
constexpr uid_t kNobody = 65534;

class QVToolSessionTest : public QVToolTest {
 protected:
  std::vector<std::string> messages(int64_t session) const {
    return store().rows("SELECT category, type, payload FROM beacon_message WHERE session_id = " +
                        std::to_string(session) + " AND type <> 65535 ORDER BY id");
  }
  // Where the session's keeper listens.
  sockaddr_un keeperAddress(int64_t session) const {
    struct stat file {};
    EXPECT_EQ(::stat(root_.socket().c_str(), &file), 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    QVText("quietvox-session/", uint64_t{file.st_dev}, "/", uint64_t{file.st_ino}, "/", session)
        .copy(address.sun_path + 1, sizeof address.sun_path - 1);
    return address;
  }
  static int connectToKeeper(const sockaddr_un& address) {
    const int made = ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    EXPECT_EQ(::connect(made, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    return made;
  }
};

TEST_F(QVToolSessionTest, SendsToSessionsOfOthers) {
  startSession(7, kTelephony);
  EXPECT_EQ(run({"send", "--session", "7", "--category", "Session.Playback", "--type", "start",
                 "frames=480", "gain:double=1", "name:string=5", "on=true",
                 R"(device:json={"a":[1,2]})"}),
            "");
  EXPECT_EQ(run({"send", "--all", "--category", "0x40000007", "--type", "2", "--payload",
                 R"({"b":[1.5]})"}),
            "");
  endService();
  EXPECT_THAT(
      messages(7),
      ElementsAre(R"(3|1|{"device":{"a":[1,2]},"frames":480,"gain":1.0,"name":"5","on":true})",
                  R"(7|2|{"b":[1.5]})"));
}

TEST_F(QVToolSessionTest, SendsToNobodyWhereThereIsNoSession) {
  service();
  const Output output = qvctl({"send", "--session", "7", "a=1"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr("no session 7"));
}

TEST_F(QVToolSessionTest, KeepsASessionForAScript) {
  service();
  const QVValue created = json({"session", "create", "7", "--service", "telephony", "--set",
                                "HostApplicationDisplayID=net.example", "--set", "rate=48000"});
  EXPECT_EQ(at(created, {"session"}), QVValue(7));
  EXPECT_EQ(client().serviceType(7), kTelephony);
  const auto keeper = static_cast<pid_t>(at(created, {"keeper"}).integerValue());
  EXPECT_EQ(::kill(keeper, 0), 0);

  EXPECT_EQ(run({"session", "start", "7"}), "");
  EXPECT_EQ(run({"session", "send", "7", "frames=480"}), "");
  EXPECT_EQ(run({"session", "stop", "7"}), "");
  expectStored(
      "SELECT id FROM beacon_session WHERE flushed_at IS NOT NULL AND user_info LIKE "
      "'%net.example%telephony%48000%'",
      1);
  EXPECT_EQ(run({"session", "start", "7"}), "");
  EXPECT_EQ(run({"session", "destroy", "7"}), "");
  EXPECT_FALSE(client().isValid(7));
  endService();
  EXPECT_THAT(messages(7), ElementsAre(R"(1|0|{"frames":480})"));
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NULL"), 0);
}

TEST_F(QVToolSessionTest, ChoosesAnID) {
  service();
  const std::string id = run({"session", "create", "--start"});
  const int64_t session = std::stoll(id);
  EXPECT_TRUE(client().isValid(session));
  EXPECT_EQ(run({"session", "destroy", std::to_string(session)}), "");
  EXPECT_FALSE(client().isValid(session));
}

TEST_F(QVToolSessionTest, IsNotForOtherUsers) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can turn into another user";
  service();
  EXPECT_EQ(run({"session", "create", "7"}), "7\n");
  // Where the program lies, another user may not even look; it is taken along as a descriptor.
  const int program = ::open(QVDaemonProcess::program("qvctl").c_str(), O_RDONLY);
  ASSERT_EQ(::chmod(root_.path().c_str(), 0755), 0);
  const auto file = root_.path() / "result";
  auto all = environment();
  QVSubprocess other({.arguments = {"setpriv", "--reuid=65534", "--regid=65534", "--clear-groups",
                                    "/proc/self/fd/3", "session", "stop", "7"},
                      .environment = all,
                      .standardOutputFile = file,
                      .standardErrorFile = file,
                      .inheritedDescriptor = program});
  EXPECT_EQ(other.wait(std::chrono::seconds(60)), 4);
  std::ifstream stream(file);
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  EXPECT_THAT(text, HasSubstr("session 7 is another user's"));
  ::close(program);
  EXPECT_EQ(run({"session", "destroy", "7"}), "");
}

TEST_F(QVToolSessionTest, IsNotHeldUpByOtherUsers) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can turn into another user";
  service();
  EXPECT_EQ(run({"session", "create", "7"}), "7\n");
  const sockaddr_un address = keeperAddress(7);
  // The kernel tells the keeper who it was that connected.
  ASSERT_EQ(::seteuid(kNobody), 0);
  const int other = connectToKeeper(address);
  ASSERT_EQ(::seteuid(0), 0);
  // It says nothing, and is not waited for.
  pollfd entry{other, POLLIN, 0};
  EXPECT_EQ(::poll(&entry, 1, 10'000), 1);
  EXPECT_NE(entry.revents & POLLHUP, 0);
  EXPECT_EQ(run({"session", "destroy", "7"}), "");
  ::close(other);
}

TEST_F(QVToolSessionTest, IsNotHeldUpByWhoSaysNothing) {
  service();
  EXPECT_EQ(run({"session", "create", "7", "--start"}), "7\n");
  // More than a keeper keeps at a time.
  std::vector<int> silent;
  for (int i = 0; i < 20; ++i) silent.push_back(connectToKeeper(keeperAddress(7)));
  EXPECT_EQ(run({"session", "stop", "7"}), "");
  EXPECT_EQ(run({"session", "destroy", "7"}), "");
  for (const int descriptor : silent) ::close(descriptor);
}

TEST_F(QVToolSessionTest, IsNotHeldUpByWhoTakesAKeepersName) {
  const int service = listenInstead();
  const sockaddr_un address = keeperAddress(7);
  const int taken = ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
  ASSERT_EQ(::bind(taken, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(::listen(taken, 0), 0);
  // The only one that may wait.
  const int first = connectToKeeper(address);
  for (const char* request : {"stop", "destroy"}) {
    const Output output = qvctl({"session", request, "7"});
    EXPECT_EQ(output.status, 3);
    EXPECT_THAT(output.error, HasSubstr("does not answer"));
  }
  for (const int descriptor : {first, taken, service}) ::close(descriptor);
}

TEST_F(QVToolSessionTest, SaysWhoHasTakenAKeepersName) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can turn into another user";
  service();
  const sockaddr_un address = keeperAddress(7);
  const int taken = ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
  ASSERT_EQ(::bind(taken, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  // The kernel remembers who listens.
  ASSERT_EQ(::seteuid(kNobody), 0);
  const int listening = ::listen(taken, 4);
  ASSERT_EQ(::seteuid(0), 0);
  ASSERT_EQ(listening, 0);
  const Output output = qvctl({"session", "create", "7"});
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.error, HasSubstr("the user 65534 has taken"));
  EXPECT_FALSE(client().isValid(7));
  ::close(taken);
}

TEST_F(QVToolSessionTest, IsEndedWithItsKeeper) {
  service();
  const QVValue created = json({"session", "create", "7", "--start"});
  EXPECT_TRUE(client().isValid(7));
  ASSERT_EQ(::kill(static_cast<pid_t>(at(created, {"keeper"}).integerValue()), SIGTERM), 0);
  expectLogged("destroying 7");
}

// By whoever has read its number, which is before qvctl has let go of it.
TEST_F(QVToolSessionTest, IsEndedWithAKeeperThatWasJustMade) {
  service();
  const std::string pipe = root_.path() / "pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  QVSubprocess create({.arguments = command({"session", "create", "7", "--json"}),
                       .environment = environment(),
                       .standardOutputFile = pipe});
  std::string line;
  std::getline(std::ifstream(pipe), line);
  const QVValue created = parseLines(line + "\n").at(0);
  ASSERT_EQ(::kill(static_cast<pid_t>(at(created, {"keeper"}).integerValue()), SIGTERM), 0);
  EXPECT_EQ(create.wait(std::chrono::seconds(60)), 0);
  expectLogged("destroying 7");
}

TEST_F(QVToolSessionTest, KeepsNoDescriptorOfTheCaller) {
  service();
  std::array<int, 2> ends{-1, -1};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  QVSubprocess create({.arguments = command({"session", "create", "7"}),
                       .environment = environment(),
                       .standardOutputFile = root_.path() / "out",
                       .inheritedDescriptor = ends[1]});
  EXPECT_EQ(create.wait(std::chrono::seconds(60)), 0);
  ::close(ends[1]);
  // The other end is closed with the last copy.
  pollfd entry{ends[0], POLLIN, 0};
  EXPECT_EQ(::poll(&entry, 1, 10'000), 1);
  EXPECT_EQ(run({"session", "destroy", "7"}), "");
  ::close(ends[0]);
}

TEST_F(QVToolSessionTest, LeavesNoSessionThatNobodyKnowsOf) {
  service();
  QVSubprocess create({.arguments = command({"session", "create", "7"}),
                       .environment = environment(),
                       .standardOutputFile = "/dev/full",
                       .standardErrorFile = root_.path() / "error"});
  EXPECT_EQ(create.wait(std::chrono::seconds(60)), 1);
  EXPECT_FALSE(client().isValid(7));
}

TEST_F(QVToolSessionTest, LeavesNoKeeperWhereNobodyWaitsForItAnyMore) {
  const int silent = listenInstead();
  QVSubprocess create({.arguments = command({"session", "create", "7", "--start"}),
                       .environment = environment(),
                       .standardErrorFile = root_.path() / "error"});
  pollfd entry{silent, POLLIN, 0};
  ASSERT_EQ(::poll(&entry, 1, 60'000), 1);
  const int keeper = ::accept4(silent, nullptr, nullptr, SOCK_CLOEXEC);
  create.signal(SIGTERM);
  EXPECT_EQ(create.wait(std::chrono::seconds(60)), -SIGTERM);
  // Well before it would give a silent service up.
  pollfd connection{keeper, POLLRDHUP, 0};
  EXPECT_EQ(::poll(&connection, 1, 10'000), 1);
  ::close(keeper);
  ::close(silent);
}

TEST_F(QVToolSessionTest, LeavesNoSessionWhereWhoPrintsItIsKilled) {
  service();
  // Nobody reads, and there is room for nothing more.
  const auto pipe = root_.path() / "pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  const int reader = ::open(pipe.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
  const std::string page(4096, 'x');
  while (::write(reader, page.data(), page.size()) > 0) {
  }
  QVSubprocess create({.arguments = command({"session", "create", "7", "--start"}),
                       .environment = environment(),
                       .standardOutputFile = pipe});
  expectLogged("QVReportingUtilityWait: continuing");
  create.signal(SIGTERM);
  EXPECT_EQ(create.wait(std::chrono::seconds(60)), -SIGTERM);
  expectLogged("deallocing this session");
  EXPECT_FALSE(client().isValid(7));
  ::close(reader);
}

TEST_F(QVToolSessionTest, RefusesWhatTheServiceWouldTakeWithoutAWord) {
  startSession(7, kTelephony);
  EXPECT_THAT(qvctl({"session", "create", "7"}).error, HasSubstr("a session 7 already"));
  EXPECT_EQ(qvctl({"session", "create", "7"}).status, 1);
  EXPECT_EQ(qvctl({"session", "stop", "7"}).status, 1);
  EXPECT_THAT(qvctl({"session", "stop", "7"}).error, HasSubstr("its own program"));
  EXPECT_EQ(qvctl({"session", "destroy", "7"}).status, 1);
  EXPECT_EQ(qvctl({"session", "start", "8"}).status, 1);
  EXPECT_EQ(qvctl({"session", "create", "0"}).status, 2);
  EXPECT_EQ(qvctl({"session", "create", "9", "--service", "nothing"}).status, 2);
}

TEST_F(QVToolSessionTest, NamesWhatCannotBeSent) {
  service();
  const std::vector<std::pair<Arguments, std::string>> wrong{
      {{"session", "create", "7", "--configuration", "{"}, "the configuration: line 1"},
      {{"session", "create", "7", "--configuration", "[1]"}, "the configuration: no JSON object"},
      {{"session", "create", "7", "--configuration", R"({"a":null})"},
       "a: there is no null in configurations"},
      {{"session", "run", "--configuration", "[1]", "--", "true"},
       "the configuration: no JSON object"},
      {{"session", "create", "7", "--set", "a=\xFF"}, "configuration"},
      {{"send", "--all", "--payload", "[1]"}, "the payload: no JSON object"},
      {{"send", "--all", "a:json=null"}, "a: there is no null in messages"},
      {{"send", "--all", R"(a:json=[1,{"b":[null]}])"}, "a[1].b[0]: there is no null in messages"}};
  for (const auto& [arguments, words] : wrong) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 2) << testing::PrintToString(arguments) << output.error;
    EXPECT_THAT(output.error, HasSubstr(words));
    if (arguments[0] == "session") {
      EXPECT_THAT(output.error, Not(HasSubstr("payload")));
    }
  }
}

TEST_F(QVToolSessionTest, SaysThatTheServiceDoesNotRun) {
  for (const Arguments& arguments : {Arguments{"session", "create", "7"},
                                     {"session", "start", "7"},
                                     {"session", "stop", "7"},
                                     {"session", "send", "7", "a=1"},
                                     {"send", "--all", "a=1"},
                                     {"session", "run", "--", "true"},
                                     {"sessions"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 3) << testing::PrintToString(arguments) << output.error;
    EXPECT_THAT(output.error, AllOf(StartsWith("qvctl: "), HasSubstr(root_.socket().string())));
  }
}

TEST_F(QVToolSessionTest, ReportsTheLifeOfACommand) {
  service();
  const std::string tool = QVDaemonProcess::program("qvctl").string();
  const Output output = qvctl(
      {"session", "run", "--id", "7", "--service", "haptics", "--", "sh", "-c",
       "echo session $QUIETVOX_SESSION; echo wrong >&2; \"$0\" send from=inside; exit 5", tool});
  EXPECT_EQ(output.status, 5);
  EXPECT_EQ(output.out, "session 7\n");
  EXPECT_EQ(output.error, "wrong\n");
  endService();
  const auto sent = messages(7);
  ASSERT_THAT(sent, SizeIs(3));
  EXPECT_EQ(sent[0], R"(1|1|{"command":"sh"})");
  EXPECT_EQ(sent[1], R"(1|0|{"from":"inside"})");
  const auto last = parseLines(sent[2].substr(4));
  EXPECT_EQ(at(last[0], {"command"}), QVValue("sh"));
  EXPECT_EQ(at(last[0], {"exit_status"}), QVValue(5));
  EXPECT_GT(at(last[0], {"wall_seconds"}).doubleValue(), 0);
  EXPECT_EQ(at(last[0], {"user_seconds"}).kind(), QVValue::Kind::real);
  EXPECT_EQ(at(last[0], {"system_seconds"}).kind(), QVValue::Kind::real);
  EXPECT_TRUE(at(last[0], {"signal"}).isAbsent());
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NULL"), 0);
}

TEST_F(QVToolSessionTest, ReportsMemoryThatIsTheCommandsOwn) {
  service();
  EXPECT_EQ(run({"session", "run", "--id", "7", "--", "true"}), "");
  EXPECT_EQ(run({"session", "run", "--id", "8", "--", "/usr/bin/python3", "-c",
                 "bytearray(b'x' * (64 << 20))"}),
            "");
  endService();
  // qvctl itself had more than "true" takes.
  EXPECT_TRUE(at(parseLines(messages(7).back().substr(4))[0], {"max_resident_kib"}).isAbsent());
  EXPECT_GT(at(parseLines(messages(8).back().substr(4))[0], {"max_resident_kib"}).integerValue(),
            64 << 10);
}

TEST_F(QVToolSessionTest, CanBeEndedWhileTheServiceIsSilent) {
  const int silent = listenInstead();
  const auto ran = terminal({"session", "run", "--", "true"});
  pollfd entry{silent, POLLIN, 0};
  ASSERT_EQ(::poll(&entry, 1, 60'000), 1);
  ran->signal(SIGTERM);
  EXPECT_EQ(ran->wait(), -SIGTERM);
  ::close(silent);
}

TEST_F(QVToolSessionTest, PassesSignalsOnToTheCommand) {
  service();
  const auto ran = terminal({"session", "run", "--id", "7", "--", "sh", "-c",
                             "trap 'echo hung up' HUP; echo ready; read line; kill -KILL $$"});
  ASSERT_TRUE(ran->await("ready"));
  ran->signal(SIGHUP);
  ASSERT_TRUE(ran->await("hung up"));
  ran->type("\n");
  EXPECT_EQ(ran->wait(), 128 + SIGKILL);
  endService();
  const auto last = parseLines(messages(7).back().substr(4));
  EXPECT_EQ(at(last[0], {"signal"}), QVValue(SIGKILL));
}

TEST_F(QVToolSessionTest, GivesTheCommandTheSignalsThatItWasStartedWith) {
  service();
  // Without the C library's own, which it ignores in what it spawns: signals 1 to 28.
  const Arguments show{"grep", "-oE", "Sig(Blk|Ign)|[0-9a-f]{7}$", "/proc/self/status"};
  Arguments arguments{"session", "run", "--"};
  arguments.insert(arguments.end(), show.begin(), show.end());
  for (const std::string how : {"--default-signal=PIPE", "--ignore-signal=PIPE",
                                "--ignore-signal=HUP", "--block-signal=USR1"}) {
    Arguments direct{"env", how};
    direct.insert(direct.end(), show.begin(), show.end());
    const Output output = qvctl(arguments, {"env", how});
    EXPECT_EQ(output.status, 0) << output.error;
    EXPECT_THAT(output.out, HasSubstr("SigIgn"));
    EXPECT_EQ(output.out, QVSubprocess::run(direct).text) << how;
  }
}

TEST_F(QVToolSessionTest, GivesTheCommandItsStandardInput) {
  service();
  const auto ran = terminal({"session", "run", "--", "sh", "-c", "read line; echo got $line"});
  ran->type("a line\n");
  EXPECT_EQ(ran->wait(), 0);
  EXPECT_THAT(ran->shown(), HasSubstr("got a line"));
}

TEST_F(QVToolSessionTest, IsInterruptedWithItsCommandOnce) {
  service();
  const auto ran = terminal({"session", "run", "--", "sh", "-c",
                             "trap 'echo interrupted; exit 9' INT; echo ready; read line"});
  ASSERT_TRUE(ran->await("ready"));
  ran->type("\x03");
  EXPECT_EQ(ran->wait(), 9);
  EXPECT_THAT(ran->shown(), HasSubstr("interrupted"));
}

TEST_F(QVToolSessionTest, SaysThatThereIsNoSuchCommand) {
  service();
  EXPECT_EQ(qvctl({"session", "run", "--", "/nowhere/command"}).status, 127);
  std::ofstream(root_.path() / "file") << "no program";
  EXPECT_EQ(qvctl({"session", "run", "--id", "7", "--", root_.path() / "file"}).status, 126);
  endService();
  EXPECT_THAT(messages(7), ElementsAre(R"(1|1|{"command":"file"})",
                                       R"(1|2|{"command":"file","exit_status":126})"));
}

TEST_F(QVToolSessionTest, RunsTheCommandAnyway) {
  const Output output = qvctl({"session", "run", "--anyway", "--", "sh", "-c", "echo ran; exit 5"});
  EXPECT_EQ(output.status, 5);
  EXPECT_EQ(output.out, "ran\n");
  EXPECT_THAT(output.error, HasSubstr("cannot reach the service"));
}

TEST_F(QVToolSessionTest, EndsWithItsCommandWhereTheServiceWentAway) {
  service();
  const auto ran = terminal({"session", "run", "--", "sh", "-c", "echo ready; read line; exit 5"});
  ASSERT_TRUE(ran->await("ready"));
  service().signal(SIGKILL);
  ASSERT_EQ(service().wait(), -SIGKILL);
  ran->type("\n");
  EXPECT_EQ(ran->wait(), 5);
  EXPECT_THAT(ran->shown(), HasSubstr("not reported"));
}

TEST_F(QVToolSessionTest, DoesNotWaitOnWhereTheServiceFallsSilent) {
  const auto ran = terminal({"session", "run", "--id", "7", "--", "sh", "-c",
                             "kill -STOP " + std::to_string(service().pid()) + "; exit 6"});
  ASSERT_TRUE(ran->await("waiting for the service"));
  ran->signal(SIGTERM);
  EXPECT_EQ(ran->wait(), 6);
  EXPECT_THAT(ran->shown(), HasSubstr("not known to be reported"));
  // All of it had been sent.
  service().signal(SIGCONT);
  endService();
  EXPECT_THAT(messages(7).back(), HasSubstr(R"("exit_status":6)"));
}

}  // namespace
