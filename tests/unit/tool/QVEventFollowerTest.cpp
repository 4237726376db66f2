#include "platform/QVText.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tools/qvctl/QVEventFollower.h"

#include <limits>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <sqlite3.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kTables =
    "CREATE TABLE beacon_session(id INTEGER PRIMARY KEY, opened_at INTEGER, session_id INTEGER,"
    " user_info TEXT, flushed_at INTEGER);"
    "CREATE TABLE beacon_message(id INTEGER PRIMARY KEY, sent_at INTEGER, session_id INTEGER,"
    " service_name TEXT, category INTEGER, type INTEGER, payload TEXT);"
    "CREATE TABLE countwise_event(id INTEGER PRIMARY KEY, sent_at INTEGER, name TEXT, payload "
    "TEXT);"
    "CREATE TABLE joulewell_event(id INTEGER PRIMARY KEY, sent_at INTEGER, name TEXT, payload "
    "TEXT);"
    "CREATE TABLE loss(id INTEGER PRIMARY KEY, at INTEGER, cause TEXT, count INTEGER);"
    "PRAGMA user_version = 1;";

// A store of which only the columns are there that the reader asks for.
class QVEventFollowerTest : public testing::Test {
 protected:
  QVEventFollowerTest() { execute(kTables); }

  void execute(const std::string& statements) const {
    sqlite3* store = nullptr;
    ASSERT_EQ(::sqlite3_open(path_.c_str(), &store), SQLITE_OK);
    EXPECT_EQ(::sqlite3_exec(store, statements.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
        << ::sqlite3_errmsg(store);
    ::sqlite3_close(store);
  }
  // Losses at times that follow one another, and say in their count when.
  void addLosses(int64_t from, int64_t count) const {
    execute(QVText("WITH RECURSIVE n(i) AS (VALUES(", from, ") UNION ALL SELECT i + 1 FROM n ",
                   "WHERE i + 1 < ", from + count, ") INSERT INTO loss(at, cause, count) ",
                   "SELECT i, 'x', i FROM n"));
  }
  std::vector<int64_t> readCounts() {
    std::vector<int64_t> counts;
    follower_.readNew([&](const QVStoredEvent& event) {
      counts.push_back(event.count);
      ++received_;
    });
    return counts;
  }
  // The sessions whose stops have come.
  std::vector<int64_t> readStops() {
    std::vector<int64_t> stopped;
    follower_.readNew([&](const QVStoredEvent& event) {
      if (event.kind == QVStoredEvent::Kind::stop) stopped.push_back(event.session.value_or(-1));
    });
    return stopped;
  }

  const QVTemporaryRoot root_;
  const std::filesystem::path path_ = root_.path() / "reporting.db";
  const QVEventRowReader reader_{path_, QVEventFilter()};
  std::size_t received_ = 0;
  std::size_t most_ = std::numeric_limits<std::size_t>::max();
  std::size_t looks_ = 0;
  QVEventFollower follower_{reader_, [this] {
                              ++looks_;
                              return received_ >= most_;
                            }};
};

TEST_F(QVEventFollowerTest, ReadsWhatHasComeSinceTheLastTime) {
  addLosses(1, 2);
  follower_.skip();
  EXPECT_THAT(readCounts(), IsEmpty());
  addLosses(3, 2);
  EXPECT_THAT(readCounts(), ElementsAre(3, 4));
  EXPECT_THAT(readCounts(), IsEmpty());
  EXPECT_FALSE(follower_.mayHaveMissed());
}

TEST_F(QVEventFollowerTest, ReadsNoMoreThanIsEnough) {
  addLosses(1, 100'000);
  most_ = 5;
  EXPECT_THAT(readCounts(), SizeIs(5));
  // 50 looks into the store would have been all of it.
  EXPECT_LT(looks_, 20U);
}

TEST_F(QVEventFollowerTest, FindsAllStopsOfManySessionsAtOnce) {
  follower_.skip();
  execute(
      "WITH RECURSIVE n(i) AS (VALUES(1) UNION ALL SELECT i + 1 FROM n WHERE i < 6000) "
      "INSERT INTO beacon_session(opened_at, session_id, user_info, flushed_at) "
      "SELECT i, i, '{}', 10000 + i FROM n");
  const auto stopped = readStops();
  ASSERT_THAT(stopped, SizeIs(6000));
  EXPECT_EQ(stopped.front(), 1);
  EXPECT_EQ(stopped.back(), 6000);
  EXPECT_THAT(readStops(), IsEmpty());
}

TEST_F(QVEventFollowerTest, WaitsForTheStopOfASessionThatRuns) {
  execute("INSERT INTO beacon_session VALUES(1, 1, 7, '{}', NULL), (2, 2, 8, '{}', 3)");
  EXPECT_THAT(readStops(), ElementsAre(8));
  execute("UPDATE beacon_session SET flushed_at = 4 WHERE id = 1");
  EXPECT_THAT(readStops(), ElementsAre(7));
  EXPECT_THAT(readStops(), IsEmpty());
}

TEST_F(QVEventFollowerTest, ReadsATableAnewThatWasEmptiedAndHasMoreRowsAgain) {
  addLosses(1, 3);
  follower_.skip();
  execute("DELETE FROM loss");
  addLosses(101, 5);
  EXPECT_THAT(readCounts(), ElementsAre(101, 102, 103, 104, 105));
  EXPECT_TRUE(follower_.mayHaveMissed());
  EXPECT_FALSE(follower_.mayHaveMissed());
}

TEST_F(QVEventFollowerTest, ForgetsSessionsOfATableThatWasEmptiedAndHasMoreRowsAgain) {
  execute("INSERT INTO beacon_session VALUES(1, 1, 7, '{}', NULL)");
  follower_.skip();
  execute(
      "DELETE FROM beacon_session;"
      "INSERT INTO beacon_session VALUES(1, 11, 8, '{}', 12), (2, 13, 9, '{}', 14)");
  EXPECT_THAT(readStops(), ElementsAre(8, 9));
  EXPECT_THAT(readStops(), IsEmpty());
}

TEST_F(QVEventFollowerTest, SaysThatTheOldestRowsWentUnread) {
  addLosses(1, 3);
  follower_.skip();
  addLosses(4, 4);
  execute("DELETE FROM loss WHERE id <= 3");
  EXPECT_THAT(readCounts(), ElementsAre(4, 5, 6, 7));
  EXPECT_FALSE(follower_.mayHaveMissed());
  addLosses(8, 4);
  execute("DELETE FROM loss WHERE id <= 9");
  EXPECT_THAT(readCounts(), ElementsAre(10, 11));
  EXPECT_TRUE(follower_.mayHaveMissed());
}

TEST_F(QVEventFollowerTest, PassesGapsBetweenAnyNumbers) {
  execute(
      "INSERT INTO loss VALUES(-9223372036854775807, 1, 'x', 1), (5, 2, 'x', 2),"
      "(9223372036854775806, 3, 'x', 3)");
  EXPECT_THAT(readCounts(), ElementsAre(1, 2, 3));
  execute("INSERT INTO loss VALUES(9223372036854775807, 4, 'x', 4)");
  EXPECT_THAT(readCounts(), ElementsAre(4));
  EXPECT_THAT(readCounts(), IsEmpty());
}

}  // namespace
