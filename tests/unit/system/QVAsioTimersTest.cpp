#include "platform/linux/queues/QVAsioTimers.h"
#include "tests/unit/system/QVThreadEnds.h"

#include <chrono>
#include <memory>
#include <string_view>

#include <gtest/gtest.h>

namespace {

using namespace std::chrono_literals;

// Runs its items where they are enqueued: delayed ones on the timer thread.
class DirectQueue final : public QVWorkQueue {
 public:
  void async(QVWorkItem item) override { item(); }
  void asyncAfter(QVDuration, QVWorkItem item) override { item(); }
  std::string_view label() const override { return "direct"; }
};

TEST(QVAsioTimersTest, HasNoThreadWithoutDelayedItems) {
  constexpr int kRounds = 3;
  const auto queue = std::make_shared<DirectQueue>();
  QVThreadEnds ends;
  QVAsioTimers timers;
  for (int round = 1; round <= kRounds; ++round) {
    timers.enqueueAfter(1us, queue, [&ends] { ends.watchThisThread(); });
    ASSERT_TRUE(ends.waitUntilWatched(round));
    ASSERT_TRUE(ends.waitUntilLeft(0)) << "the thread stays in round " << round;
  }
}

}  // namespace
