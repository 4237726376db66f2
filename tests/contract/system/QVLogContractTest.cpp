#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakePreferences.h"
#include "platform/linux/log/QVSystemLog.h"

#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

constexpr const char* kDomain = "net.quillon.quietvox";
constexpr const char* kVerboseKey = "reporting_server_verbose";

// Lines in the form of the fake log's, whichever log they went through.
class FakeLogHarness {
 public:
  QVLog& log() { return log_; }
  void setVerbose(bool verbose) { log_.setVerbose(kVerboseKey, verbose); }
  std::vector<QVFakeLog::Line> lines() { return log_.lines(); }

 private:
  QVFakeLog log_;
};

class CollectingSink final : public QVLogSink {
 public:
  void write(std::span<const QVLogLine> lines, const std::atomic<bool>&) override {
    const std::lock_guard lock(mutex_);
    for (const QVLogLine& line : lines) {
      lines_.push_back({line.level, std::string(line.scopeName()), line.function, line.text,
                        line.file, line.line});
    }
  }
  std::vector<QVFakeLog::Line> lines() {
    const std::lock_guard lock(mutex_);
    return lines_;
  }

 private:
  std::mutex mutex_;
  std::vector<QVFakeLog::Line> lines_;
};

class SystemLogHarness {
 public:
  SystemLogHarness() {
    auto sink = std::make_unique<CollectingSink>();
    sink_ = sink.get();
    log_ = std::make_unique<QVSystemLog>(std::move(sink));
    log_->readSwitchesFrom(&preferences_);
  }
  QVLog& log() { return *log_; }
  void setVerbose(bool verbose) { preferences_.setValue(kDomain, kVerboseKey, verbose); }
  // Flushed lines have arrived: no waiting.
  std::vector<QVFakeLog::Line> lines() {
    log_->flush();
    return sink_->lines();
  }

 private:
  QVFakePreferences preferences_;
  CollectingSink* sink_;
  std::unique_ptr<QVSystemLog> log_;
};

template <class Harness>
class QVLogContract : public testing::Test {
 protected:
  QVLogScope* registerScope() {
    return harness_.log().registerScope(true, 0x71767273, "qvrs", kDomain, kVerboseKey, 31);
  }
  std::vector<std::string> renderings() {
    std::vector<std::string> texts;
    for (const auto& line : harness_.lines()) texts.push_back(line.rendering());
    return texts;
  }

  Harness harness_;
};

using Harnesses = testing::Types<FakeLogHarness, SystemLogHarness>;
TYPED_TEST_SUITE(QVLogContract, Harnesses);

TYPED_TEST(QVLogContract, WritesLinesOfEveryLevelInOrder) {
  QVLogScope* const scope = this->registerScope();
  QVLog& log = this->harness_.log();
  log.error(scope, "-[A b]", "one");
  log.standard(nullptr, "f", "two");
  log.info(scope, "+[A c]", "three ", 3);
  EXPECT_THAT(this->renderings(),
              ElementsAre("3[qvrs] -[A b]: one", "5[default] f: two", "6[qvrs] +[A c]: three 3"));
}

TYPED_TEST(QVLogContract, NamesTheFileWithoutDirectoriesAndTheLine) {
  this->harness_.log().error(nullptr, "f", "here");
  const uint32_t line = __LINE__ - 1;
  const auto lines = this->harness_.lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].file, "QVLogContractTest.cpp");
  EXPECT_EQ(lines[0].line, line);
}

TYPED_TEST(QVLogContract, WritesVerboseLinesOnlyWhereTheSwitchWasOnAtRegistration) {
  QVLogScope* const scope = this->registerScope();
  QVLog& log = this->harness_.log();
  log.verbose(scope, "f", "off");
  this->harness_.setVerbose(true);
  log.verbose(scope, "f", "still off");
  EXPECT_EQ(this->registerScope(), scope);
  log.verbose(scope, "f", "on");
  log.verbose(nullptr, "f", "the default log is never verbose");
  this->harness_.setVerbose(false);
  this->registerScope();
  log.verbose(scope, "f", "off again");
  EXPECT_THAT(this->renderings(), ElementsAre("7[qvrs] f: on"));
}

TYPED_TEST(QVLogContract, DescribesAScope) {
  const QVLogScope* const scope = this->registerScope();
  EXPECT_EQ(scope->name, "qvrs");
  EXPECT_EQ(scope->code, 0x71767273U);
  EXPECT_EQ(scope->subsystem, kDomain);
}

TYPED_TEST(QVLogContract, KeepsEachThreadsLinesInOrder) {
  constexpr int kThreads = 4;
  constexpr int kLines = 200;
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([this, i] {
      for (int j = 0; j < kLines; ++j) this->harness_.log().info(nullptr, "f", i, ' ', j);
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::vector<int> next(kThreads, 0);
  const auto lines = this->harness_.lines();
  ASSERT_EQ(lines.size(), std::size_t{kThreads * kLines});
  for (const auto& line : lines) {
    const auto thread = static_cast<std::size_t>(line.text.front() - '0');
    EXPECT_EQ(line.text, QVText(thread, ' ', next[thread]++));
  }
}

}  // namespace
