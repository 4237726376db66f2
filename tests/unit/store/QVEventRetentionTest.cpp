#include "tests/unit/store/QVStoreFixture.h"

#include <filesystem>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// A store that has reached the limit of its file.
class QVEventRetentionTest : public QVStoreFixture {
 protected:
  static constexpr int64_t kLimit = int64_t{1024} * 1024;

  QVEventRetentionTest() { preferences_.setValue("net.quillon.beacon", "store_limit_mib", 1); }

  int64_t fileBytes() {
    restart();  // the write-ahead log is copied into the file
    return static_cast<int64_t>(std::filesystem::file_size(path()));
  }
  int64_t lost() const {
    return number("SELECT coalesce(sum(count), 0) FROM loss WHERE cause = 'store_limit'");
  }
};

TEST_F(QVEventRetentionTest, RemovesTheOldestRowsOfAllTables) {
  const auto session = openSession();
  constexpr int kEvents = 5000;
  for (int i = 0; i < kEvents; ++i) {
    clock_.advance(std::chrono::milliseconds(1));
    const QVDictionary payload{{"n", i}, {"text", std::string(300, 'x')}};
    send(*session, payload);
    sendCountwise("event", payload);
    if (i % 10 == 0) logJoulewell(payload);
    if (i % 300 == 0) flushAll();
  }
  EXPECT_LE(fileBytes(), kLimit);
  const int64_t messages = count("beacon_message");
  EXPECT_GT(messages, 1000);
  for (const std::string table : {"beacon_message", "countwise_event", "joulewell_event"}) {
    EXPECT_EQ(number("SELECT max(json_extract(payload, '$.n')) / 10 * 10 FROM " + table),
              kEvents - 10)
        << table;
    EXPECT_NEAR(
        static_cast<double>(number("SELECT min(json_extract(payload, '$.n')) FROM " + table)),
        static_cast<double>(kEvents - messages), 11)
        << table;
  }
  EXPECT_EQ(lost(), 2 * kEvents + kEvents / 10 - messages - count("countwise_event") -
                        count("joulewell_event"));
  EXPECT_EQ(count("loss"), 1) << "one cause, one row an hour";
  EXPECT_EQ(count("beacon_session"), 1) << "the session is still open";
  EXPECT_THAT(rows("PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(QVEventRetentionTest, BeginsANewRowOfLossesEachHour) {
  for (int hour = 0; hour < 3; ++hour) {
    for (int i = 0; i < 5000; ++i) sendSingle({{"text", std::string(500, 'x')}});
    flushAll();
    clock_.advance(std::chrono::minutes(61));
  }
  EXPECT_EQ(count("loss"), 3);
  EXPECT_EQ(lost() + count("beacon_message"), 15'000);
}

TEST_F(QVEventRetentionTest, KeepsToTheLimitWhateverTheRowsSize) {
  const auto session = openSession();
  int sent = 0;
  for (int round = 0; round < 4; ++round) {
    for (const std::size_t size : {10, 1'500, 4'200, 8'100, 8'300, 60'000, 250'000}) {
      for (int i = 0; i < 12; ++i, ++sent) {
        send(*session, {{"text", std::string(size, 'x')}});
        sendCountwise("event", {});
      }
      flushAll();
    }
  }
  EXPECT_LE(fileBytes(), kLimit);
  EXPECT_GT(count("beacon_message"), 0);
  EXPECT_EQ(lost() + count("beacon_message") + count("countwise_event"), 2 * sent);
}

TEST_F(QVEventRetentionTest, LeavesOutARowThatIsLargerThanTheStore) {
  const auto session = openSession();
  send(*session, {{"n", 1}});
  send(*session, {{"text", std::string(static_cast<std::size_t>(kLimit), 'x')}});
  send(*session, {{"n", 2}});
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(rows("SELECT payload FROM beacon_message ORDER BY id"),
              ElementsAre(R"({"n":1})", R"({"n":2})"));
  EXPECT_THAT(losses(), ElementsAre("row_too_large|1"));
}

TEST_F(QVEventRetentionTest, RemovesSessionsThatEndedBeforeTheOldestMessage) {
  constexpr int kSessions = 300;
  const auto open = openSession({.sessionID = -1});
  for (int i = 0; i < kSessions; ++i) {
    const auto session = openSession({.sessionID = i});
    for (int j = 0; j < 20; ++j) {
      clock_.advance(std::chrono::milliseconds(1));
      send(*session, {{"text", std::string(300, 'x')}});
    }
    EXPECT_EQ(flush(*session), std::nullopt);
    clock_.advance(std::chrono::milliseconds(1));
  }
  EXPECT_THAT(rows("SELECT id FROM beacon_message WHERE session NOT IN"
                   " (SELECT id FROM beacon_session)"),
              IsEmpty());
  EXPECT_EQ(number("SELECT count(*) FROM beacon_session WHERE session_id = -1"), 1)
      << "the session that is still open";
  const int64_t oldest = number("SELECT min(session_id) FROM beacon_message");
  EXPECT_GT(oldest, 100);
  // Ended sessions are looked at a few at a time, so some may be left for the next removal.
  EXPECT_LT(number(QVText("SELECT count(*) FROM beacon_session WHERE session_id < ", oldest)), 65);
}

TEST_F(QVEventRetentionTest, RemovesSessionsThatAnEarlierRunLeftOpen) {
  for (int i = 0; i < 50; ++i) {
    send(*openSession({.sessionID = i}), {{"text", std::string(300, 'x')}});
  }
  restart();
  findBackends();  // opens the store now: what it finds open has ended
  clock_.advance(std::chrono::seconds(1));
  const auto session = openSession({.sessionID = 1000});
  for (int i = 0; i < 10'000; ++i) {
    clock_.advance(std::chrono::milliseconds(1));
    send(*session, {{"text", std::string(300, 'x')}});
  }
  flushAll();
  EXPECT_THAT(rows("SELECT session_id FROM beacon_session"), ElementsAre("1000"));
}

TEST_F(QVEventRetentionTest, RemovesSessionsWhenThereIsNothingElse) {
  std::vector<std::shared_ptr<QVBeaconSession>> sessions;
  for (int i = 0; i < 300; ++i) {
    sessions.push_back(
        openSession({.sessionID = i, .userInfo = {{"configuration", std::string(20'000, 'x')}}}));
  }
  flushAll();
  EXPECT_LE(fileBytes(), kLimit);
  EXPECT_EQ(number("SELECT max(session_id) FROM beacon_session"), 299);
}

TEST_F(QVEventRetentionTest, TakesALowerLimitWithTheNextSession) {
  preferences_.setValue("net.quillon.beacon", "store_limit_mib", 4);
  for (int i = 0; i < 10'000; ++i) sendSingle({{"text", std::string(300, 'x')}});
  flushAll();
  const int64_t before = count("beacon_message");
  EXPECT_GT(before, 7'000);
  preferences_.setValue("net.quillon.beacon", "store_limit_mib", 1);
  findBackends();
  sendSingle({});
  flushAll();
  EXPECT_LT(count("beacon_message"), before / 3);
  EXPECT_EQ(lost() + count("beacon_message"), 10'001);
}

TEST_F(QVEventRetentionTest, ReadsALimitThatIsNoneAsTheUsualOne) {
  options_.fileBytes = 4 * kLimit;
  for (const QVValue& limit :
       {QVValue(0), QVValue(-5), QVValue("many"), QVValue(QVArray{1}), QVValue()}) {
    preferences_.setValue("net.quillon.beacon", "store_limit_mib", limit);
    restart();
    for (int i = 0; i < 2'000; ++i) sendSingle({{"text", std::string(300, 'x')}});
    flushAll();
  }
  EXPECT_GT(count("beacon_message"), 7'000);
}

}  // namespace
