#include "platform/fake/QVFakeMemoryCharge.h"
#include "platform/linux/store/QVEventStoreError.h"
#include "tests/unit/store/QVStoreFixture.h"

#include <atomic>
#include <filesystem>
#include <future>
#include <limits>
#include <thread>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

using QVSQLiteEventStoreTest = QVStoreFixture;

TEST_F(QVSQLiteEventStoreTest, WorksWithTheServicesIntervalsUnlessToldOtherwise) {
  const QVEventStoreOptions usual{.path = path()};
  EXPECT_EQ(usual.commitInterval, std::chrono::milliseconds(250));
  EXPECT_EQ(usual.retryInterval, std::chrono::seconds(1));
  EXPECT_EQ(usual.fileBytes, int64_t{256} * 1024 * 1024);
  EXPECT_LT(usual.heldBytes, std::size_t{64} * 1024 * 1024);
  EXPECT_EQ(QVEventStoreQueue::kCommitRows, 500U);
}

TEST_F(QVSQLiteEventStoreTest, MakesNoFileBeforeTheFirstEvent) {
  store();
  close();
  EXPECT_FALSE(std::filesystem::exists(path()));
}

TEST_F(QVSQLiteEventStoreTest, WritesASessionWithItsInformation) {
  openSession({.sessionID = 4711,
               .realtime = false,
               .userInfo = {{kBeaconUserInfoClientName, "net.quillon.quietvox"},
                            {kBeaconUserInfoServiceName, "media_session"},
                            {"HostApplicationDisplayID", "net.quillon.player"}}});
  openSession({.sessionID = -5, .realtime = true});
  flushAll();
  EXPECT_THAT(
      rows("SELECT id, opened_at, session_id, token, client_type, client_version, batch_event,"
           " contains_realtime_events, user_info, flushed_at FROM beacon_session ORDER BY id"),
      ElementsAre("1|1704164645000000|4711|token of 4711|19|2.0|1|0|"
                  R"({"HostApplicationDisplayID":"net.quillon.player",)"
                  R"("kBeaconUserInfoClientName":"net.quillon.quietvox",)"
                  R"("kBeaconUserInfoServiceName":"media_session"}|NULL)",
                  "2|1704164645000000|-5|token of -5|19|2.0|0|1|"
                  R"({"kBeaconUserInfoClientName":"net.quillon.quietvox",)"
                  R"("kBeaconUserInfoServiceName":"media_session"}|NULL)"));
}

TEST_F(QVSQLiteEventStoreTest, WritesMessagesWithTheirSession) {
  const auto session = openSession();
  send(*session, {{"volume", 0.5}, {"channels", 2}}, 65535, 65534);
  clock_.advance(std::chrono::milliseconds(3));
  send(*session, {});
  flushAll();
  EXPECT_THAT(
      rows("SELECT * FROM beacon_message ORDER BY id"),
      ElementsAre("1|1704164645000000|1|4711|net.quillon.quietvox|media_session|65535|65534|"
                  R"({"channels":2,"volume":0.5})",
                  "2|1704164645003000|1|4711|net.quillon.quietvox|media_session|3|1|{}"));
}

TEST_F(QVSQLiteEventStoreTest, WritesASingleMessageWithoutASession) {
  sendSingle({{"count", 1}});
  flushAll();
  EXPECT_THAT(rows("SELECT * FROM beacon_message"),
              ElementsAre("1|1704164645000000|NULL|-1|net.quillon.quietvox|standalone|5|2|"
                          R"({"count":1})"));
  EXPECT_EQ(count("beacon_session"), 0);
}

TEST_F(QVSQLiteEventStoreTest, WritesCountwiseAndJoulewellEvents) {
  sendCountwise("net.quillon.quietvox.Session_Generic.Start", {{"rate", 44100.0}});
  logJoulewell({{"EngineOnDuration", 12.5}});
  flushAll();
  EXPECT_THAT(rows("SELECT * FROM countwise_event"),
              ElementsAre("1|1704164645000000|net.quillon.quietvox.Session_Generic.Start|"
                          R"({"rate":44100.0})"));
  EXPECT_THAT(rows("SELECT * FROM joulewell_event"),
              ElementsAre(R"(1|1704164645000000|28|Vidra_Haptics|{"EngineOnDuration":12.5})"));
}

TEST_F(QVSQLiteEventStoreTest, KeepsNumbersThatJSONHasNoWordFor) {
  sendSingle({{"a", std::numeric_limits<double>::quiet_NaN()},
              {"b", -std::numeric_limits<double>::infinity()}});
  flushAll();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"a":"nan","b":"-inf"})"));
}

TEST_F(QVSQLiteEventStoreTest, KeepsTheOrderOfEachTable) {
  const auto session = openSession();
  for (int i = 0; i < 2000; ++i) {
    send(*session, {{"n", i}});
    sendCountwise("event", {{"n", i}});
  }
  flushAll();
  for (const std::string table : {"beacon_message", "countwise_event"}) {
    EXPECT_EQ(count(table), 2000);
    EXPECT_EQ(
        number("SELECT count(*) FROM " + table + " WHERE payload = '{\"n\":' || (id - 1) || '}'"),
        2000)
        << table;
  }
}

TEST_F(QVSQLiteEventStoreTest, TakesEventsFromManyThreads) {
  constexpr int kThreads = 4;
  constexpr int kEvents = 3000;
  store();
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([this, thread] {
      for (int i = 0; i < kEvents; ++i) {
        sendCountwise(QVText("thread ", thread), {{"n", i}});
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  flushAll();
  EXPECT_EQ(count("countwise_event"), kThreads * kEvents);
  EXPECT_THAT(rows("SELECT name FROM (SELECT name, id,"
                   " CAST(json_extract(payload, '$.n') AS INTEGER) n,"
                   " lag(json_extract(payload, '$.n')) OVER (PARTITION BY name ORDER BY id) before"
                   " FROM countwise_event) WHERE before >= n"),
              IsEmpty())
      << "events of one thread out of order";
}

TEST_F(QVSQLiteEventStoreTest, HoldsRowsBackUntilTheyAreFiveHundred) {
  const auto session = openSession();  // the first row
  for (int i = 2; i < 500; ++i) send(*session, {{"n", i}});
  awaitWriter();
  EXPECT_EQ(count("beacon_session") + count("beacon_message"), 0);
  send(*session, {{"n", 500}});
  awaitWriter();
  EXPECT_EQ(count("beacon_session") + count("beacon_message"), 500);
}

TEST_F(QVSQLiteEventStoreTest, CommitsFewRowsWhenTheirIntervalIsOver) {
  options_.commitInterval = std::chrono::milliseconds(1);
  std::promise<void> asked;
  QVStoreCountwise countwise(std::shared_ptr<QVSQLiteEventStore>(&store(), [](auto*) {}));
  countwise.sendEventLazily("event", [&asked] {
    asked.set_value();
    return QVDictionary{{"n", 1}};
  });
  asked.get_future().wait();  // nothing but its age makes the row due
  awaitWriter();
  EXPECT_EQ(count("countwise_event"), 1);
}

TEST_F(QVSQLiteEventStoreTest, CommitsMessagesOfARealtimeSessionAtOnce) {
  const auto session = openSession({.sessionID = 12, .realtime = true});
  awaitWriter();
  EXPECT_EQ(count("beacon_session"), 0);
  send(*session, {{"n", 1}});
  awaitWriter();
  EXPECT_EQ(count("beacon_session"), 1);
  EXPECT_EQ(count("beacon_message"), 1);
}

TEST_F(QVSQLiteEventStoreTest, AnswersAFlushWhenAllBeforeItIsCommitted) {
  const auto session = openSession();
  send(*session, {{"n", 1}});
  sendCountwise("event", {});
  clock_.advance(std::chrono::seconds(2));
  std::promise<std::vector<std::string>> seen;
  session->flushMessagesWithCompletion([this, &seen](std::optional<QVError> error) {
    EXPECT_EQ(error, std::nullopt);
    seen.set_value(
        rows("SELECT (SELECT count(*) FROM beacon_message),"
             " (SELECT count(*) FROM countwise_event),"
             " (SELECT flushed_at FROM beacon_session)"));
  });
  EXPECT_THAT(seen.get_future().get(), ElementsAre("1|1|1704164647000000"));
}

TEST_F(QVSQLiteEventStoreTest, StoresWhatIsLeftWhenItCloses) {
  const auto session = openSession();
  send(*session, {{"n", 1}});
  logJoulewell({{"n", 2}});
  close();
  EXPECT_FALSE(std::filesystem::exists(path() + "-wal")) << "the log was not copied into the file";
  EXPECT_EQ(count("beacon_session"), 1);
  EXPECT_EQ(count("beacon_message"), 1);
  EXPECT_EQ(count("joulewell_event"), 1);
}

TEST_F(QVSQLiteEventStoreTest, RefusesMessagesOnceClosed) {
  const auto session = openSession();
  close();
  std::optional<QVError> error;
  EXPECT_FALSE(session->sendMessageWithCategory(3, 1, {}, error));
  EXPECT_EQ(error, QVEventStoreClosedError());
  error.reset();
  EXPECT_FALSE(beacon().sendOneMessageWithSessionInfo({}, {}, 3, 1, {}, error));
  EXPECT_EQ(error, QVEventStoreClosedError());
  EXPECT_EQ(flush(*session), QVEventStoreClosedError());
  EXPECT_EQ(findBackends(), std::nullopt);
  close();
}

TEST_F(QVSQLiteEventStoreTest, RefusesMessagesOfASessionThatOutlivesAStoreNeverUsed) {
  store().close();
  std::optional<QVError> error;
  EXPECT_FALSE(beacon().sendOneMessageWithSessionInfo({}, {}, 3, 1, {}, error));
  EXPECT_FALSE(std::filesystem::exists(path()));
}

TEST_F(QVSQLiteEventStoreTest, ContinuesInTheFileOfAnEarlierRun) {
  send(*openSession({.sessionID = 1}), {{"n", 1}});
  restart();
  send(*openSession({.sessionID = 2}), {{"n", 2}});
  flushAll();
  EXPECT_THAT(rows("SELECT s.id, s.session_id, m.id, m.payload FROM beacon_session s"
                   " JOIN beacon_message m ON m.session = s.id ORDER BY m.id"),
              ElementsAre(R"(1|1|1|{"n":1})", R"(2|2|2|{"n":2})"));
}

TEST_F(QVSQLiteEventStoreTest, AsksForWantedPayloadsOnly) {
  preferences_.setValue("net.quillon.countwise", "unwanted", QVArray{"noise", 5});
  std::atomic<int> asked = 0;
  std::atomic<int> dropped = 0;
  QVStoreCountwise countwise(std::shared_ptr<QVSQLiteEventStore>(&store(), [](auto*) {}));
  for (const char* name : {"noise", "signal", "noise"}) {
    std::shared_ptr<int> captured(new int, [&dropped](int* number) {
      delete number;
      ++dropped;
    });
    countwise.sendEventLazily(name, [&asked, captured] {
      ++asked;
      return QVDictionary{};
    });
  }
  flushAll();
  EXPECT_EQ(asked, 1);
  EXPECT_EQ(dropped, 3);
  EXPECT_THAT(rows("SELECT name FROM countwise_event"), ElementsAre("signal"));
}

TEST_F(QVSQLiteEventStoreTest, ReadsWhatIsUnwantedWithEachSearchForBackends) {
  sendCountwise("noise", {});
  flushAll();
  preferences_.setValue("net.quillon.countwise", "unwanted", QVArray{"noise"});
  findBackends();
  sendCountwise("noise", {});
  flushAll();
  EXPECT_EQ(count("countwise_event"), 1);
  preferences_.setValues("net.quillon.countwise", {});
  findBackends();
  sendCountwise("noise", {});
  flushAll();
  EXPECT_EQ(count("countwise_event"), 2);
}

TEST_F(QVSQLiteEventStoreTest, OutlivesAPayloadCallbackThatThrows) {
  QVStoreCountwise countwise(std::shared_ptr<QVSQLiteEventStore>(&store(), [](auto*) {}));
  countwise.sendEventLazily("event",
                            []() -> QVDictionary { throw std::runtime_error("no payload"); });
  flushAll();
  EXPECT_THAT(rows("SELECT name, payload FROM countwise_event"), ElementsAre("event|{}"));
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre("exception in a callback: no payload"));
}

TEST_F(QVSQLiteEventStoreTest, LetsGoOfPayloadsOnceTheyAreCommitted) {
  QVFakeMemoryCharge charge;
  const auto session = openSession();
  for (int i = 0; i < 100; ++i) {
    std::vector<QVDictionaryEntry> entries{{"n", i}, {"text", "something"}};
    const QVDictionary payload = QVDictionary::assemble(entries, &charge);
    send(*session, payload);
    sendCountwise("event", payload.merging({{"HostApplicationDisplayID", "Unknown"}}));
    sendSingle(payload);
  }
  EXPECT_GT(charge.held(), 0U);
  flushAll();
  awaitWriter();
  EXPECT_EQ(charge.held(), 0U);
}

TEST_F(QVSQLiteEventStoreTest, CutsNamesThatEachMessageWouldRepeat) {
  const std::string letters(255, 'x');
  send(*openSession({.userInfo = {{kBeaconUserInfoClientName, letters + "\xC3\xA4" + letters},
                                  {kBeaconUserInfoServiceName, 12}}}),
       {});
  flushAll();
  EXPECT_THAT(rows("SELECT client_name, service_name FROM beacon_message"),
              ElementsAre(letters + "|12"));
}

TEST_F(QVSQLiteEventStoreTest, DescribesTheOneBackend) {
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_THAT(log_.lines(), IsEmpty());
}

}  // namespace
