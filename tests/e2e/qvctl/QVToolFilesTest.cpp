// qvctl summary and channels: what sessions and drivers leave in files.

#include "tests/e2e/qvctl/QVToolTest.h"
#include "tests/support/QVDriverProcess.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr uint16_t kTelephony = 2;

// A summary that does not fit into the memory that reading it may take.
constexpr std::size_t kLargeFileBytes = std::size_t{32} << 20;

class QVToolFilesTest : public QVToolTest {
 protected:
  QVToolFilesTest() {
    root_.configure("device.json", R"({"InternalBuild": true})");
    std::filesystem::create_directory(root_.runtime() / "channels");
  }
  std::filesystem::path directory() const {
    return root_.logs() / "DiagnosticLogs" / "Audio" / "Reporting";
  }
  void leaveSummary() {
    startSession(7, kTelephony, {{"HostApplicationDisplayID", "net.example.player"}});
    for (int i = 1; i <= 5; ++i) client().sendMessage({{"frames", i * 480}, {"on", true}}, {7});
    client().sendMessage({{"load", 0.5}, {"route", "speaker"}}, {7});
    client().stop(7);
  }
};

TEST_F(QVToolFilesTest, ListsSummaries) {
  EXPECT_EQ(json({"summary", "list"}), QVValue(QVArray{}));
  leaveSummary();
  const QVValue files = json({"summary", "list"});
  ASSERT_EQ(files.array().size(), 1U);
  EXPECT_EQ(at(files.array()[0], {"service"}), QVValue("telephony"));
  EXPECT_EQ(at(files.array()[0], {"application"}), QVValue("net.example.player"));
  EXPECT_GT(at(files.array()[0], {"bytes"}).integerValue(), 0);
  EXPECT_THAT(show({"summary", "list"}),
              AllOf(HasSubstr("STOPPED"), HasSubstr("net.example.player")));
}

TEST_F(QVToolFilesTest, ListsTheLatestSummaryFirst) {
  std::filesystem::create_directories(directory());
  const auto now = std::filesystem::file_time_type::clock::now();
  // Written in another order than the sessions stopped, as copied files are.
  const auto leave = [&](const std::string& date, const std::string& application, int age) {
    const auto file = directory() / (date + "-quietvox-" + application + "-telephony.json");
    std::ofstream(file) << "[{}]";
    std::filesystem::last_write_time(file, now - std::chrono::hours(age));
  };
  leave("20261116-061300+0000", "second", 1);
  leave("20261116-070000+0100", "third", 2);
  leave("20261116-031300-0800", "first", 3);
  leave("20261340-061300+0000", "undated", 0);
  const QVArray files = json({"summary", "list"}).array();
  ASSERT_EQ(files.size(), 4U);
  // What says no date is as old as the file.
  std::vector<std::string> found;
  for (const QVValue& file : files) {
    found.emplace_back(at(file, {"application"}).string());
  }
  std::erase(found, "undated");
  EXPECT_THAT(found, ElementsAre("first", "second", "third"));
  for (const QVValue& file : files) {
    EXPECT_THAT(std::string(at(file, {"date"}).string()),
                MatchesRegex("20[0-9-]+T[0-9:]+\\.[0-9]{6}Z"));
    if (at(file, {"application"}) == QVValue("third")) {
      EXPECT_EQ(at(file, {"date"}), QVValue("2026-11-16T06:00:00.000000Z"));
    }
  }
  EXPECT_THAT(run({"summary", "list"}), HasSubstr("2026-11-16 11:13:00  telephony  first"));
}

TEST_F(QVToolFilesTest, PrintsASummary) {
  leaveSummary();
  const QVValue contents = json({"summary", "show"});
  ASSERT_EQ(contents.array().size(), 8U);
  EXPECT_EQ(at(contents.array()[1], {"Session_Playback_Start_1", "frames"}), QVValue(480));
  const std::string name =
      std::filesystem::path(
          std::string(at(json({"summary", "list"}).array()[0], {"file"}).string()))
          .filename();
  for (const std::string& word : {std::string("1"), name, (directory() / name).string()}) {
    EXPECT_EQ(json({"summary", "show", word}), contents) << word;
  }
  EXPECT_THAT(show({"summary", "show"}), HasSubstr("    \"Session_Playback_Start_1\": {\r\n"));
}

TEST_F(QVToolFilesTest, SaysThatThereIsNoSuchSummary) {
  for (const Arguments& arguments : {Arguments{"summary", "show"},
                                     {"summary", "show", "2"},
                                     {"summary", "plot", "nothing"},
                                     {"summary", "open", "/nowhere/file"}}) {
    EXPECT_EQ(qvctl(arguments).status, 1) << testing::PrintToString(arguments);
  }
}

TEST_F(QVToolFilesTest, SaysWhoLeavesSummaries) {
  for (const Arguments& arguments : {Arguments{"summary", "show"},
                                     {"summary", "show", "--json"},
                                     {"summary", "show", "2"},
                                     {"summary", "plot"},
                                     {"summary", "plot", "name"},
                                     {"summary", "open"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 1) << testing::PrintToString(arguments);
    EXPECT_THAT(output.error, AllOf(HasSubstr("no summaries in " + directory().string()),
                                    HasSubstr("internal build")));
  }
  leaveSummary();
  EXPECT_THAT(qvctl({"summary", "show", "2"}).error, HasSubstr("no summary 2: there is 1"));
}

TEST_F(QVToolFilesTest, TakesLittleMemoryForALargeSummary) {
  const auto file = root_.path() / "large.json";
  {
    std::ofstream stream(file);
    stream << "[\n  {\n    \"rate\": 48000\n  }";
    for (int i = 1; i <= 400'000; ++i) {
      stream << ",\n  {\n    \"Session_Playback_Start_" << i << "\": {\n      \"frames\": " << i
             << ",\n      \"load\": 0.25\n    }\n  }";
    }
    stream << "\n]\n";
  }
  ASSERT_GT(std::filesystem::file_size(file), kLargeFileBytes);
  // Less than the file has, with everything that a program maps.
  const Arguments limited =
      kMemoryTells ? Arguments{"prlimit", "--as=" + std::to_string(kLargeFileBytes)} : Arguments{};
  const Output shown = qvctl({"summary", "show", file}, limited);
  EXPECT_EQ(shown.status, 0) << shown.error;
  EXPECT_EQ(shown.out.size(), std::filesystem::file_size(file));
  const Output compact = qvctl({"summary", "show", file, "--json"}, limited);
  EXPECT_EQ(compact.status, 0) << compact.error;
  EXPECT_THAT(compact.out,
              StartsWith(R"([{"rate":48000},{"Session_Playback_Start_1":{"frames":1,)"));
  const Output drawn = qvctl({"summary", "plot", file}, limited);
  EXPECT_EQ(drawn.status, 0) << drawn.error;
  EXPECT_THAT(drawn.out, HasSubstr("frames  400000 of 400000 messages, last 400000"));
}

TEST_F(QVToolFilesTest, ShowsASummaryAsItStandsButWhatOverwritesALine) {
  const auto file = root_.path() / "file.json";
  std::ofstream(file) << "[\r\n\t{\"name\":\t\"a\\tb\"}\r]\n";
  EXPECT_EQ(run({"summary", "show", file}), "[\n\t{\"name\":\t\"a\\tb\"}]\n");
}

TEST_F(QVToolFilesTest, SaysThatASummaryIsBroken) {
  const auto file = root_.path() / "file.json";
  std::ofstream(file) << "[{},\n{]";
  const Output output = qvctl({"summary", "show", file});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr("line 2"));
  EXPECT_EQ(output.out, "");
}

TEST_F(QVToolFilesTest, OpensASummaryInAnotherProgram) {
  leaveSummary();
  const std::string shown = show(
      {"summary", "open"}, {{"PAGER", "grep -c frames"}, {"DISPLAY", ""}, {"WAYLAND_DISPLAY", ""}});
  EXPECT_EQ(shown, "6\r\n");
}

TEST_F(QVToolFilesTest, DrawsNumbersOverMessages) {
  leaveSummary();
  EXPECT_EQ(json({"summary", "plot", "--key", "frames"}),
            QVValue(QVDictionary{
                {"file", at(json({"summary", "list"}).array()[0], {"file"})},
                {"messages", 6},
                {"columns",
                 QVDictionary{{"frames", QVDictionary{{"messages", QVArray{1, 2, 3, 4, 5}},
                                                      {"values", QVArray{480.0, 960.0, 1440.0,
                                                                         1920.0, 2400.0}}}}}}}));
  EXPECT_THAT(
      show({"summary", "plot"}),
      AllOf(HasSubstr("frames\033[0m  5 of 6 messages, last 2400"), HasSubstr("2400 |"),
            HasSubstr("load"), HasSubstr("on"), HasSubstr("\xE2\xA0"), Not(HasSubstr("route"))));
  const std::string ascii =
      show({"summary", "plot", "--ascii", "--height", "3", "--width", "25", "--key", "fra*"},
           {{"NO_COLOR", "1"}});
  EXPECT_THAT(ascii, HasSubstr("         2400 |      **\r\n"
                               "              |   ***\r\n"
                               "          480 |***\r\n"));
  EXPECT_THAT(show({"summary", "plot"}, {{"LC_ALL", "C"}}), Not(HasSubstr("\xE2\xA0")));
  for (const Arguments& arguments : {Arguments{"summary", "plot", "--key", "route"},
                                     {"summary", "plot", "--key", "route", "--json"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 1);
    EXPECT_EQ(output.out, "");
    EXPECT_THAT(output.error, AllOf(HasSubstr("\"route\""), HasSubstr("frames, load, on")));
  }
}

TEST_F(QVToolFilesTest, KeepsRowsOfLongNumbersInLine) {
  const auto file = root_.path() / "file.json";
  std::ofstream(file) << R"([{}, {"a": {"gain": 89.99999751842225}},
      {"b": {"gain": -1.7976931348623157e+308}}, {"c": {"gain": 0.1234567890123456}},
      {"d": {"level": 89.99999751842225}}])";
  constexpr std::size_t kWidth = 40;
  std::istringstream lines(run(
      {"summary", "plot", file, "--width", std::to_string(kWidth), "--ascii", "--height", "5"}));
  std::size_t rows = 0;
  std::set<std::size_t> bars;
  for (std::string line; std::getline(lines, line);) {
    const std::size_t bar = line.find(" |");
    if (bar == std::string::npos) continue;
    ++rows;
    bars.insert(bar);
    EXPECT_LE(line.size(), kWidth) << line;
  }
  EXPECT_EQ(rows, 10U);
  EXPECT_THAT(bars, SizeIs(1));
}

TEST_F(QVToolFilesTest, ShowsWhatDriversPublish) {
  QVDriverProcess driver(root_.runtime() / "channels/Speaker",
                         {"--subgroup", "pcm0p", "--channel", "frames", "--step", "480"});
  std::ofstream(root_.path() / "status") << "state: RUNNING\nhw_ptr : 4096\n";
  root_.configure("channels.json", R"([{"group": "Kernel", "file": ")" +
                                       (root_.path() / "status").string() + R"("}])");
  EXPECT_EQ(at(json({"channels"}), {"unreadable"}), QVValue(QVArray{}));
  const QVValue channels = at(json({"channels"}), {"channels"});
  ASSERT_EQ(channels.array().size(), 2U);
  EXPECT_EQ(channels.array()[0],
            QVValue(QVDictionary{
                {"group", "Speaker"}, {"subgroup", "pcm0p"}, {"channel", "frames"}, {"value", 0}}));
  EXPECT_EQ(
      channels.array()[1],
      QVValue(QVDictionary{
          {"group", "Kernel"}, {"subgroup", QVValue()}, {"channel", "hw_ptr"}, {"value", 4096}}));
  EXPECT_EQ(at(json({"channels", "--group", "Kernel"}), {"channels"}).array().size(), 1U);
  EXPECT_THAT(show({"channels"}), AllOf(HasSubstr("SUBGROUP"), HasSubstr("Speaker")));
}

TEST_F(QVToolFilesTest, ShowsWhatHasGrown) {
  QVDriverProcess driver(root_.runtime() / "channels/Speaker", {"--channel", "frames"});
  const auto shown = terminal({"channels", "--interval", "50ms"});
  ASSERT_TRUE(shown->await("PER SECOND"));
  ASSERT_TRUE(shown->await("0.0"));
  driver.count();
  ASSERT_TRUE(shown->await("+1"));
  shown->type("\x03");
  EXPECT_EQ(shown->wait(), 0);

  const auto readings = jsonLines({"channels", "--interval", "10ms", "--count", "3"});
  ASSERT_THAT(readings, SizeIs(3));
  EXPECT_TRUE(at(at(readings[0], {"channels"}).array()[0], {"delta"}).isAbsent());
  EXPECT_EQ(at(at(readings[2], {"channels"}).array()[0], {"delta"}), QVValue(0));
}

TEST_F(QVToolFilesTest, GoesOnWithTheOtherDrivers) {
  std::ofstream(root_.runtime() / "channels/Broken") << "no channels";
  QVDriverProcess driver(root_.runtime() / "channels/Speaker", {"--channel", "frames"});
  const std::string missing = (root_.path() / "status").string();
  root_.configure("channels.json", R"([{"group": "Kernel", "file": ")" + missing + R"("}])");
  const Output output = qvctl({"channels", "--json"});
  EXPECT_EQ(output.status, 0);
  const std::string broken = (root_.runtime() / "channels/Broken").string();
  EXPECT_THAT(output.error, AllOf(HasSubstr("qvctl: " + broken + ": not a file of channels\n"),
                                  HasSubstr("qvctl: " + missing + ": No such file")));
  const QVValue reading = parseLines(output.out)[0];
  EXPECT_EQ(at(reading, {"channels"}).array().size(), 1U);
  const QVArray unreadable = at(reading, {"unreadable"}).array();
  ASSERT_EQ(unreadable.size(), 2U);
  EXPECT_EQ(unreadable[0],
            QVValue(QVDictionary{{"path", broken}, {"error", "not a file of channels"}}));
  EXPECT_EQ(at(unreadable[1], {"path"}), QVValue(missing));
}

TEST_F(QVToolFilesTest, SaysOfEachUnreadableFileOnce) {
  std::ofstream(root_.runtime() / "channels/Broken") << "no channels";
  const Output output = qvctl({"channels", "--interval", "10ms", "--count", "3"});
  EXPECT_EQ(output.status, 0);
  EXPECT_EQ(std::count(output.error.begin(), output.error.end(), '\n'), 1) << output.error;
}

TEST_F(QVToolFilesTest, SaysThatTheListOfTheKernelsFilesIsBroken) {
  root_.configure("channels.json", "{\n");
  const Output output = qvctl({"channels", "--json"});
  EXPECT_EQ(output.status, 0);
  const std::string path = (root_.configuration() / "channels.json").string();
  EXPECT_THAT(output.error, AllOf(HasSubstr(path), HasSubstr("line 2")));
  const QVArray unreadable = at(parseLines(output.out)[0], {"unreadable"}).array();
  ASSERT_EQ(unreadable.size(), 1U);
  EXPECT_EQ(at(unreadable[0], {"path"}), QVValue(path));
}

TEST_F(QVToolFilesTest, SaysWhichGroupsThereAre) {
  QVDriverProcess driver(root_.runtime() / "channels/Speaker", {"--channel", "frames"});
  root_.configure("channels.json", R"([{"group": "Kernel", "file": "/proc/version"}])");
  for (const Arguments& arguments :
       {Arguments{"channels", "--group", "nope"},
        {"channels", "--group", "nope", "--json"},
        {"channels", "--group", "nope", "--interval", "10ms", "--count", "1"}}) {
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 1) << testing::PrintToString(arguments);
    EXPECT_THAT(output.error, AllOf(HasSubstr("\"nope\""), HasSubstr("Kernel, Speaker")));
    EXPECT_EQ(output.out, "");
  }
}

TEST_F(QVToolFilesTest, HasNoChannelsWhereNobodyPublishes) {
  std::filesystem::remove(root_.runtime() / "channels");
  EXPECT_EQ(json({"channels"}),
            QVValue(QVDictionary{{"channels", QVArray{}}, {"unreadable", QVArray{}}}));
  const Output output = qvctl({"channels", "--group", "nope"});
  EXPECT_EQ(output.status, 1);
  EXPECT_THAT(output.error, HasSubstr("nobody publishes"));
}

TEST_F(QVToolFilesTest, DrawsSoManyKeysAndSaysThatThereAreMore) {
  const auto file = root_.path() / "many.json";
  std::ofstream stream(file);
  stream << R"([{},{"7":{)";
  for (int i = 0; i < 300; ++i) stream << (i == 0 ? "" : ",") << "\"k" << 1000 + i << "\":" << i;
  stream << "}}]";
  stream.close();
  for (const Arguments& more : {Arguments{}, {"--json"}}) {
    Arguments arguments{"summary", "plot", file};
    arguments.insert(arguments.end(), more.begin(), more.end());
    const Output output = qvctl(arguments);
    EXPECT_EQ(output.status, 0) << output.error;
    EXPECT_THAT(output.out, AllOf(HasSubstr("k1255"), Not(HasSubstr("k1256"))));
    EXPECT_THAT(output.error, AllOf(HasSubstr("256"), HasSubstr("--key")));
  }
  const Output chosen = qvctl({"summary", "plot", file, "--key", "k1299"});
  EXPECT_THAT(chosen.out, HasSubstr("k1299"));
  EXPECT_EQ(chosen.error, "");
  EXPECT_THAT(qvctl({"summary", "plot", file, "--key", "nope"}).error,
              AllOf(HasSubstr("k1000, k1001"), HasSubstr(", ...")));
}

TEST_F(QVToolFilesTest, CutsLinesAtTheTerminalsWidth) {
  const auto file = root_.path() / (std::string(90, 'f') + ".json");
  std::ofstream(file) << R"([{},{"7":{")" << std::string(90, 'k') << R"(":1}}])";
  auto all = environment();
  all["TERM"] = "dumb";
  for (const Arguments& arguments : {Arguments{"summary", "plot", file}, {"status"}}) {
    QVTerminal shown({.arguments = command(arguments), .environment = all, .columns = 30});
    shown.wait();
    std::istringstream stream(shown.shown());
    for (std::string line; std::getline(stream, line);) {
      // The sign that something is missing takes three bytes and one column.
      EXPECT_LE(line.find_last_not_of('\r') + 1, 32U) << line;
    }
    EXPECT_THAT(shown.shown(), HasSubstr("…"));
  }
}

}  // namespace
