// The service's trace points, as tools see them from outside.

#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <csignal>
#include <fstream>

#include <gmock/gmock.h>
#include <sys/socket.h>

namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

constexpr uint16_t kTelephony = 2;

class QVTracePointsTest : public QVEndToEndTest {
 protected:
  // The process that listens at the other end of a client's connection.
  static pid_t processAt(const QVRawPeer& peer) {
    ucred credentials{};
    socklen_t length = sizeof credentials;
    ::getsockopt(peer.descriptor(), SOL_SOCKET, SO_PEERCRED, &credentials, &length);
    return credentials.pid;
  }
};

TEST_F(QVTracePointsTest, AreListedInTheProgram) {
  const auto notes = QVSubprocess::run({"readelf", "-n", QVDaemonProcess::program()});
  EXPECT_EQ(notes.status, 0);
  EXPECT_THAT(notes.text, AllOf(HasSubstr("Provider: quietvox"), HasSubstr("Name: trace")));
}

TEST_F(QVTracePointsTest, AreReadWhileTheServiceRuns) {
  const auto commands = root_.path() / "commands";
  // The service's own threads go on meanwhile; a signal is the service's, not the debugger's.
  std::ofstream(commands) << "set pagination off\n"
                             "set debuginfod enabled off\n"
                             "set startup-with-shell off\n"
                             "set disable-randomization off\n"
                             "handle SIGTERM nostop noprint pass\n"
                             "break -probe-stap quietvox:trace\n"
                             "commands\n"
                             "silent\n"
                             "printf \"trace %08x %d %d %d %d\\n\", $_probe_arg0, $_probe_arg1, "
                             "$_probe_arg2, $_probe_arg3, $_probe_arg4\n"
                             "continue\n"
                             "end\n"
                             "run\n";
  auto environment = QVDaemonProcess::environment(root_);
  environment.erase("NOTIFY_SOCKET");
  // Leaks are looked for in a way that a debugger forbids.
  environment["ASAN_OPTIONS"] = "detect_leaks=0";
  const auto output = root_.path() / "debugger" / "log";
  std::filesystem::create_directory(output.parent_path());
  const QVDirectoryWatch places(root_.runtime());
  const QVServiceLog seen(output);
  QVSubprocess debugger(
      {.arguments = {"gdb", "-nx", "-q", "-batch", "-x", commands, QVDaemonProcess::program()},
       .environment = environment,
       .standardOutputFile = output,
       .standardErrorFile = output});
  // Either the service makes its socket, or the debugger says what is in its way.
  const QVDirectoryWatch words(output.parent_path());
  ASSERT_TRUE(words.await([&] {
    return std::filesystem::exists(root_.socket()) || seen.count("not permitted") > 0 ||
           debugger.wait(std::chrono::milliseconds(0)).has_value();
  }) || std::filesystem::exists(root_.socket()));
  if (!std::filesystem::exists(root_.socket())) {
    const auto refusals = seen.lines("not permitted");
    ASSERT_FALSE(refusals.empty()) << ::testing::PrintToString(seen.lines());
    GTEST_SKIP() << "the kernel lets no process be traced here: " << refusals[0];
  }

  QVPeerClient client(root_.socket());
  client.create(7, kTelephony);
  client.start(7);
  client.sendMessage({{"a", 1}}, {7});
  client.stop(7);
  client.destroy(7);
  ASSERT_TRUE(seen.await("trace 21042834"));
  ASSERT_EQ(::kill(processAt(client), SIGTERM), 0);
  EXPECT_EQ(debugger.wait(std::chrono::seconds(60)), 0);

  std::vector<std::string> codes;
  for (const std::string& line : seen.lines("trace ")) {
    if (line.starts_with("trace ")) codes.push_back(line);
  }
  EXPECT_THAT(codes, ElementsAre("trace 21042814 0 0 0 0",    // create
                                 "trace 21042828 0 0 0 0",    // session created
                                 "trace 21042818 0 0 0 0",    // start
                                 "trace 2104282c 0 0 0 0",    // session started
                                 "trace 21042824 0 0 0 0",    // routed message
                                 "trace 21042838 0 0 0 0",    // message sent
                                 "trace 2104281c 0 0 0 0",    // stop
                                 "trace 21042830 0 0 0 0",    // session stopped
                                 "trace 21042838 0 0 0 0",    // its summary
                                 "trace 21042820 0 0 0 0",    // destroy
                                 "trace 21042834 0 0 0 0"));  // session destroyed
}

}  // namespace
