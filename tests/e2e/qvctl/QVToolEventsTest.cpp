// qvctl events and watch.

#include "platform/QVText.h"
#include "platform/linux/QVDescriptor.h"
#include "tests/e2e/qvctl/QVToolTest.h"

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <limits>
#include <set>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;
using ::testing::UnorderedElementsAre;

constexpr uint16_t kTelephony = 2;
constexpr uint16_t kHaptics = 3;
constexpr uint16_t kAPIUsage = 12;
constexpr uint32_t kRoutingError = 0x40000008;
constexpr uint16_t kStop = 2;

class QVToolEventsTest : public QVToolTest {
 protected:
  // Two sessions with messages, stopped; all of it is in the store.
  void fillStore() {
    startSession(7, kTelephony, {{"HostApplicationDisplayID", "net.example.player"}});
    startSession(8, kHaptics);
    client().sendMessage({{"frames", 480}, {"list", QVArray{1, 2.0, "x"}}}, {7});
    client().sendMessage({{"EngineOnTime", 5}}, {8}, kRoutingError, kStop);
    client().sendMessage({{"frames", 960}}, {7});
    client().stop(7);
    client().stop(8);
    expectStored("SELECT id FROM beacon_session WHERE flushed_at IS NOT NULL", 2);
  }
  // A property of each event, in their order.
  static std::vector<std::string> property(const std::vector<QVValue>& events, const char* key) {
    std::vector<std::string> texts;
    for (const QVValue& event : events) texts.push_back(QVText(at(event, {key})));
    return texts;
  }
  std::vector<std::string> frames(Arguments arguments) const {
    arguments.insert(arguments.begin(), "events");
    arguments.insert(arguments.end(), {"--kind", "message"});
    std::vector<std::string> texts;
    for (const QVValue& event : jsonLines(arguments)) {
      const QVValue number = at(event, {"payload", "frames"});
      if (number.kind() == QVValue::Kind::integer) texts.push_back(QVText(number));
    }
    return texts;
  }
  // What lies in the store's directory.
  std::set<std::string> stateFiles() const {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(root_.state())) {
      names.insert(entry.path().filename().string());
    }
    return names;
  }
  void execute(const std::string& statement) const {
    sqlite3* store = nullptr;
    ASSERT_EQ(::sqlite3_open(root_.store().c_str(), &store), SQLITE_OK);
    EXPECT_EQ(::sqlite3_exec(store, statement.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
        << ::sqlite3_errmsg(store);
    ::sqlite3_close(store);
  }
};

TEST_F(QVToolEventsTest, SayThatThereIsNoStore) {
  const Output output = qvctl({"events"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr(root_.store().string()));
  EXPECT_THAT(stateFiles(), IsEmpty());
}

TEST_F(QVToolEventsTest, ShowWhatTheStoreHasKept) {
  fillStore();
  const auto events = jsonLines({"events"});
  // Messages are stored on the way of their session, which others may overtake.
  EXPECT_THAT(
      property(events, "kind"),
      UnorderedElementsAre("start", "start", "message", "message", "message", "message", "message",
                           "analytics", "analytics", "analytics", "energy", "stop", "stop"));
  const auto messages = jsonLines({"events", "--kind", "message", "--session", "7"});
  ASSERT_THAT(messages, SizeIs(3));
  const QVValue& message = messages[0];
  EXPECT_EQ(at(message, {"session"}), QVValue(7));
  EXPECT_EQ(at(message, {"service"}), QVValue("telephony"));
  EXPECT_EQ(at(message, {"serviceType"}), QVValue(kTelephony));
  EXPECT_EQ(at(message, {"category"}), QVValue(3));
  EXPECT_EQ(at(message, {"categoryName"}), QVValue("Playback"));
  EXPECT_EQ(at(message, {"type"}), QVValue(1));
  EXPECT_EQ(at(message, {"typeName"}), QVValue("Start"));
  EXPECT_EQ(at(message, {"payload"}),
            QVValue(QVDictionary{{"frames", 480}, {"list", QVArray{1, 2.0, "x"}}}));
  EXPECT_THAT(std::string(at(message, {"time"}).string()),
              MatchesRegex("20[0-9-]+T[0-9:]+\\.[0-9]{6}Z"));
  const auto starts = jsonLines({"events", "--kind", "start", "--session", "7"});
  ASSERT_THAT(starts, SizeIs(1));
  EXPECT_EQ(at(starts[0], {"userInfo", "HostApplicationDisplayID"}), QVValue("net.example.player"));
}

TEST_F(QVToolEventsTest, AreInTheOrderOfTime) {
  fillStore();
  std::string last;
  for (const QVValue& event : jsonLines({"events"})) {
    const std::string time(at(event, {"time"}).string());
    EXPECT_LE(last, time);
    last = time;
  }
}

TEST_F(QVToolEventsTest, AreFiltered) {
  fillStore();
  EXPECT_THAT(frames({}), ElementsAre("480", "960"));
  EXPECT_THAT(frames({"--session", "7"}), ElementsAre("480", "960"));
  EXPECT_THAT(frames({"--session", "8"}), IsEmpty());
  EXPECT_THAT(frames({"--session", "8,7"}), ElementsAre("480", "960"));
  EXPECT_THAT(frames({"--service", "telephony"}), ElementsAre("480", "960"));
  EXPECT_THAT(frames({"--service", "3,4711"}), IsEmpty());
  EXPECT_THAT(frames({"--category", "playback"}), ElementsAre("480", "960"));
  EXPECT_THAT(frames({"--category", "Session.Playback", "--type", "Start"}), SizeIs(2));
  EXPECT_THAT(frames({"--category", "Error"}), IsEmpty());
  EXPECT_THAT(frames({"--type", "2"}), IsEmpty());
  EXPECT_THAT(frames({"--session", "7", "--last", "2"}), ElementsAre("960"));
  EXPECT_THAT(frames({"--last", "0"}), IsEmpty());
  EXPECT_THAT(frames({"--since", "1h", "--until", "now"}), SizeIs(2));
  EXPECT_THAT(frames({"--since", "2999-01-01"}), IsEmpty());
  EXPECT_THAT(frames({"--until", "1h"}), IsEmpty());
}

TEST_F(QVToolEventsTest, OfAnalyticsHaveAWholeCategoryAndAName) {
  fillStore();
  const auto routing = jsonLines({"events", "--category", "Routing", "--kind", "analytics"});
  ASSERT_THAT(routing, SizeIs(1));
  EXPECT_EQ(at(routing[0], {"category"}), QVValue(kRoutingError));
  EXPECT_EQ(at(routing[0], {"categoryName"}), QVValue("Routing.Error"));
  EXPECT_EQ(at(routing[0], {"name"}), QVValue("net.quillon.quietvox.Routing_Error.Stop"));
  EXPECT_THAT(jsonLines({"events", "--name", "*.routing_error.*"}), SizeIs(1));
  EXPECT_THAT(jsonLines({"events", "--name", "Vidra_Haptics"}), SizeIs(1));
  EXPECT_THAT(jsonLines({"events", "--name", "Vidra"}), IsEmpty());
}

TEST_F(QVToolEventsTest, AreShownOnATerminal) {
  fillStore();
  const std::string shown = show({"events"});
  EXPECT_THAT(shown, AllOf(HasSubstr("TIME"), HasSubstr("telephony"), HasSubstr("Routing.Error"),
                           HasSubstr("\033[32mstart\033[0m")));
  // Longer lines are cut.
  EXPECT_THAT(shown, HasSubstr("…\r\n"));
  EXPECT_THAT(show({"events", "--full"}), Not(HasSubstr("…")));
}

TEST_F(QVToolEventsTest, AreShownWithTheTimeOfDayOnANarrowTerminal) {
  fillStore();
  auto all = environment();
  all["TERM"] = "dumb";
  QVTerminal shown(
      {.arguments = command({"events", "--kind", "message", "--session", "7", "--last", "2"}),
       .environment = all,
       .columns = 80});
  ASSERT_EQ(shown.wait(), 0);
  EXPECT_THAT(shown.shown(), Not(HasSubstr("SERVICE")));
  EXPECT_THAT(shown.shown(), MatchesRegex("TIME[^\n]*\n20[0-9-]+\r\n"
                                          "[0-9:]+\\.[0-9]+  message[^\n]*\n"
                                          "[0-9:]+\\.[0-9]+  message[^\n]*\n"));
}

TEST_F(QVToolEventsTest, CannotDoAnythingToATerminal) {
  fillStore();
  endService();
  execute(
      "UPDATE beacon_message SET payload = char(27) || '[2J' || char(155) || char(10) || 'x', "
      "service_name = char(8238) WHERE id = 1");
  const std::string shown = show({"events", "--kind", "message", "--full"}, {{"NO_COLOR", "1"}});
  EXPECT_THAT(shown, AllOf(HasSubstr("\\x1B[2J\\u009B\\nx"), HasSubstr("\\u202E")));
  EXPECT_THAT(shown, AllOf(Not(HasSubstr("\033")), Not(HasSubstr("\xC2\x9B"))));
  const std::string lines = show({"events", "--kind", "message", "--json"});
  EXPECT_THAT(lines, AllOf(Not(HasSubstr("\033")), Not(HasSubstr("\xC2\x9B"))));
  const auto values = parseLines(run({"events", "--kind", "message", "--json"}));
  EXPECT_EQ(at(values[0], {"payload"}), QVValue("\033[2J\xC2\x9B\nx"));
}

TEST_F(QVToolEventsTest, AreReadWithoutAChangeInTheStoresDirectory) {
  fillStore();
  const auto whileItRuns = stateFiles();
  EXPECT_THAT(whileItRuns, Contains("reporting.db-wal"));
  EXPECT_THAT(jsonLines({"events", "--kind", "start"}), SizeIs(2));
  EXPECT_EQ(stateFiles(), whileItRuns);
  endService();
  EXPECT_THAT(stateFiles(), ElementsAre("reporting.db"));
  EXPECT_THAT(jsonLines({"events", "--kind", "start"}), SizeIs(2));
  EXPECT_THAT(stateFiles(), ElementsAre("reporting.db"));
}

TEST_F(QVToolEventsTest, AreReadAfterAKilledService) {
  fillStore();
  service().signal(SIGKILL);
  ASSERT_EQ(service().wait(), -SIGKILL);
  const auto left = stateFiles();
  EXPECT_THAT(jsonLines({"events", "--kind", "start"}), SizeIs(2));
  EXPECT_EQ(stateFiles(), left);
  client_.reset();
  forgetService();
  // The next service takes up where it ended.
  startSession(9, kAPIUsage);
  expectStored("SELECT id FROM beacon_session", 3);
  EXPECT_THAT(jsonLines({"events", "--kind", "start"}), SizeIs(3));
}

TEST_F(QVToolEventsTest, AreNotForWhoMayNotReadThem) {
  fillStore();
  endService();
  std::filesystem::permissions(root_.store(), std::filesystem::perms(0));
  const Output output = qvctl({"events"}, withoutPrivilege());
  EXPECT_EQ(output.status, 4);
  EXPECT_THAT(output.error, AllOf(HasSubstr(root_.store().string()), HasSubstr("ermission")));
  std::filesystem::permissions(root_.store(), std::filesystem::perms(0600));
}

TEST_F(QVToolEventsTest, OfALaterVersionAreRefused) {
  fillStore();
  endService();
  execute("PRAGMA user_version = 99");
  const Output output = qvctl({"events"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr("99"));
}

TEST_F(QVToolEventsTest, ThatWereLostAreShown) {
  fillStore();
  endService();
  execute("INSERT INTO loss(at, cause, count) VALUES(1, 'store_full', 12)");
  const auto losses = jsonLines({"events", "--kind", "loss"});
  ASSERT_THAT(losses, SizeIs(1));
  EXPECT_EQ(at(losses[0], {"cause"}), QVValue("store_full"));
  EXPECT_EQ(at(losses[0], {"count"}), QVValue(12));
  EXPECT_THAT(run({"events", "--kind", "loss"}), HasSubstr("12 lost: store_full"));
  const Output status = qvctl({"status", "--json"});
  EXPECT_EQ(at(parseLines(status.out)[0], {"store", "losses", "store_full"}), QVValue(12));
}

TEST_F(QVToolEventsTest, MayHaveTheLargestNumbers) {
  fillStore();
  endService();
  execute(
      "INSERT INTO beacon_session(id, opened_at, session_id, user_info, flushed_at) "
      "VALUES(9223372036854775807, 9223372036854775807, 9, '{}', 9223372036854775807),"
      "(-9223372036854775807, -9223372036854775807, 9, '{}', NULL);"
      "INSERT INTO beacon_message(id, sent_at, session_id, service_name, category, type, payload) "
      "VALUES(9223372036854775807, 1, 9, 'telephony', 3, 1, '{}')");
  const Arguments kinds{"--kind", "start,stop,message", "--session", "9"};
  const auto kindsOf = [&](Arguments arguments) {
    arguments.insert(arguments.end(), kinds.begin(), kinds.end());
    return property(jsonLines(arguments), "kind");
  };
  EXPECT_THAT(kindsOf({"events"}), ElementsAre("start", "message", "start", "stop"));
  EXPECT_THAT(kindsOf({"events", "--last", "3"}), ElementsAre("message", "start", "stop"));
  EXPECT_THAT(kindsOf({"watch", "--since", "@0", "--for", "0"}),
              ElementsAre("message", "start", "stop"));
}

TEST_F(QVToolEventsTest, HaveNoCategoryOrTypeThatNoneCanBe) {
  fillStore();
  endService();
  execute(
      "INSERT INTO beacon_message(sent_at, session_id, service_name, category, type, payload) "
      "VALUES(1, 9, 'telephony', 99999999999, -1, '{}'), (2, 9, 'telephony', NULL, NULL, '{}'), "
      "(3, 9, 'telephony', 3, 1, '{}')");
  const auto events = jsonLines({"events", "--session", "9"});
  ASSERT_EQ(events.size(), 3U);
  for (const char* const key : {"category", "categoryName", "type", "typeName"}) {
    for (std::size_t i = 0; i < events.size(); ++i) {
      EXPECT_EQ(events[i].dictionary().contains(key), i == 2) << key << " of event " << i;
    }
  }
}

TEST_F(QVToolEventsTest, ThatWereLostMayBeMoreThanANumberHolds) {
  fillStore();
  endService();
  execute(
      "INSERT INTO loss(at, cause, count) VALUES(1, 'store_full', 9223372036854775807), "
      "(2, 'store_full', 9223372036854775807)");
  const Output status = qvctl({"status", "--json"});
  EXPECT_EQ(at(parseLines(status.out)[0], {"store", "losses", "store_full"}),
            QVValue(std::numeric_limits<int64_t>::max()));
}

TEST_F(QVToolEventsTest, EndQuietlyWhereTheReaderGoesAway) {
  fillStore();
  endService();
  // More than a pipe holds.
  execute(
      "WITH RECURSIVE n(i) AS (VALUES(1) UNION ALL SELECT i + 1 FROM n WHERE i < 20000) "
      "INSERT INTO beacon_message(sent_at, session_id, service_name, category, type, payload) "
      "SELECT i, 7, 'telephony', 3, 1, '{\"frames\":480}' FROM n");
  const std::string tool = QVDaemonProcess::program("qvctl").string();
  QVSubprocess shell(
      {.arguments = {"bash", "-c", "set -o pipefail; \"$0\" events | head -n 2; echo status $?",
                     tool},
       .environment = environment(),
       .standardOutputFile = root_.path() / "out",
       .standardErrorFile = root_.path() / "out"});
  EXPECT_EQ(shell.wait(std::chrono::seconds(60)), 0);
  std::ifstream stream(root_.path() / "out");
  const std::string text{std::istreambuf_iterator<char>(stream), {}};
  EXPECT_THAT(text, AllOf(StartsWith("TIME"), HasSubstr("\nstatus 0\n")));
  EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 3);
}

class QVToolWatchTest : public QVToolEventsTest {};

TEST_F(QVToolWatchTest, ShowsWhatReachesTheStore) {
  service();
  const auto watch = terminal({"watch", "--kind", "start,message,stop"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  startSession(7, kTelephony);
  ASSERT_TRUE(watch->await("start"));
  client().sendMessage({{"frames", 480}}, {7});
  ASSERT_TRUE(watch->await("{\"frames\":480}"));
  client().stop(7);
  ASSERT_TRUE(watch->await("Summary"));
  ASSERT_TRUE(watch->await("stop"));
  watch->type("\x03");
  EXPECT_EQ(watch->wait(), 0);
}

TEST_F(QVToolWatchTest, BeginsBeforeThereIsAStoreAndEndsAfterSoMany) {
  const auto watch = terminal({"watch", "--kind", "message", "--count", "2"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  startSession(7, kTelephony);
  for (int i = 1; i <= 3; ++i) client().sendMessage({{"frames", 100 + i}}, {7});
  EXPECT_EQ(watch->wait(), 0);
  EXPECT_THAT(watch->shown(), AllOf(HasSubstr("101"), HasSubstr("102"), Not(HasSubstr("103"))));
}

TEST_F(QVToolWatchTest, ShowsASessionThatWasStartedBeforeIt) {
  startSession(7, kTelephony);
  expectStored("SELECT id FROM beacon_session", 1);
  const auto watch =
      terminal({"watch", "--json", "--kind", "stop", "--since", "1h", "--count", "1"});
  client().stop(7);
  EXPECT_EQ(watch->wait(), 0);
  const auto events = parseLines(watch->shown());
  ASSERT_THAT(events, SizeIs(1));
  EXPECT_EQ(at(events[0], {"session"}), QVValue(7));
}

TEST_F(QVToolWatchTest, LeavesOutSessionsThatHaveStoppedBeforeIt) {
  startSession(6, kTelephony);
  expectStored("SELECT id FROM beacon_session", 1);
  startSession(7, kTelephony);
  client().stop(7);
  expectStored("SELECT id FROM beacon_session WHERE flushed_at IS NOT NULL", 1);
  const auto watch = terminal({"watch", "--kind", "stop", "--count", "1"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  client().stop(6);
  EXPECT_EQ(watch->wait(), 0);
  EXPECT_THAT(watch->shown(), HasSubstr("    6  telephony"));
}

TEST_F(QVToolWatchTest, BeginsWithWhatHasComeBefore) {
  fillStore();
  const auto events =
      jsonLines({"watch", "--since", "1h", "--kind", "message", "--session", "7", "--count", "2"});
  EXPECT_THAT(property(events, "session"), ElementsAre("7", "7"));
}

TEST_F(QVToolWatchTest, GoesOnWithTheNextService) {
  fillStore();
  const auto watch = terminal({"watch", "--kind", "message", "--count", "1"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  client_.reset();
  endService();
  forgetService();
  startSession(9, kTelephony);
  client().sendMessage({{"frames", 4711}}, {9});
  EXPECT_EQ(watch->wait(), 0);
  EXPECT_THAT(watch->shown(), HasSubstr("4711"));
}

TEST_F(QVToolWatchTest, GoesOnWithAnotherStore) {
  fillStore();
  client_.reset();
  endService();
  forgetService();
  const auto watch = terminal({"watch", "--kind", "message", "--count", "1"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  // As after damage: the numbers of its rows begin anew.
  std::filesystem::rename(root_.store(), root_.state() / "reporting.db.corrupt-1");
  startSession(9, kTelephony);
  client().sendMessage({{"frames", 4711}}, {9});
  EXPECT_EQ(watch->wait(), 0);
  EXPECT_THAT(watch->shown(), HasSubstr("4711"));
}

TEST_F(QVToolWatchTest, ShowsStopsInAStoreThatWasEmptied) {
  fillStore();
  client_.reset();
  endService();
  const auto watch = terminal({"watch", "--kind", "stop", "--count", "1"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  // As the service does it to keep the store within its limit: the numbers of the rows begin anew.
  execute(
      "BEGIN; DELETE FROM beacon_session; "
      "INSERT INTO beacon_session(opened_at, flushed_at, session_id, user_info) "
      "VALUES(1, 2, 4711, '{}'); COMMIT");
  EXPECT_EQ(watch->wait(), 0);
  EXPECT_THAT(watch->shown(), HasSubstr("4711"));
}

TEST_F(QVToolWatchTest, EndsAfterItsTime) {
  EXPECT_EQ(run({"watch", "--for", "20ms", "--json"}), "");
}

TEST_F(QVToolWatchTest, EndsWhenItIsAskedTo) {
  const auto watch = terminal({"watch"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  watch->signal(SIGTERM);
  EXPECT_EQ(watch->wait(), 0);
}

TEST_F(QVToolWatchTest, EndsQuietlyWhereTheReaderGoesAway) {
  const std::string tool = QVDaemonProcess::program("qvctl").string();
  // Nothing reaches the store: it has to notice by itself.
  const auto shell = std::make_unique<QVSubprocess>(QVSubprocess::Options{
      .arguments = {"bash", "-c", "set -o pipefail; \"$0\" watch | head -n 1", tool},
      .environment = environment(),
      .standardOutputFile = root_.path() / "out",
      .standardErrorFile = root_.path() / "out"});
  EXPECT_EQ(shell->wait(std::chrono::seconds(60)), 0);
}

// A pipe that is open and that nobody reads, in the place of watch's output.
class QVToolStuckWatchTest : public QVToolWatchTest {
 protected:
  // A store with more than the pipe holds.
  void fillPipesStore() {
    fillStore();
    endService();
    execute(
        "WITH RECURSIVE n(i) AS (VALUES(1) UNION ALL SELECT i + 1 FROM n WHERE i < 20000) "
        "INSERT INTO beacon_message(sent_at, session_id, service_name, category, type, payload) "
        "SELECT i, 7, 'telephony', 3, 1, '{\"frames\":480}' FROM n");
  }
  // watch, which prints all that there is.
  std::unique_ptr<QVSubprocess> watch(const Arguments& options = {}) {
    // A new one, with nothing in it.
    std::filesystem::remove(pipe_);
    EXPECT_EQ(::mkfifo(pipe_.c_str(), 0600), 0);
    reader_ = QVDescriptor(::open(pipe_.c_str(), O_RDWR | O_CLOEXEC));
    Arguments arguments{"watch", "--since", "@0", "--json"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    return std::make_unique<QVSubprocess>(QVSubprocess::Options{.arguments = command(arguments),
                                                                .environment = environment(),
                                                                .standardOutputFile = pipe_});
  }
  // Until it has begun to print.
  void awaitOutput() const {
    pollfd entry{reader_.get(), POLLIN, 0};
    EXPECT_EQ(::poll(&entry, 1, 60'000), 1);
  }

 private:
  const std::string pipe_ = root_.path() / "pipe";
  QVDescriptor reader_;
};

TEST_F(QVToolStuckWatchTest, EndsWhenItIsAskedToWhileNobodyReads) {
  fillPipesStore();
  for (const int number : {SIGINT, SIGTERM, SIGHUP}) {
    const auto process = watch();
    awaitOutput();
    process->signal(number);
    EXPECT_EQ(process->wait(std::chrono::seconds(60)), 0) << number;
  }
}

TEST_F(QVToolStuckWatchTest, EndsAfterItsTimeWhileNobodyReads) {
  fillPipesStore();
  EXPECT_EQ(watch({"--for", "500ms"})->wait(std::chrono::seconds(60)), 0);
}

TEST_F(QVToolWatchTest, EndsAfterItsTimeWhileTheStoreIsLocked) {
  fillStore();
  endService();
  sqlite3* holder = nullptr;
  ASSERT_EQ(::sqlite3_open(root_.store().c_str(), &holder), SQLITE_OK);
  EXPECT_EQ(::sqlite3_exec(holder,
                           "PRAGMA locking_mode = EXCLUSIVE; "
                           "INSERT INTO loss(at, cause, count) VALUES(1, 'x', 1)",
                           nullptr, nullptr, nullptr),
            SQLITE_OK);
  EXPECT_EQ(run({"watch", "--since", "@0", "--for", "20ms", "--json"}), "");
  ::sqlite3_close(holder);
}

TEST_F(QVToolWatchTest, LeavesIgnoredSignalsIgnored) {
  fillStore();
  client_.reset();
  endService();
  QVTerminal watch(
      {.arguments = {"sh", "-c", "trap '' HUP INT; exec \"$0\" watch --kind message --count 1",
                     QVDaemonProcess::program("qvctl").string()},
       .environment = environment()});
  ASSERT_TRUE(watch.await("CONTENTS"));
  watch.signal(SIGHUP);
  watch.signal(SIGINT);
  execute(
      "INSERT INTO beacon_message(sent_at, session_id, service_name, category, type, payload) "
      "VALUES(1, 7, 'telephony', 3, 1, '{\"frames\":4711}')");
  EXPECT_EQ(watch.wait(), 0);
  EXPECT_THAT(watch.shown(), HasSubstr("4711"));
}

TEST_F(QVToolWatchTest, BeginsWithAllStopsThatHaveComeBefore) {
  fillStore();
  endService();
  execute(
      "WITH RECURSIVE n(i) AS (VALUES(1) UNION ALL SELECT i + 1 FROM n WHERE i < 6000) "
      "INSERT INTO beacon_session(opened_at, session_id, user_info, flushed_at) "
      "SELECT i, i, '{}', 10000 - i FROM n");
  const Arguments options{"--kind", "stop", "--since", "@0", "--json"};
  Arguments all{"events"};
  all.insert(all.end(), options.begin(), options.end());
  Arguments watch{"watch", "--for", "0"};
  watch.insert(watch.end(), options.begin(), options.end());
  const std::string shown = run(watch);
  EXPECT_EQ(std::count(shown.begin(), shown.end(), '\n'), 6002);
  EXPECT_EQ(shown, run(all));
}

TEST_F(QVToolWatchTest, SaysThatEventsMayHaveBeenMissed) {
  fillStore();
  client_.reset();
  endService();
  const auto watch = terminal({"watch", "--kind", "message"});
  ASSERT_TRUE(watch->await("CONTENTS"));
  execute(
      "INSERT INTO beacon_message(sent_at, session_id, service_name, category, type, payload) "
      "VALUES(1, 7, 'telephony', 3, 1, '{\"frames\":4711}')");
  ASSERT_TRUE(watch->await("4711"));
  execute("DELETE FROM beacon_message");
  ASSERT_TRUE(watch->await("may have been missed"));
  watch->type("\x03");
  EXPECT_EQ(watch->wait(), 0);
}

TEST_F(QVToolWatchTest, SaysThatThereIsNothingToWatch) {
  const Output output = qvctl({"watch", "--root", root_.path() / "state"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr((root_.path() / "state/var/lib/quietvox").string()));
}

}  // namespace
