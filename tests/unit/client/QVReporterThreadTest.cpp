// The thread that a reporter makes, as a guest in its program.

#include "tests/unit/client/QVReporterFixture.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <string>

#include <gmock/gmock.h>
#include <pthread.h>
#include <sched.h>

namespace {

// What a callback's thread is.
struct QVThreadTraits {
  int policy = -1;
  std::size_t stackBytes = 0;
  std::string name;

  static QVThreadTraits own() {
    QVThreadTraits traits;
    traits.policy = ::sched_getscheduler(0);
    pthread_attr_t attributes;
    ::pthread_getattr_np(::pthread_self(), &attributes);
    ::pthread_attr_getstacksize(&attributes, &traits.stackBytes);
    ::pthread_attr_destroy(&attributes);
    std::array<char, 16> name{};
    ::pthread_getname_np(::pthread_self(), name.data(), name.size());
    traits.name = name.data();
    return traits;
  }
};

class QVReporterThreadTest : public QVReporterFixture {
 protected:
  // Of the thread of a reporter that the calling thread opens.
  QVThreadTraits traitsOfOpened() {
    QVReporterOptions given = options();
    QVThreadTraits traits;
    given.dropped = [&traits](const QVDropCounts&) { traits = QVThreadTraits::own(); };
    open(std::move(given));
    QVClientPayload payload;
    payload.beginArray("open");
    reporter_->sendToEverySession(payload, kPlayback, QVClientMessageType::generic);
    // At its end it tells what it has not told yet.
    reporter_.reset();
    return traits;
  }
};

TEST_F(QVReporterThreadTest, IsSmallAndNamed) {
  const QVThreadTraits traits = traitsOfOpened();
  EXPECT_EQ(traits.name, "quietvox");
  // Sanitizers have thread-local variables of a megabyte and more; usual are 8 MiB.
  EXPECT_LE(traits.stackBytes, std::size_t{4} << 20);
}

TEST_F(QVReporterThreadTest, IsNoRealtimeThreadThoughOneMadeIt) {
  const sched_param realtime{.sched_priority = 1};
  if (::sched_setscheduler(0, SCHED_FIFO, &realtime) != 0) {
    GTEST_SKIP() << "the system grants no real-time scheduling: " << std::strerror(errno);
  }
  const QVThreadTraits traits = traitsOfOpened();
  const sched_param ordinary{};
  ASSERT_EQ(::sched_setscheduler(0, SCHED_OTHER, &ordinary), 0);
  EXPECT_EQ(traits.policy, SCHED_OTHER);
}

}  // namespace
