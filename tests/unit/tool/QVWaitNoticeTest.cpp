#include "tools/qvctl/QVWaitNotice.h"

#include <array>
#include <chrono>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <pty.h>

namespace {

using std::chrono::milliseconds;

// Longer than any test takes.
constexpr milliseconds kNever = std::chrono::hours(24 * 365);

class QVWaitNoticeTest : public testing::Test {
 protected:
  QVWaitNoticeTest() {
    int reader = -1;
    int terminal = -1;
    EXPECT_EQ(::openpty(&reader, &terminal, nullptr, nullptr, nullptr), 0);
    reader_ = QVDescriptor(reader);
    terminal_ = QVDescriptor(terminal);
  }
  // Waits for something to be shown.
  std::string shown() const {
    pollfd entry{reader_.get(), POLLIN, 0};
    EXPECT_EQ(::poll(&entry, 1, 60'000), 1);
    std::array<char, 256> bytes;
    const ssize_t count = ::read(reader_.get(), bytes.data(), bytes.size());
    return count < 0 ? std::string() : std::string(bytes.data(), static_cast<std::size_t>(count));
  }
  bool isAnythingShown() const {
    pollfd entry{reader_.get(), POLLIN, 0};
    return ::poll(&entry, 1, 0) == 1;
  }

  QVDescriptor reader_;
  QVDescriptor terminal_;
};

TEST_F(QVWaitNoticeTest, SaysThatItWaits) {
  QVWaitNotice notice(milliseconds(1), terminal_.get());
  EXPECT_EQ(shown(), "qvctl: waiting for the service ...\r\n");
  EXPECT_TRUE(notice.end());
  EXPECT_TRUE(notice.end());
  EXPECT_FALSE(isAnythingShown());
}

TEST_F(QVWaitNoticeTest, SaysNothingOfAShortWait) {
  QVWaitNotice notice(kNever, terminal_.get());
  EXPECT_FALSE(notice.end());
  EXPECT_FALSE(isAnythingShown());
}

TEST_F(QVWaitNoticeTest, SaysNothingWhereNobodySits) {
  std::array<int, 2> ends{-1, -1};
  ASSERT_EQ(::pipe(ends.data()), 0);
  const QVDescriptor reader(ends[0]);
  const QVDescriptor writer(ends[1]);
  {
    QVWaitNotice notice(milliseconds(0), writer.get());
    EXPECT_FALSE(notice.end());
  }
  pollfd entry{reader.get(), POLLIN, 0};
  EXPECT_EQ(::poll(&entry, 1, 0), 0);
}

}  // namespace
