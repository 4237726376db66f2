// An event store that cannot be opened or written: the service goes on, says so, and counts.

#include "tests/support/QVEndToEndTest.h"

#include <csignal>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sqlite3.h>
#include <sys/resource.h>

namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kAPIUsage = 12;

class QVStoreTroubleTest : public QVEndToEndTest {
 protected:
  void runSession(QVPeerClient& client, int64_t reporterID) {
    client.create(reporterID, kTelephony);
    client.start(reporterID);
    client.sendMessage({{"session", reporterID}}, {reporterID});
    client.stop(reporterID);
  }
  // A session that goes on, whose first message, with an "i" of 0, is in the store.
  void startStoredSession(QVPeerClient& client, int64_t reporterID) {
    client.create(reporterID, kAPIUsage);
    client.start(reporterID);
    client.sendMessage({{"i", 0}}, {reporterID});
    expectStored("SELECT * FROM beacon_message", 1);
  }
  // Files beside the store that were set aside.
  std::vector<std::string> setAside() const {
    std::vector<std::string> names;
    for (const auto& file : std::filesystem::directory_iterator(root_.state())) {
      const std::string name = file.path().filename();
      if (name.starts_with("reporting.db.corrupt-") && !name.ends_with("-wal")) {
        names.push_back(name);
      }
    }
    return names;
  }
  void makeStore(const char* statements) const {
    sqlite3* handle = nullptr;
    ASSERT_EQ(sqlite3_open(root_.store().c_str(), &handle), SQLITE_OK);
    EXPECT_EQ(sqlite3_exec(handle, statements, nullptr, nullptr, nullptr), SQLITE_OK);
    sqlite3_close(handle);
  }
  // One error line, whatever number of sessions meet the trouble.
  void expectOneErrorLine(const std::string& text) {
    expectLogged(text);
    const auto lines = log().lines(text);
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_THAT(lines[0], AllOf(HasSubstr("<3>[default] "), HasSubstr(root_.store().string())));
  }
};

TEST_F(QVStoreTroubleTest, AStoreThatCannotBeOpenedIsTriedAgainAtTheNextSession) {
  constexpr const char* kNoBackends =
      "No backends found, this session won't get sent to the server";
  // So many rows are written without waiting for more.
  constexpr int kMessages = 500;
  std::filesystem::create_directory(root_.store());
  auto client = connectClient();
  client.create(7, kTelephony);
  client.start(7);
  for (int i = 0; i < kMessages; ++i) client.sendMessage({{"i", i}}, {7});
  expectLogged(kNoBackends);
  expectOneErrorLine("cannot be opened");
  expectServes(client);
  // A later session finds nothing either. The store answers one after the other and stores what is
  // due in between, so after the second answer analytics events are lost, and counted.
  for (const int reporter : {8, 9}) {
    client.create(reporter, kTelephony);
    client.start(reporter);
    expectLogged(kNoBackends, static_cast<std::size_t>(reporter) - 6);
  }

  std::filesystem::remove(root_.store());
  runSession(client, 10);
  endService();
  EXPECT_EQ(log().count("cannot be opened"), 1U);
  EXPECT_EQ(log().count("is open again"), 1U);
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE session_id = 10"), 2);
  const int64_t lost =
      store().number("SELECT sum(count) FROM loss WHERE cause = 'store_unavailable'");
  EXPECT_GT(lost, 0);
  // With session 10's message and the client's uptime, nothing is missing.
  EXPECT_EQ(lost + store().count("countwise_event"), kMessages + 2);
}

TEST_F(QVStoreTroubleTest, ANewerStoreIsLeftAlone) {
  makeStore("CREATE TABLE theirs(x); PRAGMA user_version = 1000");
  auto client = connectClient();
  client.create(7, kTelephony);
  client.start(7);
  expectLogged("No backends found, this session won't get sent to the server");
  expectOneErrorLine("cannot be opened");
  expectServes(client);
  endService();
  EXPECT_THAT(store().rows("SELECT name FROM sqlite_master"), ElementsAre("theirs"));
  EXPECT_EQ(store().number("PRAGMA user_version"), 1000);
  EXPECT_TRUE(setAside().empty());
}

TEST_F(QVStoreTroubleTest, ADamagedStoreIsSetAside) {
  std::ofstream(root_.store()) << std::string(10'000, 'x');
  auto client = connectClient();
  runSession(client, 7);
  endService();
  expectOneErrorLine("is damaged");
  ASSERT_EQ(setAside().size(), 1U);
  EXPECT_EQ(std::filesystem::file_size(root_.state() / setAside()[0]), 10'000U);
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE session_id = 7"), 2);
}

TEST_F(QVStoreTroubleTest, AStoreThatIsRemovedIsBegunAnew) {
  auto client = connectClient();
  startStoredSession(client, 6);
  std::filesystem::remove(root_.store());
  std::filesystem::remove(root_.store().string() + "-wal");
  std::filesystem::remove(root_.store().string() + "-shm");
  runSession(client, 7);
  endService();
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE session_id = 7"), 2);
}

TEST_F(QVStoreTroubleTest, AReaderThatStaysHoldsNothingUp) {
  auto client = connectClient();
  startStoredSession(client, 6);
  const auto reader = std::make_unique<QVStoreReader>(root_.store());
  reader->rows("SELECT * FROM beacon_message");
  runSession(client, 7);
  endService();
  EXPECT_EQ(reader->number("SELECT count(*) FROM beacon_message WHERE session_id = 7"), 2);
}

TEST_F(QVStoreTroubleTest, AStoreThatAnotherProgramLocksForAWhileLosesNothing) {
  auto client = connectClient();
  startStoredSession(client, 7);
  sqlite3* other = nullptr;
  ASSERT_EQ(sqlite3_open(root_.store().c_str(), &other), SQLITE_OK);
  sqlite3_busy_timeout(other, 10'000);
  ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
  for (int i = 1; i <= 100; ++i) client.sendMessage({{"i", i}}, {7});
  expectOneErrorLine("cannot be written");
  expectServes(client);

  EXPECT_EQ(sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr), SQLITE_OK);
  sqlite3_close(other);
  expectLogged("can be written again; events lost meanwhile: 0");
  endService();
  EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE category <> 65535"), 101);
  EXPECT_EQ(store().count("loss"), 0);
}

// A limit of file size stands in for a disk that is full: writing beyond it fails the same way,
// and it can be set and taken back without a file system of one's own.
TEST_F(QVStoreTroubleTest, ADiskThatIsFullForAWhileLosesNothing) {
  // The signal that comes with the limit is none that a full disk would send.
  startService({.wrapper = {"/bin/sh", "-c", "trap '' XFSZ; exec \"$0\""}});
  auto client = connectClient();
  startStoredSession(client, 7);

  rlimit before{};
  ASSERT_EQ(::prlimit(service().pid(), RLIMIT_FSIZE, nullptr, &before), 0);
  rlimit limit = before;
  limit.rlim_cur = 256 * 1024;
  ASSERT_EQ(::prlimit(service().pid(), RLIMIT_FSIZE, &limit, nullptr), 0);
  constexpr int kMessages = 100;
  const std::string text(10'000, 'x');
  for (int i = 1; i <= kMessages; ++i) client.sendMessage({{"i", i}, {"text", text}}, {7});
  expectOneErrorLine("cannot be written");
  expectServes(client);

  ASSERT_EQ(::prlimit(service().pid(), RLIMIT_FSIZE, &before, nullptr), 0);
  expectLogged("can be written again; events lost meanwhile: 0");
  endService();
  EXPECT_EQ(store().number("SELECT count(DISTINCT json_extract(payload, '$.i')) "
                           "FROM beacon_message WHERE category <> 65535"),
            kMessages + 1);
  EXPECT_EQ(store().count("loss"), 0);
  EXPECT_THAT(store().rows("PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(QVStoreTroubleTest, ADiskThatStaysFullDoesNotKeepTheServiceFromEnding) {
  startService({.wrapper = {"/bin/sh", "-c", "trap '' XFSZ; exec \"$0\""}});
  auto client = connectClient();
  startStoredSession(client, 7);
  const rlimit limit{.rlim_cur = 64 * 1024, .rlim_max = 64 * 1024};
  ASSERT_EQ(::prlimit(service().pid(), RLIMIT_FSIZE, &limit, nullptr), 0);
  const std::string text(10'000, 'x');
  for (int i = 1; i <= 100; ++i) client.sendMessage({{"i", i}, {"text", text}}, {7});
  expectOneErrorLine("cannot be written");
  endService();
  EXPECT_EQ(log().count("was out of order to the end"), 1U);
  EXPECT_THAT(store().rows("PRAGMA integrity_check"), ElementsAre("ok"));
}

// ---- Sessions that wait

// A store that cannot be opened makes each session's queue wait for nine seconds.
TEST_F(QVStoreTroubleTest, WaitingSessionsDoNotDelayAnothersMessage) {
  constexpr std::size_t kSessions = 200;
  std::filesystem::create_directory(root_.store());
  auto client = connectClient();
  for (std::size_t i = 1; i <= kSessions; ++i) {
    const auto reporter = static_cast<int64_t>(i);
    client.post(createCall(reporter));
    client.post(startCall(reporter));
  }
  client.awaitOperations();
  // Each of them has a thread to wait on, none waits for another's.
  expectLogged("waiting for beacond to find backends", kSessions);

  std::filesystem::remove(root_.store());
  auto other = connectClient();
  other.create(1000, kAPIUsage);
  other.start(1000);
  other.sendMessage({{"a", 1}}, {1000});
  expectStored("SELECT * FROM beacon_message WHERE session_id = 1000", 1);
  // The end does not wait for them either.
  endService();
  EXPECT_EQ(log().count("deallocing this session"), kSessions + 1);
}

}  // namespace
