#include "platform/QVText.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/log/QVStandardErrorLogSink.h"
#include "platform/linux/log/QVSystemLog.h"
#include "tests/unit/system/QVEvent.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <memory>
#include <mutex>
#include <new>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::EndsWith;
using testing::StartsWith;

// Collects texts; holds the writer in the first write until told, where asked to.
class HoldingSink final : public QVLogSink {
 public:
  void write(std::span<const QVLogLine> lines, const std::atomic<bool>& giveUp) override {
    entered.happen();
    while (isHolding && !giveUp) release.wait();
    if (failing.exchange(false)) throw std::bad_alloc();
    const std::lock_guard lock(mutex);
    for (const QVLogLine& line : lines) {
      texts.push_back(line.text);
      functions.emplace_back(line.function);
      levels.push_back(line.level);
    }
  }

  std::atomic<bool> isHolding{false};
  std::atomic<bool> failing{false};  // the next write
  QVEvent entered;
  QVEvent release;
  std::mutex mutex;
  std::vector<std::string> texts;
  std::vector<std::string> functions;
  std::vector<QVLogLevel> levels;
};

class QVSystemLogTest : public testing::Test {
 protected:
  QVSystemLogTest() {
    auto sink = std::make_unique<HoldingSink>();
    sink_ = sink.get();
    log_ = std::make_unique<QVSystemLog>(std::move(sink));
  }

  // Brings the writer into a write that does not end.
  void hold() {
    sink_->isHolding = true;
    log_->info(nullptr, "f", "held");
    EXPECT_TRUE(sink_->entered.wait());
  }
  void letGo() {
    sink_->isHolding = false;
    sink_->release.happen();
    log_->flush();
  }

  HoldingSink* sink_;
  std::unique_ptr<QVSystemLog> log_;
};

TEST_F(QVSystemLogTest, GoesOnWhereThereIsNoMemoryForAWrite) {
  sink_->failing = true;
  log_->info(nullptr, "f", "lost");
  log_->flush();
  log_->info(nullptr, "f", "next");
  log_->flush();
  const std::lock_guard lock(sink_->mutex);
  EXPECT_THAT(sink_->texts, testing::UnorderedElementsAre(
                                "1 log lines were lost, the log's queue was full", "next"));
}

TEST_F(QVSystemLogTest, CountsTheLinesThatFindNoRoom) {
  hold();
  constexpr std::size_t kRoom = QVLogWriter::kMaximumLines - 1;
  for (std::size_t i = 0; i < kRoom + 10; ++i) log_->info(nullptr, "f", i);
  letGo();
  // The count is written with the lines that were in its way.
  ASSERT_EQ(sink_->texts.size(), 1 + kRoom + 1);
  EXPECT_EQ(sink_->texts[kRoom], QVText(kRoom - 1)) << "the last that found room";
  EXPECT_EQ(sink_->texts.back(), "10 log lines were lost, the log's queue was full");
  EXPECT_EQ(sink_->functions.back(), "-[QVLogWriter writeBatch:lostCount:]");
  EXPECT_EQ(sink_->levels.back(), QVLogLevel::error);
  log_->info(nullptr, "f", "room again");
  log_->flush();
  EXPECT_EQ(sink_->texts.back(), "room again");
}

TEST_F(QVSystemLogTest, BoundsTheTextInItsQueue) {
  hold();
  const std::string text(16 * 1024, 'x');
  constexpr std::size_t kRoom = QVLogWriter::kMaximumBytes / (16 * 1024) - 1;
  for (std::size_t i = 0; i < kRoom + 5; ++i) log_->info(nullptr, "f", text);
  letGo();
  EXPECT_EQ(sink_->texts.size(), 1 + kRoom + 1);
  EXPECT_THAT(sink_->texts.back(), EndsWith("log lines were lost, the log's queue was full"));
}

TEST_F(QVSystemLogTest, ShortensTextsBetweenCharacters) {
  const std::string text = std::string(16 * 1024 - 1, 'x') + "\u00e4" + "rest";
  log_->info(nullptr, "f", text);
  log_->flush();
  ASSERT_EQ(sink_->texts.size(), 1U);
  EXPECT_EQ(sink_->texts[0], std::string(16 * 1024 - 1, 'x') + " ... (6 bytes more)");
}

TEST_F(QVSystemLogTest, WritesWhatIsThereWhenItEnds) {
  // Outlives the log.
  static std::vector<std::string> written;
  class StaticSink final : public QVLogSink {
    void write(std::span<const QVLogLine> lines, const std::atomic<bool>&) override {
      for (const QVLogLine& line : lines) written.push_back(line.text);
    }
  };
  written.clear();
  log_ = std::make_unique<QVSystemLog>(std::make_unique<StaticSink>());
  for (int i = 0; i < 100; ++i) log_->info(nullptr, "f", i);
  log_.reset();
  EXPECT_EQ(written.size(), 100U);
  EXPECT_EQ(written.back(), "99");
}

// Preferences that log and register, as those might whose file cannot be read.
class LoggingPreferences final : public QVPreferences {
 public:
  explicit LoggingPreferences(QVSystemLog& log) : log_(log) {}
  QVDictionary valuesInDomain(std::string_view domain) override {
    log_.readSwitchesFrom(nullptr);  // the inner registration asks nobody
    log_.error(nullptr, "f", "cannot read ", domain);
    log_.registerScope(true, 1, "inner", "", "", 31);
    return {{"key", true}};
  }

 private:
  QVSystemLog& log_;
};

TEST_F(QVSystemLogTest, HoldsNothingWhileItAsksThePreferences) {
  LoggingPreferences preferences(*log_);
  log_->readSwitchesFrom(&preferences);
  const QVLogScope* const scope = log_->registerScope(true, 1, "outer", "domain", "key", 31);
  EXPECT_TRUE(QVLog::logEnabled(QVLog::kVerbose, scope));
  log_->flush();
  EXPECT_THAT(sink_->texts, ElementsAre("cannot read domain"));
}

// The end of a pipe to write to, and what came out of the other.
class Pipe {
 public:
  Pipe() {
    if (pipe2(ends_.data(), O_CLOEXEC) != 0) ADD_FAILURE() << "no pipe";
  }
  ~Pipe() {
    closeReader();
    close(ends_[1]);
  }
  Pipe(const Pipe&) = delete;
  Pipe& operator=(const Pipe&) = delete;

  int writer() const { return ends_[1]; }
  void closeReader() {
    if (ends_[0] >= 0) close(ends_[0]);
    ends_[0] = -1;
  }
  // Another reader than the one that has gone; it waits for nothing.
  void openReader() {
    ends_[0] = open(QVText("/proc/self/fd/", writer()).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (ends_[0] < 0) ADD_FAILURE() << "no reader";
  }
  std::string readSome() const {
    std::array<char, 64 * 1024> bytes;
    const ssize_t count = read(ends_[0], bytes.data(), bytes.size());
    return {bytes.data(), count > 0 ? static_cast<std::size_t>(count) : 0};
  }
  // Reads until `count` lines have come.
  std::string readLines(std::ptrdiff_t count) const {
    std::string text;
    while (std::ranges::count(text, '\n') < count) text += readSome();
    return text;
  }

 private:
  std::array<int, 2> ends_{-1, -1};
};

TEST(QVStandardErrorLogSinkTest, WritesOneLinePerLine) {
  const Pipe pipe;
  QVSystemLog log(std::make_unique<QVStandardErrorLogSink>(pipe.writer()));
  QVLogScope* const scope = log.registerScope(true, 1, "qvrs", "net.quillon.quietvox", "key", 31);
  log.standard(scope, "-[QVReportingServiceDelegate init]", "two\nlines");
  const uint32_t line = __LINE__ - 1;
  log.error(nullptr, "function", "text");
  EXPECT_EQ(pipe.readLines(2), QVText("<5>[qvrs] QVSystemLogTest.cpp:", line,
                                      ":-[QVReportingServiceDelegate init]: two\\nlines\n"
                                      "<3>[default] QVSystemLogTest.cpp:",
                                      line + 2, ":function: text\n"));
}

TEST(QVStandardErrorLogSinkTest, LosesNothingToASlowReader) {
  constexpr int kLines = 5'000;
  const Pipe pipe;
  std::string expected;
  {
    QVSystemLog log(std::make_unique<QVStandardErrorLogSink>(pipe.writer()), 1min);
    // Far more than the pipe holds; no call here waits for the reader.
    for (int i = 0; i < kLines; ++i) {
      log.info(nullptr, "f", i, std::string(60, '.'));
      expected += QVText("f: ", i, std::string(60, '.'), '\n');
    }
    std::istringstream lines(pipe.readLines(kLines));
    std::string read;
    for (std::string line; std::getline(lines, line);) {
      read += line.substr(line.find("f: ")) + '\n';
    }
    EXPECT_EQ(read, expected);
  }
}

TEST(QVStandardErrorLogSinkTest, NeverHoldsUpACallerNorTheEndForAStuckReader) {
  const Pipe pipe;
  QVSystemLog log(std::make_unique<QVStandardErrorLogSink>(pipe.writer()), 1ms);
  for (int i = 0; i < 20'000; ++i) log.info(nullptr, "f", std::string(200, '.'));
  log.flush();
  EXPECT_THAT(pipe.readSome(), StartsWith("<6>[default] QVSystemLogTest.cpp:"));
}

TEST(QVStandardErrorLogSinkTest, OutlivesAReaderThatGoes) {
  Pipe pipe;
  pipe.closeReader();
  QVSystemLog log(std::make_unique<QVStandardErrorLogSink>(pipe.writer()));
  log.info(nullptr, "f", "into nowhere");
  log.flush();
  pipe.openReader();
  log.info(nullptr, "f", "to the next one");
  log.flush();
  EXPECT_THAT(pipe.readSome(), EndsWith(":f: to the next one\n"));
}

TEST(QVStandardErrorLogSinkTest, WritesToSocketsAndFiles) {
  std::array<int, 2> ends{};
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
  FILE* const file = std::tmpfile();
  ASSERT_NE(file, nullptr);
  for (const int descriptor : {ends[1], fileno(file)}) {
    QVSystemLog log(std::make_unique<QVStandardErrorLogSink>(descriptor));
    log.info(nullptr, "f", "text");
    log.flush();
  }
  std::array<char, 256> bytes;
  const ssize_t fromSocket = read(ends[0], bytes.data(), bytes.size());
  ASSERT_GT(fromSocket, 0);
  EXPECT_THAT(std::string(bytes.data(), static_cast<std::size_t>(fromSocket)),
              EndsWith(":f: text\n"));
  const ssize_t fromFile = pread(fileno(file), bytes.data(), bytes.size(), 0);
  ASSERT_GT(fromFile, 0);
  EXPECT_THAT(std::string(bytes.data(), static_cast<std::size_t>(fromFile)),
              EndsWith(":f: text\n"));
  for (const int descriptor : ends) close(descriptor);
  EXPECT_EQ(std::fclose(file), 0);
}

}  // namespace
