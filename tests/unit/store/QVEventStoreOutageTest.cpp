#include "platform/fake/QVFakeMemoryCharge.h"
#include "platform/linux/store/QVEventStoreError.h"
#include "platform/linux/store/QVSQLiteDatabase.h"
#include "tests/unit/store/QVFaultyFileSystem.h"
#include "tests/unit/store/QVStoreFixture.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <sqlite3.h>

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// A store whose disk fails while it runs.
class QVEventStoreOutageTest : public QVStoreFixture {
 protected:
  using Fault = QVFaultyFileSystem::Fault;

  QVEventStoreOutageTest() { options_.vfs = QVFaultyFileSystem::name(); }
  ~QVEventStoreOutageTest() override {
    fileSystem_.fail(Fault::none);
    restart();
  }

  // A flush that has to fail, so that everything sent is in the writer's hands afterwards.
  void expectOutage(QVBeaconSession& session) {
    const std::optional<QVError> error = flush(session);
    ASSERT_NE(error, std::nullopt);
    EXPECT_EQ(error->domain, kBeaconErrorDomain);
    EXPECT_EQ(error->code, static_cast<int64_t>(QVEventStoreErrorCode::outOfOrder));
  }

  QVFaultyFileSystem fileSystem_;
};

TEST_F(QVEventStoreOutageTest, StoresWhatItHeldWhenTheDiskHasRoomAgain) {
  const auto session = openSession();
  send(*session, {{"n", 1}});
  ASSERT_EQ(flush(*session), std::nullopt);

  fileSystem_.fail(Fault::diskFull);
  send(*session, {{"n", 2}});
  sendCountwise("event", {{"n", 3}});
  expectOutage(*session);
  send(*session, {{"n", 4}});
  expectOutage(*session);
  EXPECT_EQ(count("beacon_message"), 1);
  EXPECT_EQ(findBackends(), QVArray{"store"}) << "held events are not lost ones";

  fileSystem_.fail(Fault::none);
  close();  // tries once more
  EXPECT_THAT(rows("SELECT payload FROM beacon_message ORDER BY id"),
              ElementsAre(R"({"n":1})", R"({"n":2})", R"({"n":4})"));
  EXPECT_EQ(count("countwise_event"), 1);
  EXPECT_THAT(losses(), IsEmpty());
  EXPECT_THAT(
      lines(QVLogLevel::error),
      ElementsAre("the event store " + path() + " cannot be written: database or disk is full"));
  EXPECT_THAT(
      lines(QVLogLevel::standard),
      ElementsAre("the event store " + path() + " can be written again; events lost meanwhile: 0"));
}

TEST_F(QVEventStoreOutageTest, TriesAgainByItself) {
  options_.retryInterval = std::chrono::milliseconds(1);
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::badSectors);
  send(*session, {{"n", 1}});
  expectOutage(*session);
  fileSystem_.fail(Fault::none);
  // Nothing is handed over meanwhile that could wake the writer.
  EXPECT_TRUE(fileSystem_.awaitWrite());
  awaitWriter();
  EXPECT_EQ(count("beacon_message"), 1);
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() + " cannot be written: disk I/O error"));
}

TEST_F(QVEventStoreOutageTest, GivesUpTheOldestAndCountsThem) {
  options_.heldBytes = 100'000;
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::diskFull);
  constexpr int64_t kEvents = 500;
  for (int i = 0; i < kEvents; ++i) {
    clock_.advance(std::chrono::microseconds(1));
    send(*session, {{"n", i}, {"text", std::string(200, 'm')}});
    clock_.advance(std::chrono::microseconds(1));
    sendCountwise("event", {{"n", i}, {"text", std::string(200, 'c')}});
  }
  expectOutage(*session);
  fileSystem_.fail(Fault::none);
  close();
  const int64_t lost = expectNewest(kEvents);
  EXPECT_THAT(losses(), ElementsAre(QVText("store_full|", lost)));
  EXPECT_THAT(lines(QVLogLevel::standard),
              ElementsAre(QVText("the event store ", path(),
                                 " can be written again; events lost meanwhile: ", lost)));
}

TEST_F(QVEventStoreOutageTest, LetsGoOfWhatItGivesUp) {
  QVFakeMemoryCharge charge;
  options_.heldBytes = 100'000;
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::badSectors);
  const std::string text(1000, 'x');
  for (int i = 0; i < 2000; ++i) {
    std::vector<QVDictionaryEntry> entries{{"text", text}};
    send(*session, QVDictionary::assemble(entries, &charge));
  }
  expectOutage(*session);
  awaitWriter();
  EXPECT_LE(charge.held(), 100'000U);
  EXPECT_GT(charge.held(), 50'000U);
  restart();
  EXPECT_EQ(charge.held(), 0U);
}

TEST_F(QVEventStoreOutageTest, CountsByTheCauseOfTheOutage) {
  options_.heldBytes = 1;
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::badSectors);
  send(*session, {{"n", 1}});
  expectOutage(*session);
  fileSystem_.fail(Fault::none);
  restart();
  sendSingle({});
  flushAll();
  EXPECT_THAT(losses(), ElementsAre("store_io_error|1"));
}

TEST_F(QVEventStoreOutageTest, GivesASessionARowWhoseOwnWasGivenUp) {
  options_.heldBytes = 1;
  const auto first = openSession({.sessionID = 1});
  ASSERT_EQ(flush(*first), std::nullopt);
  fileSystem_.fail(Fault::diskFull);
  const auto second = openSession({.sessionID = 2});
  expectOutage(*second);
  fileSystem_.fail(Fault::none);
  send(*second, {{"n", 1}});
  close();
  EXPECT_THAT(rows("SELECT s.session_id, m.payload FROM beacon_message m"
                   " JOIN beacon_session s ON s.id = m.session"),
              ElementsAre(R"(2|{"n":1})"));
}

TEST_F(QVEventStoreOutageTest, WritesASessionOnceThatAFailedTransactionBegan) {
  const auto first = openSession({.sessionID = 1});
  ASSERT_EQ(flush(*first), std::nullopt);
  fileSystem_.fail(Fault::diskFull);
  const auto second = openSession({.sessionID = 2});
  send(*second, {{"n", 1}});
  expectOutage(*second);
  fileSystem_.fail(Fault::none);
  close();
  EXPECT_THAT(rows("SELECT s.session_id, m.payload FROM beacon_session s"
                   " LEFT JOIN beacon_message m ON s.id = m.session ORDER BY s.id"),
              ElementsAre("1|NULL", R"(2|{"n":1})"));
}

TEST_F(QVEventStoreOutageTest, StoresWhatItHeldInANewFileWhereTheOldOneIsGone) {
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::diskFull);
  send(*session, {{"n", 1}});
  expectOutage(*session);
  // As somebody might make room.
  std::filesystem::rename(path(), path() + ".old");
  fileSystem_.fail(Fault::none);
  close();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":1})"));
}

TEST_F(QVEventStoreOutageTest, SaysWhatIsLostWhenTheDiskNeverComesBack) {
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  fileSystem_.fail(Fault::diskFull);
  send(*session, {{"n", 1}});
  sendCountwise("event", {});
  close();
  EXPECT_THAT(
      lines(QVLogLevel::error),
      ElementsAre("the event store " + path() + " cannot be written: database or disk is full",
                  "the event store " + path() +
                      " was out of order to the end; events lost and not counted in it: 2"));
}

TEST_F(QVEventStoreOutageTest, HoldsRowsWhileAnotherProgramHasTheFile) {
  const auto session = openSession();
  ASSERT_EQ(flush(*session), std::nullopt);
  QVSQLiteDatabase other;
  ASSERT_EQ(other.open(path(), ""), SQLITE_OK);
  ASSERT_EQ(other.execute("BEGIN IMMEDIATE"), SQLITE_OK);
  send(*session, {{"n", 1}});
  expectOutage(*session);
  ASSERT_EQ(other.execute("ROLLBACK"), SQLITE_OK);
  other.close();
  close();
  EXPECT_EQ(count("beacon_message"), 1);
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() + " cannot be written: database is locked"));
}

}  // namespace
