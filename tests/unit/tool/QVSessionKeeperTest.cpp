// What stop and destroy make of a session's keeper that does not do what it should.

#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "tests/unit/tool/QVSilentServiceTest.h"
#include "tools/qvctl/QVSessionKeeper.h"
#include "tools/qvctl/QVToolFailure.h"

#include <chrono>

#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

namespace {

using ::testing::HasSubstr;
using Request = QVSessionKeeper::Request;

// Whoever waits in these tests does so no longer.
constexpr std::chrono::milliseconds kLittle{10};

class QVSessionKeeperTest : public QVSilentServiceTest {
 protected:
  // Where the keeper of session 7 is looked for.
  sockaddr_un address() const {
    struct stat file {};
    EXPECT_EQ(::stat(places_.socket.c_str(), &file), 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    QVText("quietvox-session/", uint64_t{file.st_dev}, "/", uint64_t{file.st_ino}, "/7")
        .copy(address.sun_path + 1, sizeof address.sun_path - 1);
    return address;
  }
  void expectFailure(Request request, QVToolStatus status, const std::string& words) const {
    try {
      QVSessionKeeper(places_, kLittle).ask(7, request);
      ADD_FAILURE() << "it did not fail";
    } catch (const QVToolFailure& failure) {
      EXPECT_EQ(failure.status(), status);
      EXPECT_THAT(failure.what(), HasSubstr(words));
    }
  }

  const QVDescriptor keeper_{::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0)};
};

TEST_F(QVSessionKeeperTest, IsNotThere) {
  expectFailure(Request::stop, QVToolStatus::failed, "was not created with qvctl session create");
}

TEST_F(QVSessionKeeperTest, IsNotSaidToHaveEndedWhereItIsSlow) {
  listen(keeper_, address(), 4);
  expectFailure(Request::stop, QVToolStatus::notRunning, "does not answer");
  expectFailure(Request::destroy, QVToolStatus::notRunning, "does not answer");
}

TEST_F(QVSessionKeeperTest, IsNotWaitedForWhereItTakesNoConnections) {
  const sockaddr_un place = address();
  listen(keeper_, place, 0);
  const QVDescriptor first(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::connect(first.get(), reinterpret_cast<const sockaddr*>(&place), sizeof place), 0);
  expectFailure(Request::stop, QVToolStatus::notRunning, "does not take connections");
}

}  // namespace
