// A connection to a service that does not answer.

#include "tests/unit/tool/QVSilentServiceTest.h"
#include "tools/qvctl/QVServiceConnection.h"

#include <chrono>

#include <gmock/gmock.h>

namespace {

using ::testing::HasSubstr;

// Whoever waits in these tests does so no longer.
constexpr QVServiceConnection::Patience kLittle{.moment = std::chrono::milliseconds(1),
                                                .limit = std::chrono::milliseconds(10)};

class QVServiceConnectionTest : public QVSilentServiceTest {
 protected:
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
