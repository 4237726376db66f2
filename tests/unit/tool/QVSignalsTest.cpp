#include "tools/qvctl/QVSignals.h"

#include <csignal>

#include <gtest/gtest.h>

namespace {

TEST(QVSignalsTest, LeavesOutWhatIsIgnored) {
  ASSERT_NE(std::signal(SIGUSR1, SIG_IGN), SIG_ERR);
  const QVSignals signals{SIGUSR1, SIGUSR2};
  ::raise(SIGUSR1);
  EXPECT_FALSE(signals.next().has_value());
  ::raise(SIGUSR2);
  const auto came = signals.next();
  ASSERT_TRUE(came.has_value());
  EXPECT_EQ(came->ssi_signo, static_cast<uint32_t>(SIGUSR2));
  ASSERT_NE(std::signal(SIGUSR1, SIG_DFL), SIG_ERR);
  ::pthread_sigmask(SIG_SETMASK, &signals.previous(), nullptr);
}

}  // namespace
