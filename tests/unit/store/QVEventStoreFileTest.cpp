#include "platform/linux/store/QVEventStoreError.h"
#include "platform/linux/store/QVEventStoreSchema.h"
#include "tests/support/QVSubprocess.h"
#include "tests/unit/store/QVStoreFixture.h"

#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

// The store's file: how it is made, and what happens to one that is of no use.
class QVEventStoreFileTest : public QVStoreFixture {
 protected:
  void write(const std::string& file, const std::string& bytes) {
    std::ofstream(file, std::ios::binary) << bytes;
  }
  std::string read(const std::string& file) {
    std::ifstream stream(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
  }
  void execute(const std::string& statements) {
    QVSQLiteDatabase database;
    ASSERT_EQ(database.open(path(), ""), SQLITE_OK);
    ASSERT_EQ(database.execute(statements.c_str()), SQLITE_OK) << database.message();
  }
  std::vector<std::string> filesOfState() {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(root_.state())) {
      names.push_back(entry.path().filename());
    }
    return names;
  }
  void removeFiles() {
    for (const std::string& name : filesOfState()) std::filesystem::remove(root_.state() / name);
  }
  // The superuser may write anywhere, so somebody else is who asks.
  std::optional<QVArray> findBackendsAsNobody() {
    constexpr uid_t kNobody = 65534;
    const uid_t before = geteuid();
    if (before == 0) {
      EXPECT_EQ(seteuid(kNobody), 0);
    }
    auto backends = findBackends();
    if (before == 0) {
      EXPECT_EQ(seteuid(before), 0);
    }
    return backends;
  }
};

TEST_F(QVEventStoreFileTest, HasTheTablesThatOtherProgramsRead) {
  EXPECT_NE(findBackends(), std::nullopt);
  const auto columns = [this](const std::string& table) {
    return rows("SELECT name, type, pk FROM pragma_table_info('" + table + "')");
  };
  EXPECT_THAT(columns("beacon_session"),
              ElementsAre("id|INTEGER|1", "opened_at|INTEGER|0", "session_id|INTEGER|0",
                          "token|TEXT|0", "client_type|INTEGER|0", "client_version|REAL|0",
                          "batch_event|INTEGER|0", "contains_realtime_events|INTEGER|0",
                          "user_info|TEXT|0", "flushed_at|INTEGER|0"));
  EXPECT_THAT(columns("beacon_message"),
              ElementsAre("id|INTEGER|1", "sent_at|INTEGER|0", "session|INTEGER|0",
                          "session_id|INTEGER|0", "client_name|TEXT|0", "service_name|TEXT|0",
                          "category|INTEGER|0", "type|INTEGER|0", "payload|TEXT|0"));
  EXPECT_THAT(columns("countwise_event"),
              ElementsAre("id|INTEGER|1", "sent_at|INTEGER|0", "name|TEXT|0", "payload|TEXT|0"));
  EXPECT_THAT(columns("joulewell_event"),
              ElementsAre("id|INTEGER|1", "sent_at|INTEGER|0", "agent|INTEGER|0", "name|TEXT|0",
                          "payload|TEXT|0"));
  EXPECT_THAT(columns("loss"),
              ElementsAre("id|INTEGER|1", "at|INTEGER|0", "cause|TEXT|0", "count|INTEGER|0"));
  EXPECT_THAT(rows("SELECT \"table\", \"from\" FROM pragma_foreign_key_list('beacon_message')"),
              ElementsAre("beacon_session|session"));
  EXPECT_THAT(rows("PRAGMA user_version"), ElementsAre("1"));
  EXPECT_THAT(rows("PRAGMA journal_mode"), ElementsAre("wal"));
}

TEST_F(QVEventStoreFileTest, LeavesTheFileOfALaterVersionAlone) {
  execute("PRAGMA user_version = 2; CREATE TABLE later(x)");
  const std::string before = read(path());
  EXPECT_EQ(findBackends(), std::nullopt);
  sendSingle({});
  awaitWriter();
  close();
  EXPECT_EQ(read(path()), before);
  EXPECT_THAT(
      lines(QVLogLevel::error),
      ElementsAre("the event store " + path() + " cannot be opened: its version 2 is newer than 1",
                  "the event store " + path() +
                      " was out of order to the end; events lost and not counted in it: 1"));
}

TEST_F(QVEventStoreFileTest, SetsAFileAsideThatIsNoDatabase) {
  write(path(), std::string(10'000, 'x'));
  EXPECT_EQ(findBackends(), QVArray{"store"});
  sendSingle({{"n", 1}});
  flushAll();
  EXPECT_EQ(count("beacon_message"), 1);
  const std::string aside = path() + ".corrupt-20240102T030405Z";
  EXPECT_EQ(read(aside), std::string(10'000, 'x'));
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() +
                          " is damaged (file is not a database), set aside as " + aside));
}

TEST_F(QVEventStoreFileTest, SetsAFileAsideWhoseTablesAreOthers) {
  execute("CREATE TABLE loss(something); PRAGMA user_version = 1");
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_THAT(filesOfState(), ::testing::Contains("reporting.db.corrupt-20240102T030405Z"));
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(HasSubstr("no such table")));
}

TEST_F(QVEventStoreFileTest, KeepsEachFileThatItSetsAside) {
  write(path() + ".corrupt-20240102T030405Z", "an earlier one");
  write(path(), std::string(10'000, 'y'));
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_EQ(read(path() + ".corrupt-20240102T030405Z"), "an earlier one");
  EXPECT_EQ(read(path() + ".corrupt-20240102T030405Z-2"), std::string(10'000, 'y'));
}

TEST_F(QVEventStoreFileTest, BeginsANewFileWhenTheOldOneIsDamagedMeanwhile) {
  const auto session = openSession({.sessionID = 7});
  for (int i = 0; i < 2000; ++i) send(*session, {{"n", i}});
  restart();
  {
    // The tree of messages is broken where the next one would be appended.
    QVSQLiteDatabase database;
    ASSERT_EQ(database.open(path(), ""), SQLITE_OK);
    ASSERT_EQ(database.execute("PRAGMA journal_mode = DELETE"), SQLITE_OK);
  }
  std::string bytes = read(path());
  ASSERT_GT(bytes.size(), 100'000U);
  const auto page = static_cast<std::size_t>(QVEventStoreSchema::kPageBytes);
  const auto later = openSession({.sessionID = 8});
  send(*later, {{"n", -1}});
  flushAll();
  close();
  restart();
  bytes = read(path());
  for (std::size_t i = 5 * page; i < bytes.size(); ++i) bytes[i] = '\x7F';
  write(path(), bytes);

  const auto last = openSession({.sessionID = 9});
  send(*last, {{"n", 1}});
  EXPECT_EQ(flush(*last), std::nullopt);
  EXPECT_THAT(rows("SELECT s.session_id, m.payload FROM beacon_message m"
                   " JOIN beacon_session s ON s.id = m.session"),
              ElementsAre(R"(9|{"n":1})"));
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(HasSubstr("is damaged (")));
  EXPECT_THAT(filesOfState(), ::testing::Contains("reporting.db.corrupt-20240102T030405Z"));
}

TEST_F(QVEventStoreFileTest, GivesALiveSessionARowInAFileThatReplacesItsOwn) {
  const auto session = openSession({.sessionID = 7});
  send(*session, {{"n", 1}});
  EXPECT_EQ(flush(*session), std::nullopt);
  removeFiles();
  EXPECT_EQ(findBackends(), QVArray{"store"});
  send(*session, {{"n", 2}});
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(rows("SELECT s.session_id, s.user_info, s.flushed_at IS NULL, m.payload"
                   " FROM beacon_message m JOIN beacon_session s ON s.id = m.session"),
              ElementsAre(R"(7|{"kBeaconUserInfoClientName":"net.quillon.quietvox",)"
                          R"("kBeaconUserInfoServiceName":"media_session"}|0|{"n":2})"));
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() + " was moved or removed; opening it anew"));
}

TEST_F(QVEventStoreFileTest, GoesOnInANewFileWhereNoSessionStarts) {
  sendSingle({{"n", 1}});
  flushAll();
  removeFiles();
  sendSingle({{"n", 2}});
  flushAll();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":2})"));

  // The database alone: what is in its log goes with it.
  std::filesystem::rename(path(), path() + ".old");
  sendSingle({{"n", 3}});
  sendCountwise("event", {});
  flushAll();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":3})"));
  EXPECT_EQ(count("countwise_event"), 1);
  const std::string line = "the event store " + path() + " was moved or removed; opening it anew";
  EXPECT_THAT(lines(QVLogLevel::error), ElementsAre(line, line));
  EXPECT_THAT(losses(), IsEmpty());
}

TEST_F(QVEventStoreFileTest, GoesOnInANewFileWhileAReaderHasTheOldOneOpen) {
  sendSingle({{"n", 1}});
  flushAll();
  // Another program, which says that it has read and then waits for commands that do not come.
  const std::string hasRead = root_.path() / "has-read";
  const std::string commands = root_.path() / "commands";
  ASSERT_EQ(::mkfifo(hasRead.c_str(), 0600), 0);
  ASSERT_EQ(::mkfifo(commands.c_str(), 0600), 0);
  const QVSubprocess reader({.arguments = {"sqlite3", path(), "SELECT * FROM beacon_message;",
                                           ".shell echo > " + hasRead, ".read " + commands},
                             .standardOutputFile = root_.path() / "out"});
  std::string line;
  std::getline(std::ifstream(hasRead), line);
  std::filesystem::rename(path(), path() + ".old");
  sendSingle({{"n", 2}});
  flushAll();
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":2})"));
  EXPECT_THAT(losses(), IsEmpty());
}

TEST_F(QVEventStoreFileTest, CountsWhatComesOnceItsDirectoryIsGone) {
  sendSingle({{"n", 1}});
  flushAll();
  std::filesystem::remove_all(root_.state());
  const auto session = openSession();
  send(*session, {{"n", 2}});
  const std::optional<QVError> error = flush(*session);
  ASSERT_NE(error, std::nullopt);
  EXPECT_EQ(error->code, static_cast<int64_t>(QVEventStoreErrorCode::unavailable));
  std::filesystem::create_directory(root_.state());
  EXPECT_EQ(findBackends(), QVArray{"store"});
  send(*session, {{"n", 3}});
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(rows("SELECT payload FROM beacon_message"), ElementsAre(R"({"n":3})"));
  EXPECT_THAT(losses(), ElementsAre("store_unavailable|1"));
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() + " was moved or removed; opening it anew",
                          "the event store " + path() +
                              " cannot be opened: its directory: No such file or directory"));
}

TEST_F(QVEventStoreFileTest, CountsWhatComesWhileItsDirectoryIsMissing) {
  std::filesystem::remove(root_.state());
  EXPECT_EQ(findBackends(), std::nullopt);
  EXPECT_EQ(findBackends(), std::nullopt);
  const auto session = openSession();
  send(*session, {{"n", 1}});
  sendCountwise("event", {});
  logJoulewell({});
  const std::optional<QVError> error = flush(*session);
  ASSERT_NE(error, std::nullopt);
  EXPECT_EQ(error->domain, kBeaconErrorDomain);
  EXPECT_EQ(error->code, static_cast<int64_t>(QVEventStoreErrorCode::unavailable));
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() +
                          " cannot be opened: its directory: No such file or directory"));

  std::filesystem::create_directory(root_.state());
  EXPECT_EQ(findBackends(), QVArray{"store"});
  EXPECT_THAT(lines(QVLogLevel::standard),
              ElementsAre("the event store " + path() + " is open again"));
  send(*session, {{"n", 2}});
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(losses(), ElementsAre("store_unavailable|3"));
  EXPECT_THAT(rows("SELECT s.session_id, m.payload FROM beacon_message m"
                   " JOIN beacon_session s ON s.id = m.session"),
              ElementsAre(R"(4711|{"n":2})"));
  EXPECT_THAT(lines(QVLogLevel::error), SizeIs(1));
}

TEST_F(QVEventStoreFileTest, DoesNotCountUnwantedEventsAsLost) {
  preferences_.setValue("net.quillon.countwise", "unwanted", QVArray{"noise"});
  std::filesystem::remove(root_.state());
  sendCountwise("noise", {});
  sendCountwise("signal", {});
  awaitWriter();
  EXPECT_NE(flush(*openSession()), std::nullopt);
  std::filesystem::create_directory(root_.state());
  EXPECT_EQ(findBackends(), QVArray{"store"});
  flushAll();
  EXPECT_THAT(losses(), ElementsAre("store_unavailable|1"));
}

TEST_F(QVEventStoreFileTest, CannotUseADirectoryThatItMayNotWriteTo) {
  std::filesystem::permissions(root_.path(), std::filesystem::perms(0755));
  std::filesystem::permissions(root_.state(), std::filesystem::perms(0555));
  EXPECT_EQ(findBackendsAsNobody(), std::nullopt);
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() +
                          " cannot be opened: its directory: Permission denied"));
  EXPECT_THAT(filesOfState(), IsEmpty());
}

TEST_F(QVEventStoreFileTest, CannotUseAFileThatItMayNotWriteTo) {
  sendSingle({});
  close();
  restart();
  std::filesystem::permissions(root_.path(), std::filesystem::perms(0755));
  std::filesystem::permissions(root_.state(), std::filesystem::perms(0777));
  std::filesystem::permissions(path(), std::filesystem::perms(0444));
  EXPECT_EQ(findBackendsAsNobody(), std::nullopt);
  EXPECT_THAT(lines(QVLogLevel::error),
              ElementsAre("the event store " + path() + " cannot be opened: it cannot be written"));
}

}  // namespace
