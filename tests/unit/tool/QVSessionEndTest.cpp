// The end of a session of which the service says nothing.

#include "platform/linux/QVDescriptor.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVSessionEnd.h"

#include <chrono>

#include <gmock/gmock.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class QVSessionEndTest : public testing::Test {
 protected:
  // Something that is connected to, and never answers.
  QVSessionEndTest() {
    places_.socket = root_.socket();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    places_.socket.string().copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(::bind(silent_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address),
              0);
    EXPECT_EQ(::listen(silent_.get(), 1), 0);
  }
  static QVSessionEnd endOver(QVServiceConnection& service) {
    return {service, 7, QVClientPayload(), QVClientCategory(QVClientKind::generic)};
  }

  const QVTemporaryRoot root_;
  const QVDescriptor silent_{::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
  const QVDescriptor interruption_{::eventfd(0, EFD_CLOEXEC)};
  QVToolPlaces places_;
};

TEST_F(QVSessionEndTest, IsWaitedForForOneLimitInAll) {
  QVServiceConnection service(places_);
  EXPECT_EQ(endOver(service).await(interruption_.get(),
                                   {std::chrono::milliseconds(1), std::chrono::milliseconds(10)}),
            "not known to be reported: the service has said nothing for 0.01 s");
}

TEST_F(QVSessionEndTest, IsNoLongerWaitedForAfterASignal) {
  QVServiceConnection service(places_);
  ASSERT_EQ(::eventfd_write(interruption_.get(), 1), 0);
  // Longer than a test may take.
  EXPECT_THAT(endOver(service).await(interruption_.get(),
                                     {std::chrono::milliseconds(1), std::chrono::hours(1)}),
              HasSubstr("a signal ended the wait"));
}

TEST_F(QVSessionEndTest, IsNotReportedWhereTheServiceGoesAway) {
  QVServiceConnection service(places_);
  const QVSessionEnd end = endOver(service);
  const QVDescriptor serving(::accept4(silent_.get(), nullptr, nullptr, SOCK_CLOEXEC));
  ASSERT_EQ(::shutdown(serving.get(), SHUT_RDWR), 0);
  EXPECT_THAT(end.await(-1, {std::chrono::milliseconds(1), std::chrono::hours(1)}),
              StartsWith("not reported: "));
}

}  // namespace
