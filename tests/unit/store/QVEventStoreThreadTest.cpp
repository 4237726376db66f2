#include "platform/linux/store/QVEventStoreError.h"
#include "tests/unit/store/QVStoreFixture.h"

#include <atomic>
#include <filesystem>
#include <system_error>
#include <thread>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

// A store whose thread cannot be had, until allowThread().
class QVEventStoreThreadTest : public QVStoreFixture {
 protected:
  QVEventStoreThreadTest() {
    options_.makeThread = [this](std::function<void()> body) {
      if (refusals_.fetch_sub(1) > 0) {
        throw std::system_error(EAGAIN, std::generic_category());
      }
      return std::thread(std::move(body));
    };
  }
  ~QVEventStoreThreadTest() override { restart(); }

  void allowThread() { refusals_ = 0; }
  void refuseThread(int times) { refusals_ = times; }

  std::string refusal() const {
    return "the event store " + path() +
           " cannot be written: no thread for its writer: Resource temporarily unavailable";
  }
  std::string recovery(int64_t lost) const {
    return QVText("the event store ", path(),
                  " can be written again; events lost meanwhile: ", lost);
  }

 private:
  std::atomic<int> refusals_{1'000'000};
};

TEST_F(QVEventStoreThreadTest, KeepsRowsUntilThereIsAThread) {
  EXPECT_EQ(findBackends(), std::nullopt);
  const auto session = openSession({.sessionID = 7});
  send(*session, {{"n", 1}});
  sendCountwise("event", {{"n", 2}});
  logJoulewell({{"n", 3}});
  EXPECT_FALSE(std::filesystem::exists(path()));
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(refusal())) << "one line for an outage";

  allowThread();
  sendSingle({{"n", 4}});
  flushAll();
  EXPECT_THAT(rows("SELECT s.session_id, m.payload FROM beacon_message m"
                   " LEFT JOIN beacon_session s ON s.id = m.session ORDER BY m.id"),
              ElementsAre(R"(7|{"n":1})", R"(NULL|{"n":4})"));
  EXPECT_THAT(rows("SELECT payload FROM countwise_event"), ElementsAre(R"({"n":2})"));
  EXPECT_THAT(rows("SELECT payload FROM joulewell_event"), ElementsAre(R"({"n":3})"));
  EXPECT_THAT(losses(), IsEmpty());
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(refusal()));
  EXPECT_THAT(lines(QVLogLevel::standard), ElementsAre(recovery(0)));
}

TEST_F(QVEventStoreThreadTest, FindsItsBackendOnceThereIsAThread) {
  EXPECT_EQ(findBackends(), std::nullopt);
  allowThread();
  EXPECT_EQ(findBackends(), QVArray{"store"});
}

TEST_F(QVEventStoreThreadTest, AnswersAFlushThatStoresNothing) {
  const auto session = openSession({.sessionID = 7});
  send(*session, {{"n", 1}});
  const std::optional<QVError> error = flush(*session);
  ASSERT_NE(error, std::nullopt);
  EXPECT_EQ(error->code, static_cast<int64_t>(QVEventStoreErrorCode::outOfOrder));
  allowThread();
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(rows("SELECT s.flushed_at IS NULL, m.payload FROM beacon_message m"
                   " JOIN beacon_session s ON s.id = m.session"),
              ElementsAre(R"(0|{"n":1})"));
}

TEST_F(QVEventStoreThreadTest, GivesUpTheOldestAndCountsThem) {
  options_.heldBytes = 100'000;
  constexpr int64_t kEvents = 500;
  for (int64_t i = 0; i < kEvents; ++i) {
    clock_.advance(std::chrono::microseconds(1));
    sendSingle({{"n", i}, {"text", std::string(200, 'm')}});
    clock_.advance(std::chrono::microseconds(1));
    sendCountwise("event", {{"n", i}, {"text", std::string(200, 'c')}});
  }
  allowThread();
  flushAll();
  const int64_t lost = expectNewest(kEvents);
  // Behind the end of the outage.
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_THAT(losses(), ElementsAre(QVText("store_error|", lost)));
  EXPECT_THAT(lines(QVLogLevel::standard), ElementsAre(recovery(lost)));
}

TEST_F(QVEventStoreThreadTest, CountsWhatItGivesUpWhereItsFileCannotBeOpenedEither) {
  sendSingle({{"n", 1}});
  std::filesystem::remove_all(root_.state());
  allowThread();
  const auto session = openSession();
  send(*session, {{"n", 2}});
  ASSERT_NE(flush(*session), std::nullopt);
  std::filesystem::create_directory(root_.state());
  sendSingle({{"n", 3}});
  close();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":3})"));
  EXPECT_THAT(losses(), ElementsAre("store_unavailable|2"));
  EXPECT_EQ(lines(QVLogLevel::standard).back(), recovery(2));
}

TEST_F(QVEventStoreThreadTest, AsksForNoPayloadThatIsUnwanted) {
  preferences_.setValue("net.quillon.countwise", "unwanted", QVArray{"noise"});
  QVStoreCountwise countwise(shared());
  countwise.sendEventLazily("noise", []() -> QVDictionary {
    ADD_FAILURE() << "asked";
    return {};
  });
  sendCountwise("signal", {});
  close();
  EXPECT_THAT(rows("SELECT name FROM countwise_event"), ElementsAre("signal"));
}

TEST_F(QVEventStoreThreadTest, StoresAtItsEndWhatNoThreadCouldStore) {
  const auto session = openSession({.sessionID = 7});
  send(*session, {{"n", 1}});
  sendCountwise("event", {});
  close();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":1})"));
  EXPECT_EQ(count("countwise_event"), 1);
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(refusal()));
}

TEST_F(QVEventStoreThreadTest, MakesNoFileAtItsEndWhereNothingWasHandedOver) {
  store().close();
  EXPECT_FALSE(std::filesystem::exists(path()));
  EXPECT_EQ(findBackends(), std::nullopt);
  EXPECT_THAT(lines(QVLogLevel::error), IsEmpty());
}

TEST_F(QVEventStoreThreadTest, LetsCallbacksHandOverMore) {
  QVStoreCountwise countwise(shared());
  countwise.sendEventLazily("event", [this] {
    sendSingle({{"n", 1}});
    return QVDictionary{{"n", 2}};
  });
  store().flush(std::make_shared<QVEventSession>(), [this](const std::optional<QVError>& error) {
    EXPECT_NE(error, std::nullopt);
    sendSingle({{"n", 3}});
  });
  allowThread();
  flushAll();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"),
              UnorderedElementsAre(R"({"n":1})", R"({"n":3})"));
  EXPECT_THAT(rows("SELECT payload FROM countwise_event"), ElementsAre(R"({"n":2})"));
}

TEST_F(QVEventStoreThreadTest, LosesNothingThatManyThreadsHandOver) {
  constexpr int kThreads = 4;
  constexpr int kEach = 250;
  refuseThread(kThreads * kEach / 2);
  store();
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([this, thread] {
      for (int i = 0; i < kEach; ++i) sendSingle({{"n", thread * kEach + i}});
    });
  }
  for (std::thread& thread : threads) thread.join();
  allowThread();
  flushAll();
  EXPECT_EQ(number("SELECT count(DISTINCT json_extract(payload, '$.n')) FROM beacon_message"),
            kThreads * kEach);
  EXPECT_EQ(count("beacon_message"), kThreads * kEach);
}

}  // namespace
