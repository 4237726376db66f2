// How the service comes to its socket, and what it says to its manager.

#include "tests/support/QVDirectoryWatch.h"
#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::Optional;

int listenAt(const std::filesystem::path& path) {
  const int descriptor = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(descriptor, 16) != 0) {
    ::close(descriptor);
    throw std::runtime_error("cannot listen at " + path.string());
  }
  return descriptor;
}

class QVOnDemandStartTest : public QVEndToEndTest {
 protected:
  // Runs a service that must not come up, and answers what it wrote.
  QVSubprocess::Output runInVain(std::map<std::string, std::string> environment = {},
                                 std::vector<std::string> wrapper = {}) {
    const auto file = root_.path() / "vain";
    wrapper.push_back(QVDaemonProcess::program());
    environment.merge(QVDaemonProcess::environment(root_));
    environment.erase("NOTIFY_SOCKET");
    QVSubprocess process({.arguments = wrapper,
                          .environment = environment,
                          .standardOutputFile = file,
                          .standardErrorFile = file});
    const auto status = process.wait(std::chrono::seconds(60));
    EXPECT_TRUE(status.has_value()) << "a service came up";
    std::ifstream stream(file);
    return {status.value_or(0), {std::istreambuf_iterator<char>(stream), {}}};
  }
};

TEST_F(QVOnDemandStartTest, TellsItsManagerWhenItIsReadyAndWhenItStops) {
  service().signal(SIGTERM);  // it is ready, or there would be no service
  EXPECT_THAT(service().nextNotification(), HasSubstr("STOPPING=1"));
  EXPECT_EQ(service().wait(), 0);
}

TEST_F(QVOnDemandStartTest, MakesItsOwnSocketForOwnerAndGroup) {
  service();
  struct stat status {};
  ASSERT_EQ(::stat(root_.socket().c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777, 0660U);
}

TEST_F(QVOnDemandStartTest, TakesAnInheritedSocket) {
  const auto path = root_.path() / "inherited.socket";
  const int socket = listenAt(path);
  // The first client comes before the service.
  QVRawPeer early(path, QVRawPeer::Opening::silent);
  early.send(QVRawPeer::opening() + createCall(7).bytes(1));
  startService({.inheritedSocket = socket});
  ::close(socket);

  EXPECT_TRUE(early.receiveLine().starts_with("OK "));
  EXPECT_TRUE(early.awaitReply(1).boolean());
  EXPECT_TRUE(QVPeerClient(path).isValid(7));
  EXPECT_FALSE(std::filesystem::exists(root_.socket()));
  endService();
  // It belongs to the manager, who starts the service again at the next call.
  EXPECT_TRUE(std::filesystem::exists(path));
}

TEST_F(QVOnDemandStartTest, IsStartedByTheFirstCall) {
  const auto path = root_.path() / "activated.socket";
  std::vector<std::string> arguments{"systemd-socket-activate", "-l", path};
  auto environment = QVDaemonProcess::environment(root_);
  environment.erase("NOTIFY_SOCKET");
  for (const auto& [name, value] : environment) arguments.push_back("-E" + name + "=" + value);
  arguments.push_back(QVDaemonProcess::program());
  const QVDirectoryWatch watch(root_.path());
  QVSubprocess manager({.arguments = arguments,
                        .standardOutputFile = root_.log(),
                        .standardErrorFile = root_.log()});
  expectLogged("Listening on");
  EXPECT_FALSE(std::filesystem::exists(root_.store()));

  QVPeerClient client(path);
  client.create(7);
  EXPECT_TRUE(client.isValid(7));
  expectLogged("created reporting session for ID: 7");
  manager.signal(SIGTERM);
  EXPECT_THAT(manager.wait(std::chrono::seconds(60)), Optional(0));
  EXPECT_TRUE(std::filesystem::exists(root_.store()));
}

TEST_F(QVOnDemandStartTest, ReplacesTheSocketOfAServiceThatDied) {
  service().signal(SIGKILL);
  ASSERT_EQ(service().wait(), -SIGKILL);
  ASSERT_TRUE(std::filesystem::exists(root_.socket()));
  forgetService();
  auto client = connectClient();
  expectServes(client);
}

TEST_F(QVOnDemandStartTest, DoesNotStealTheSocketOfAServiceThatRuns) {
  auto client = connectClient();
  const auto second = runInVain();
  EXPECT_GT(second.status, 0) << second.text;
  EXPECT_THAT(second.text, AllOf(HasSubstr("<3>"), HasSubstr(root_.socket().string())));
  expectServes(client);
  auto other = connectClient();
  expectServes(other);
}

TEST_F(QVOnDemandStartTest, DoesNotReplaceWhatIsNoSocket) {
  std::ofstream(root_.socket()) << "somebody's file";
  const auto output = runInVain();
  EXPECT_GT(output.status, 0) << output.text;
  EXPECT_THAT(output.text, AllOf(HasSubstr("<3>"), HasSubstr(root_.socket().string())));
  EXPECT_EQ(std::filesystem::file_size(root_.socket()), 15U);
}

class QVOnDemandStartDirectoryTest : public QVOnDemandStartTest,
                                     public ::testing::WithParamInterface<const char*> {};

TEST_P(QVOnDemandStartDirectoryTest, EndsWhereItsDirectoryIsMissing) {
  const std::string missing = root_.path() / "missing";
  const auto output = runInVain({{GetParam(), missing}});
  EXPECT_GT(output.status, 0) << output.text;
  EXPECT_THAT(output.text, AllOf(HasSubstr("<3>"), HasSubstr(missing)));
}

TEST_P(QVOnDemandStartDirectoryTest, EndsWhereItsDirectoryIsAFile) {
  const std::string file = root_.path() / "file";
  std::ofstream{file} << "no directory";
  const auto output = runInVain({{GetParam(), file}});
  EXPECT_GT(output.status, 0) << output.text;
  EXPECT_THAT(output.text, AllOf(HasSubstr("<3>"), HasSubstr(file)));
}

TEST_P(QVOnDemandStartDirectoryTest, EndsWhereItsDirectoryIsNotToBeWritten) {
  const std::string directory = root_.path() / "read-only";
  std::filesystem::create_directory(directory);
  std::filesystem::permissions(directory, std::filesystem::perms(0500));
  // Root may write everywhere, but for this privilege.
  std::vector<std::string> wrapper;
  if (::getuid() == 0) wrapper = {"setpriv", "--bounding-set=-dac_override,-dac_read_search"};
  const auto output = runInVain({{GetParam(), directory}}, wrapper);
  EXPECT_GT(output.status, 0) << output.text;
  EXPECT_THAT(output.text, AllOf(HasSubstr("<3>"), HasSubstr(directory)));
}

INSTANTIATE_TEST_SUITE_P(Directories, QVOnDemandStartDirectoryTest,
                         ::testing::Values("RUNTIME_DIRECTORY", "STATE_DIRECTORY"),
                         [](const auto& given) {
                           const std::string name = given.param;
                           return name.substr(0, name.find('_'));
                         });

}  // namespace
