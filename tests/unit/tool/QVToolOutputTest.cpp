#include "platform/linux/QVDescriptor.h"
#include "tools/qvctl/QVToolOutput.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <string>
#include <thread>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

// The ends of a pipe of one page, the writing one non-blocking.
struct NarrowPipe {
  NarrowPipe() {
    std::array<int, 2> ends{};
    EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    reader = QVDescriptor(ends[0]);
    writer = QVDescriptor(ends[1]);
    ::fcntl(ends[1], F_SETPIPE_SZ, 4096);
    EXPECT_EQ(::fcntl(ends[1], F_SETFL, O_NONBLOCK), 0);
  }
  QVDescriptor reader;
  QVDescriptor writer;
};

TEST(QVToolOutputTest, WaitsForAReaderThoughItsDescriptorDoesNot) {
  NarrowPipe pipe;
  std::string read;
  std::thread reader([&] {
    std::array<char, 512> part{};
    while (true) {
      const ssize_t count = ::read(pipe.reader.get(), part.data(), part.size());
      if (count <= 0) break;
      read.append(part.data(), static_cast<std::size_t>(count));
    }
  });
  const std::string text(std::size_t{1024} * 1024, 'x');
  {
    QVToolOutput output(false, pipe.writer.get());
    EXPECT_NO_THROW(output.raw(text));
    EXPECT_NO_THROW(output.flush());
  }
  pipe.writer = QVDescriptor();
  reader.join();
  EXPECT_EQ(read.size(), text.size());
}

TEST(QVToolOutputTest, SaysThatTheReaderHasGoneFromADescriptorThatDoesNotWait) {
  NarrowPipe pipe;
  const std::string full(4096, 'x');
  ASSERT_EQ(::write(pipe.writer.get(), full.data(), full.size()), 4096);
  ASSERT_NE(std::signal(SIGPIPE, SIG_IGN), SIG_ERR);
  QVToolOutput output(false, pipe.writer.get());
  output.line("more");
  pipe.reader = QVDescriptor();
  EXPECT_THROW(output.flush(), QVReaderGone);
  ASSERT_NE(std::signal(SIGPIPE, SIG_DFL), SIG_ERR);
}

}  // namespace
