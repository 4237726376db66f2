// What qvctl says of the service to a user who may not look into the processes of others.

#include "tests/e2e/qvctl/QVToolTest.h"

#include <filesystem>
#include <fstream>
#include <list>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using ::testing::HasSubstr;

// Users that this program does not run as: whose the socket is, and others.
// Users of this test alone: processes of the same ones, as of another such test that runs
// meanwhile, would count. Three in a row, below those that a container may lack.
const uid_t kOwner = 20'000 + 3 * static_cast<uid_t>(::getpid() % 10'000);
const uid_t kOther = kOwner + 1;
const uid_t kCaller = kOwner + 2;

const std::vector<std::vector<std::string>> kLooking{
    {"status"}, {"sessions"}, {"kill"}, {"reporting", "show"}};

class QVToolLookTest : public QVToolTest {
 protected:
  void SetUp() override {
    if (::getuid() != 0) GTEST_SKIP() << "only root can turn into another user";
    std::filesystem::copy_file("/usr/bin/sed", root_.path() / "quietvoxd");
    ASSERT_EQ(::chmod(root_.path().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(root_.runtime().c_str(), 0755), 0);
    listener_ = listenInstead();
    ASSERT_EQ(::chown(root_.socket().c_str(), kOwner, ::getegid()), 0);
    ASSERT_EQ(::chmod(root_.socket().c_str(), 0666), 0);
  }
  ~QVToolLookTest() override { ::close(listener_); }

  static std::vector<std::string> as(uid_t user) {
    const std::string number = std::to_string(user);
    return {"setpriv", "--reuid=" + number, "--regid=" + number, "--clear-groups"};
  }
  // A process that is called like the service.
  void pretend(uid_t user) {
    auto arguments = as(user);
    arguments.insert(arguments.end(), {root_.path() / "quietvoxd", "-u", "s/here/it runs/"});
    QVTerminal& process = processes_.emplace_back(QVTerminal::Options{.arguments = arguments});
    process.type("here\n");
    EXPECT_TRUE(process.await("it runs")) << process.shown();
  }
  Output look(const Arguments& arguments) const {
    // Where the program lies, another user may not even look; it is taken along as a descriptor.
    const int program = ::open(QVDaemonProcess::program("qvctl").c_str(), O_RDONLY | O_CLOEXEC);
    auto whole = as(kCaller);
    whole.emplace_back("/proc/self/fd/3");
    whole.insert(whole.end(), arguments.begin(), arguments.end());
    const auto file = root_.path() / "result";
    std::filesystem::remove(file);
    QVSubprocess process({.arguments = whole,
                          .environment = environment(),
                          .standardOutputFile = file,
                          .standardErrorFile = file,
                          .inheritedDescriptor = program});
    const auto status = process.wait(std::chrono::seconds(60));
    ::close(program);
    std::ifstream stream(file);
    return {status.value_or(-1), {std::istreambuf_iterator<char>(stream), {}}, {}};
  }
  bool hasBeenCalled() const {
    const int connection = ::accept(listener_, nullptr, nullptr);
    if (connection >= 0) ::close(connection);
    return connection >= 0;
  }

  int listener_ = -1;
  std::list<QVTerminal> processes_;
};

TEST_F(QVToolLookTest, TakesNobodyElsesProcessForTheService) {
  pretend(kOther);
  for (const auto& arguments : kLooking) {
    const Output output = look(arguments);
    EXPECT_EQ(output.status, arguments[0] == "reporting" ? 0 : 3) << output.out;
    EXPECT_THAT(output.out, HasSubstr("not running"));
    EXPECT_FALSE(hasBeenCalled()) << arguments[0];
  }
}

TEST_F(QVToolLookTest, FindsTheServiceAmongOthersOfItsName) {
  pretend(kOther);
  pretend(kOwner);
  // Nobody answers, so it is one that is not let in that says how far it came.
  ASSERT_EQ(::chmod(root_.socket().c_str(), 0660), 0);
  for (const auto& arguments : kLooking) {
    const Output output = look(arguments);
    EXPECT_EQ(output.status, 4) << output.out;
    EXPECT_THAT(output.out, HasSubstr("ermission denied"));
    EXPECT_THAT(output.out, HasSubstr("members of the group")) << arguments[0];
  }
}

TEST_F(QVToolLookTest, AsksNobodyWhereItIsNotToBeSeenWhetherTheServiceRuns) {
  pretend(kOwner);
  pretend(kOwner);
  for (const auto& arguments : kLooking) {
    const Output output = look(arguments);
    EXPECT_EQ(output.status, 3) << arguments[0] << output.out;
    EXPECT_THAT(output.out, HasSubstr(arguments[0] == "status" ? "unknown" : "is not to be seen"));
    EXPECT_FALSE(hasBeenCalled()) << arguments[0];
  }
  ASSERT_EQ(::chmod(root_.socket().c_str(), 0660), 0);
  for (const auto& arguments : kLooking) {
    const Output output = look(arguments);
    EXPECT_EQ(output.status, 4) << arguments[0] << output.out;
    EXPECT_THAT(output.out, HasSubstr("members of the group")) << arguments[0];
  }
}

}  // namespace
