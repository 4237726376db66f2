#include "QVServices/Statistics/Service/QVReportingPayloadArray.h"
#include "QVServices/Statistics/Service/QVReportingSession.h"
#include "platform/fake/QVFakePlatform.h"
#include "tests/unit/core/QVPayloadReading.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;

using Payload = QVReportingPayloadArray::Payload;

int64_t integerOf(const Payload& payload, std::string_view key) {
  return dictionaryOf(payload).find(key)->integer();
}

class QVReportingPayloadArrayTest : public testing::Test {
 protected:
  std::shared_ptr<QVReportingPayloadStore> store_ = std::make_shared<QVReportingPayloadStore>();
  QVReportingPayloadArray aggregated_{store_};
  QVReportingPayloadArray nested_{store_};
};

TEST_F(QVReportingPayloadArrayTest, IteratesInTheOrderOfTheAppends) {
  EXPECT_TRUE(aggregated_.empty());
  for (int i = 0; i < 100; ++i) aggregated_.append({{"n", i}});
  EXPECT_EQ(aggregated_.size(), 100u);
  int next = 0;
  for (const auto& [identifier, payload] : entriesOf(aggregated_)) {
    EXPECT_EQ(identifier, "");
    EXPECT_EQ(payload, (QVDictionary{{"n", next++}}));
  }
  EXPECT_EQ(next, 100);
}

TEST_F(QVReportingPayloadArrayTest, NamesEntriesThatShareAPayload) {
  const auto first = aggregated_.append({{"n", 1}}).value();
  const auto second = aggregated_.append({{"n", 2}}).value();
  nested_.append("Playback_Start", 1, first);
  nested_.append("Playback_Start", 4294967295u, second);
  nested_.append("Record_Stop", 1, second);
  EXPECT_THAT(entriesOf(nested_),
              ElementsAre(std::pair("Playback_Start_1", QVDictionary{{"n", 1}}),
                          std::pair("Playback_Start_4294967295", QVDictionary{{"n", 2}}),
                          std::pair("Record_Stop_1", QVDictionary{{"n", 2}})));
  EXPECT_EQ(aggregated_.size(), 2u);
}

TEST_F(QVReportingPayloadArrayTest, TakesAPayloadWithoutANameAtItsFront) {
  nested_.append("Playback_Start", 1, aggregated_.append({{"n", 1}}).value());
  nested_.insertAtFront({{"HostApplicationDisplayID", "net.quillon.player"}});
  EXPECT_THAT(
      entriesOf(nested_),
      ElementsAre(std::pair("", QVDictionary{{"HostApplicationDisplayID", "net.quillon.player"}}),
                  std::pair("Playback_Start_1", QVDictionary{{"n", 1}})));
  EXPECT_EQ(aggregated_.size(), 1u);
}

TEST_F(QVReportingPayloadArrayTest, TakesAPayloadAtItsFrontWhereItIsEmpty) {
  nested_.insertAtFront({});
  EXPECT_THAT(entriesOf(nested_), ElementsAre(std::pair("", QVDictionary())));
}

TEST_F(QVReportingPayloadArrayTest, AppendsNothingWhereTheStoreIsFull) {
  const auto full = std::make_shared<QVReportingPayloadStore>(0);
  QVReportingPayloadArray array(full);
  EXPECT_EQ(array.append({{"n", 1}}), std::nullopt);
  EXPECT_TRUE(array.empty());
  array.insertAtFront({{"HostApplicationDisplayID", "net.quillon.player"}});
  EXPECT_EQ(array.size(), 1u) << "a file has its session's configuration all the same";
}

TEST_F(QVReportingPayloadArrayTest, KeepsTheStoreThatItsEntriesLieIn) {
  aggregated_.append({{"n", 1}});
  store_.reset();
  EXPECT_THAT(entriesOf(aggregated_), ElementsAre(std::pair("", QVDictionary{{"n", 1}})));
}

TEST_F(QVReportingPayloadArrayTest, IsItsOwnRecursiveLock) {
  const std::lock_guard outer(aggregated_);
  const std::lock_guard inner(aggregated_);
  aggregated_.append({{"n", 1}});
  EXPECT_EQ(aggregated_.size(), 1u);
}

TEST_F(QVReportingPayloadArrayTest, MayBeAppendedToWhileItIsVisited) {
  // Enough for the container to keep its records in several places, and to move them about.
  constexpr int kEntries = 100;
  for (int i = 0; i < kEntries; ++i) aggregated_.append({{"n", i}});
  int64_t visited = 0;
  aggregated_.forEach([&](std::string_view, const Payload& payload) {
    ASSERT_EQ(integerOf(payload, "n"), visited++);
    for (int i = 0; i < kEntries; ++i) aggregated_.append({{"n", -1}});
  });
  EXPECT_EQ(visited, kEntries) << "what is there when the visit begins";
  EXPECT_EQ(aggregated_.size(), std::size_t{kEntries + kEntries * kEntries});
}

TEST_F(QVReportingPayloadArrayTest, HoldsAppendsBackWhileItIsLocked) {
  std::atomic<bool> appended{false};
  std::jthread other;
  {
    const std::lock_guard lock(aggregated_);
    other = std::jthread([&] {
      aggregated_.append({{"n", 1}});
      appended = true;
    });
    // However often one looks: the other cannot get in between.
    for (int i = 0; i < 1000; ++i) {
      EXPECT_EQ(aggregated_.size(), 0u);
      std::this_thread::yield();
    }
    EXPECT_FALSE(appended);
  }
  other.join();
  EXPECT_EQ(aggregated_.size(), 1u);
}

TEST_F(QVReportingPayloadArrayTest, TakesAppendsOfSeveralThreadsWhileItIsIterated) {
  constexpr int kThreads = 4;
  constexpr int kAppends = 1000;
  std::atomic<int> running{kThreads};
  std::vector<std::jthread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      for (int i = 0; i < kAppends; ++i) {
        const auto position = aggregated_.append({{"thread", thread}, {"n", i}}).value();
        nested_.append("of thread", static_cast<uint32_t>(i + 1), position);
      }
      --running;
    });
  }
  // Whenever it is visited, each thread's payloads are whole and in their order.
  do {
    std::vector<int64_t> next(kThreads, 0);
    aggregated_.forEach([&next](std::string_view, const Payload& payload) {
      const auto thread = static_cast<std::size_t>(integerOf(payload, "thread"));
      ASSERT_EQ(integerOf(payload, "n"), next[thread]++);
    });
    nested_.forEach([](std::string_view identifier, const Payload& payload) {
      ASSERT_EQ(identifier, QVText("of thread_", integerOf(payload, "n") + 1));
    });
  } while (running > 0);
  threads.clear();
  EXPECT_EQ(aggregated_.size(), std::size_t{kThreads * kAppends});
  EXPECT_EQ(nested_.size(), std::size_t{kThreads * kAppends});
}

TEST(QVReportingSessionPayloadArrays, MayBeReadByOthersWhileTheSessionLives) {
  QVFakePlatform platform;
  const auto session = QVReportingSession::initWithID(7, {42});
  std::atomic<bool> done{false};
  std::jthread reader([&] {
    while (!done) {
      if (const auto array = session->aggregatedPayloadData()) {
        array->forEach([](std::string_view, const Payload& payload) {
          const QVDictionary entries = dictionaryOf(payload);
          ASSERT_TRUE(entries.contains("n") || entries.contains("QV_Session_Summary_Event"));
        });
        // As a callback of another service appends.
        const std::lock_guard lock(*array);
        array->append({{"n", "from another thread"}});
      }
      ASSERT_NE(session->serviceType(), 1);
      static_cast<void>(session->started());
      static_cast<void>(session->userInfo());
    }
  });
  for (int round = 0; round < 100; ++round) {
    session->start();
    session->setConfiguration({{"round", round}});
    for (int i = 0; i < 10; ++i) session->sendMessage({{"n", i}}, 3, 1, {});
    session->stop();
    platform.queues().runUntilIdle();
  }
  done = true;
  reader.join();
  EXPECT_EQ(session->messageTypeCounts().at("Playback_Start"), 1000u);
}

}  // namespace
