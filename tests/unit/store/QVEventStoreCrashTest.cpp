#include "tests/unit/store/QVStoreFixture.h"

#include <csignal>
#include <future>

#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using ::testing::ElementsAre;

// A service that is killed outright. It runs in a child process, which has to be started before
// this process has made a thread of its own.
class QVEventStoreCrashTest : public QVStoreFixture {
 protected:
  // Runs `work` in a child process and kills it once it has returned there.
  template <class Work>
  void killAfter(Work&& work) {
    int report[2];
    ASSERT_EQ(pipe(report), 0);
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      work();
      const char done = HasFailure() ? 'f' : 'd';
      if (write(report[1], &done, 1) != 1) _exit(1);
      for (;;) pause();
    }
    ::close(report[1]);
    char done = 0;
    EXPECT_EQ(read(report[0], &done, 1), 1);
    EXPECT_EQ(done, 'd');
    ::close(report[0]);
    EXPECT_EQ(kill(child, SIGKILL), 0);
    int status = 0;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFSIGNALED(status));
  }
};

TEST_F(QVEventStoreCrashTest, LosesNothingThatWasOlderThanTheCommitInterval) {
  options_.commitInterval = QVEventStoreOptions{}.commitInterval;
  killAfter([this] {
    const auto session = openSession();
    send(*session, {{"n", 1}});
    // Asked for when the interval is over and the rows are written.
    std::promise<void> asked;
    QVStoreCountwise countwise(std::shared_ptr<QVSQLiteEventStore>(&store(), [](auto*) {}));
    countwise.sendEventLazily("event", [&asked] {
      asked.set_value();
      return QVDictionary{};
    });
    asked.get_future().wait();
    awaitWriter();
  });
  EXPECT_THAT(rows("PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_EQ(count("beacon_session"), 1);
  EXPECT_EQ(count("beacon_message"), 1);
  EXPECT_EQ(count("countwise_event"), 1);
}

TEST_F(QVEventStoreCrashTest, LosesTheRowsThatWaitedAndNoOthers) {
  killAfter([this] {
    const auto session = openSession();
    for (int i = 0; i < 1000; ++i) send(*session, {{"n", i}});
    EXPECT_EQ(flush(*session), std::nullopt);
    for (int i = 1000; i < 1100; ++i) send(*session, {{"n", i}});
    awaitWriter();
  });
  EXPECT_EQ(count("beacon_message"), 1000);
  // The service's next run goes on in the same file.
  const auto session = openSession();
  send(*session, {{"n", 2000}});
  EXPECT_EQ(flush(*session), std::nullopt);
  EXPECT_THAT(rows("PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_THAT(rows("SELECT m.id, m.payload, s.id FROM beacon_message m"
                   " JOIN beacon_session s ON s.id = m.session ORDER BY m.id DESC LIMIT 1"),
              ElementsAre(R"(1001|{"n":2000}|2)"));
  EXPECT_TRUE(log_.lines().empty());
}

TEST_F(QVEventStoreCrashTest, SurvivesDeathWhileTheOldestRowsAreRemoved) {
  preferences_.setValue("net.quillon.beacon", "store_limit_mib", 1);
  killAfter([this] {
    for (int i = 0; i < 20'000; ++i) sendSingle({{"text", std::string(300, 'x')}});
    flushAll();
    for (int i = 0; i < 20'000; ++i) sendSingle({{"text", std::string(300, 'y')}});
  });
  EXPECT_THAT(rows("PRAGMA integrity_check"), ElementsAre("ok"));
  const int64_t stored = count("beacon_message") + number("SELECT sum(count) FROM loss");
  EXPECT_GE(stored, 20'000);
  EXPECT_LE(stored, 40'000);
}

}  // namespace
