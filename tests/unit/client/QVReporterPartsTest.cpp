// The parts of a reporter by themselves: pauses, queue, ledger, configuration.

#include "client/QVClientPayload.h"
#include "client/QVReconnectDelay.h"
#include "client/QVReporterConfiguration.h"
#include "client/QVReporterLedger.h"
#include "client/QVReporterQueue.h"

#include <vector>

#include <gtest/gtest.h>

namespace {

using Code = QVClientError::Code;
using std::chrono::milliseconds;
using std::chrono::seconds;

class QVReconnectDelayTest : public testing::Test {
 protected:
  // The pause behind a failure at the present time, which then passes.
  milliseconds failAndWait() {
    delay_.failed(now_);
    const auto pause = std::chrono::duration_cast<milliseconds>(delay_.nextAttempt() - now_);
    now_ = delay_.nextAttempt();
    return pause;
  }

  QVReconnectDelay::TimePoint now_{seconds(1'000)};
  QVReconnectDelay delay_{milliseconds(100), milliseconds(1'000), 1};
};

TEST_F(QVReconnectDelayTest, TriesAtOnceAtFirst) {
  EXPECT_LT(delay_.nextAttempt(), now_);
}

TEST_F(QVReconnectDelayTest, DoublesItsPausesUpToTheLongest) {
  for (const int pause : {100, 200, 400, 800, 1'000, 1'000, 1'000}) {
    const milliseconds waited = failAndWait();
    EXPECT_GE(waited, milliseconds(pause));
    EXPECT_LE(waited, milliseconds(pause + pause / 4));
  }
}

TEST_F(QVReconnectDelayTest, DiffersByChance) {
  QVReconnectDelay other(milliseconds(100), milliseconds(1'000), 2);
  bool differs = false;
  for (int i = 0; i < 10; ++i) {
    delay_.failed(now_);
    other.failed(now_);
    differs = differs || delay_.nextAttempt() != other.nextAttempt();
  }
  EXPECT_TRUE(differs);
}

TEST_F(QVReconnectDelayTest, AConnectionThatLastedBeginsAnew) {
  for (int i = 0; i < 5; ++i) failAndWait();
  delay_.connected(now_);
  now_ += milliseconds(999);
  EXPECT_GE(failAndWait(), milliseconds(1'000));
  delay_.connected(now_);
  now_ += milliseconds(1'000);
  EXPECT_LE(failAndWait(), milliseconds(125));
}

class QVReporterQueueTest : public testing::Test {
 protected:
  static constexpr std::size_t kOverhead = 24;

  Code push(std::string_view payload,
            QVReporterRecord::Kind kind = QVReporterRecord::Kind::message) {
    return queue_.push({.kind = kind, .type = 3, .category = 4, .payload = payload}, mustWake_);
  }
  std::string take() {
    QVReporterRecord record;
    if (!queue_.front(record)) return "nothing";
    EXPECT_EQ(record.type, 3U);
    EXPECT_EQ(record.category, 4U);
    const std::span<char> payload = queue_.frontPayload();
    EXPECT_EQ(std::string_view(payload.data(), payload.size()), record.payload);
    std::string text(record.payload);
    queue_.pop();
    return text;
  }

  QVReporterQueue queue_{1'000, 10};
  bool mustWake_ = false;
};

TEST_F(QVReporterQueueTest, HandsOutRecordsInTheirOrder) {
  EXPECT_EQ(take(), "nothing");
  EXPECT_EQ(push("one"), Code::none);
  EXPECT_EQ(push(""), Code::none);
  EXPECT_EQ(take(), "one");
  EXPECT_EQ(push("three"), Code::none);
  EXPECT_EQ(take(), "");
  EXPECT_EQ(take(), "three");
  EXPECT_EQ(take(), "nothing");
  EXPECT_EQ(queue_.accepted(), 3U);
  EXPECT_EQ(queue_.consumed(), 3U);
  EXPECT_EQ(queue_.queuedBytes(), 0U);
}

TEST_F(QVReporterQueueTest, BoundsBytesWhereverTheyLie) {
  const std::string payload(500 - kOverhead, 'x');
  EXPECT_EQ(push(payload), Code::none);
  EXPECT_EQ(push(payload), Code::none);
  EXPECT_EQ(push(""), Code::queueFull);
  QVReporterRecord record;
  ASSERT_TRUE(queue_.front(record));
  EXPECT_EQ(push(""), Code::queueFull);
  queue_.pop();
  EXPECT_EQ(push(payload), Code::none);
  EXPECT_EQ(push(""), Code::queueFull);
  EXPECT_EQ(push(std::string(1'001 - kOverhead, 'x')), Code::messageTooLarge);
}

TEST_F(QVReporterQueueTest, BoundsRecords) {
  for (int i = 0; i < 10; ++i) EXPECT_EQ(push(""), Code::none);
  EXPECT_EQ(push(""), Code::queueFull);
  EXPECT_EQ(take(), "");
  EXPECT_EQ(push(""), Code::none);
}

TEST_F(QVReporterQueueTest, KeepsRoomForStepsOfSessions) {
  using Kind = QVReporterRecord::Kind;
  while (push("") == Code::none) {
  }
  for (int i = 0; i < 1'024; ++i) EXPECT_EQ(push("", Kind::stop), Code::none);
  EXPECT_EQ(push("", Kind::stop), Code::queueFull);
  EXPECT_EQ(push("", Kind::destroy), Code::none);
}

TEST_F(QVReporterQueueTest, WakesOnceWhereItIsWaitedFor) {
  EXPECT_EQ(push(""), Code::none);
  EXPECT_FALSE(mustWake_);
  EXPECT_FALSE(queue_.armWakeUp());
  EXPECT_EQ(take(), "");
  EXPECT_TRUE(queue_.armWakeUp());
  EXPECT_EQ(push(""), Code::none);
  EXPECT_TRUE(mustWake_);
  EXPECT_EQ(push(""), Code::none);
  EXPECT_FALSE(mustWake_);
}

TEST_F(QVReporterQueueTest, TakesNothingOnceItIsClosed) {
  EXPECT_EQ(push("one"), Code::none);
  queue_.close();
  EXPECT_EQ(push("two"), Code::closed);
  EXPECT_EQ(take(), "one");
  EXPECT_EQ(take(), "nothing");
}

class QVReporterLedgerTest : public testing::Test {
 protected:
  const QVReporterLedger::TimePoint start_{seconds(1'000)};
  std::vector<QVDropCounts> reports_;
  QVReporterLedger ledger_{[this](const QVDropCounts& drops) { reports_.push_back(drops); },
                           seconds(1)};
};

TEST_F(QVReporterLedgerTest, FoldsReportsInAnInterval) {
  EXPECT_FALSE(ledger_.nextReport());
  EXPECT_TRUE(ledger_.countDrop(QVDropReason::queueFull));
  EXPECT_FALSE(ledger_.countDrop(QVDropReason::queueFull));
  ledger_.report(start_);
  ASSERT_EQ(reports_.size(), 1U);
  EXPECT_EQ(reports_[0].of(QVDropReason::queueFull), 2U);
  EXPECT_FALSE(ledger_.nextReport());

  EXPECT_TRUE(ledger_.countDrop(QVDropReason::refused, 3));
  EXPECT_EQ(ledger_.nextReport(), start_ + seconds(1));
  ledger_.report(start_ + milliseconds(999));
  EXPECT_EQ(reports_.size(), 1U);
  ledger_.report(start_ + seconds(1));
  ASSERT_EQ(reports_.size(), 2U);
  EXPECT_EQ(reports_[1].of(QVDropReason::refused), 3U);
  EXPECT_EQ(reports_[1].inAll(), 3U);
}

TEST_F(QVReporterLedgerTest, TheSwitchMakesNoReportDue) {
  EXPECT_FALSE(ledger_.countDrop(QVDropReason::disabled));
  EXPECT_FALSE(ledger_.nextReport());
  ledger_.report(start_);
  EXPECT_TRUE(reports_.empty());
  ledger_.reportAll(start_);
  ASSERT_EQ(reports_.size(), 1U);
  EXPECT_EQ(reports_[0].of(QVDropReason::disabled), 1U);
  ledger_.reportAll(start_);
  EXPECT_EQ(reports_.size(), 1U);
}

TEST_F(QVReporterLedgerTest, TellsOfWhatWasCountedSilently) {
  ledger_.countDropSilently(QVDropReason::disabled);
  EXPECT_FALSE(ledger_.nextReport());
  ledger_.countDropSilently(QVDropReason::queueFull);
  EXPECT_TRUE(ledger_.nextReport());
  ledger_.report(start_);
  ASSERT_EQ(reports_.size(), 1U);
  EXPECT_EQ(reports_[0].of(QVDropReason::queueFull), 1U);
  EXPECT_EQ(reports_[0].of(QVDropReason::disabled), 1U);
  EXPECT_FALSE(ledger_.nextReport());
}

TEST_F(QVReporterLedgerTest, CountsWithNobodyToTell) {
  QVReporterLedger ledger(nullptr, seconds(1));
  EXPECT_FALSE(ledger.countDrop(QVDropReason::invalid));
  EXPECT_FALSE(ledger.countDrop(QVDropReason::invalid, 0));
  ledger.countSent();
  ledger.countConnection();
  ledger.reportAll(start_);
  EXPECT_EQ(ledger.counters().dropped.of(QVDropReason::invalid), 1U);
  EXPECT_EQ(ledger.counters().sent, 1U);
  EXPECT_EQ(ledger.counters().connections, 1U);
}

TEST(QVReporterConfiguration, KeepsOfEqualKeysTheLater) {
  const auto entries = [](std::initializer_list<std::pair<const char*, int>> pairs) {
    QVClientPayload payload;
    for (const auto& [key, value] : pairs) payload.set(key, value);
    return std::string(payload.entries());
  };
  const std::string merged = QVReporterMergedConfiguration(
      entries({{"a", 1}, {"longer", 2}, {"c", 3}}), entries({{"longer", 4}, {"d", 5}, {"d", 6}}));
  EXPECT_EQ(merged, entries({{"a", 1}, {"c", 3}, {"longer", 4}, {"d", 6}}));
  EXPECT_EQ(QVReporterMergedConfiguration("", merged), merged);
  EXPECT_EQ(QVReporterMergedConfiguration(merged, ""), merged);
}

TEST(QVReporterConfiguration, KeepsValuesOfEveryKind) {
  QVClientPayload earlier;
  earlier.set("t", "text").beginDictionary("d").set("x", 1.5).endDictionary();
  earlier.beginArray("l").add(true).endArray();
  QVClientPayload later;
  later.set("y", 1);
  QVClientPayload both;
  both.set("t", "text").beginDictionary("d").set("x", 1.5).endDictionary();
  both.beginArray("l").add(true).endArray().set("y", 1);
  EXPECT_EQ(QVReporterMergedConfiguration(earlier.entries(), later.entries()), both.entries());
}

}  // namespace
