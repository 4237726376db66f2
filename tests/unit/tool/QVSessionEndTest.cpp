// The end of a session of which the service says nothing.

#include "platform/linux/QVDescriptor.h"
#include "tests/unit/tool/QVSilentServiceTest.h"
#include "tools/qvctl/QVSessionEnd.h"

#include <chrono>

#include <gmock/gmock.h>
#include <sys/eventfd.h>

namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class QVSessionEndTest : public QVSilentServiceTest {
 protected:
  static QVSessionEnd endOver(QVServiceConnection& service) {
    return {service, 7, QVClientPayload(), QVClientCategory(QVClientKind::generic)};
  }

  const QVDescriptor interruption_{::eventfd(0, EFD_CLOEXEC)};
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
