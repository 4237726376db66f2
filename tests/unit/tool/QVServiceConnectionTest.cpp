// A connection to a service that does not answer.

#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVServiceConnection.h"

#include <chrono>

#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace {

using ::testing::HasSubstr;

// Whoever waits in these tests does so no longer.
constexpr QVServiceConnection::Patience kLittle{.moment = std::chrono::milliseconds(1),
                                                .limit = std::chrono::milliseconds(10)};

class QVServiceConnectionTest : public testing::Test {
 protected:
  // Something that is connected to, and never accepts.
  QVServiceConnectionTest() {
    places_.socket = root_.socket();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    places_.socket.string().copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(::bind(silent_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
              0);
    EXPECT_EQ(::listen(silent_.get(), 0), 0);
  }
  // What is said where something fails.
  template <class Action>
  std::string failureOf(Action action) const {
    try {
      action();
    } catch (const QVToolFailure& failure) {
      EXPECT_EQ(failure.status(), QVToolStatus::notRunning);
      return failure.what();
    }
    ADD_FAILURE() << "it did not fail";
    return {};
  }

  const QVTemporaryRoot root_;
  const QVDescriptor silent_{::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
  QVToolPlaces places_;
};

TEST_F(QVServiceConnectionTest, GivesAServiceUpThatDoesNotAnswer) {
  QVServiceConnection connection(places_, {}, kLittle);
  const std::string expected = "the service does not answer: it has said nothing for 0.01 s";
  EXPECT_EQ(failureOf([&] { connection.reporters(); }), expected);
  EXPECT_EQ(failureOf([&] { connection.serviceType(7); }), expected);
  EXPECT_EQ(failureOf([&] { connection.isReporting(); }), expected);
  EXPECT_EQ(failureOf([&] { connection.ask(&QVClient::killServiceAndWait); }), expected);
}

TEST_F(QVServiceConnectionTest, GivesAServiceUpThatDoesNotAccept) {
  // The one that may wait to be let in.
  const QVServiceConnection first(places_, {}, kLittle);
  EXPECT_THAT(failureOf([&] { QVServiceConnection(places_, {}, kLittle); }),
              HasSubstr("the service does not accept clients"));
}

}  // namespace
