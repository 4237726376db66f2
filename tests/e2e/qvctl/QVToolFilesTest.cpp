// qvctl summary and channels: what sessions and drivers leave in files.

#include "tests/e2e/qvctl/QVToolTest.h"
#include "tests/support/QVDriverProcess.h"

#include <algorithm>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>

namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::SizeIs;

constexpr uint16_t kTelephony = 2;

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
  EXPECT_EQ(qvctl({"summary", "plot", "--key", "route"}).status, 1);
}

TEST_F(QVToolFilesTest, ShowsWhatDriversPublish) {
  QVDriverProcess driver(root_.runtime() / "channels/Speaker",
                         {"--subgroup", "pcm0p", "--channel", "frames", "--step", "480"});
  std::ofstream(root_.path() / "status") << "state: RUNNING\nhw_ptr : 4096\n";
  root_.configure("channels.json", R"([{"group": "Kernel", "file": ")" +
                                       (root_.path() / "status").string() + R"("}])");
  const QVValue channels = json({"channels"});
  ASSERT_EQ(channels.array().size(), 2U);
  EXPECT_EQ(channels.array()[0],
            QVValue(QVDictionary{
                {"group", "Speaker"}, {"subgroup", "pcm0p"}, {"channel", "frames"}, {"value", 0}}));
  EXPECT_EQ(
      channels.array()[1],
      QVValue(QVDictionary{
          {"group", "Kernel"}, {"subgroup", QVValue()}, {"channel", "hw_ptr"}, {"value", 4096}}));
  EXPECT_EQ(json({"channels", "--group", "Kernel"}).array().size(), 1U);
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
  EXPECT_TRUE(at(readings[0].array()[0], {"delta"}).isAbsent());
  EXPECT_EQ(at(readings[2].array()[0], {"delta"}), QVValue(0));
}

TEST_F(QVToolFilesTest, GoesOnWithTheOtherDrivers) {
  std::ofstream(root_.runtime() / "channels/Broken") << "no channels";
  QVDriverProcess driver(root_.runtime() / "channels/Speaker", {"--channel", "frames"});
  const Output output = qvctl({"channels", "--json"});
  EXPECT_EQ(output.status, 0);
  EXPECT_THAT(output.error, HasSubstr("Broken"));
  EXPECT_EQ(parseLines(output.out)[0].array().size(), 1U);
}

TEST_F(QVToolFilesTest, HasNoChannelsWhereNobodyPublishes) {
  std::filesystem::remove(root_.runtime() / "channels");
  EXPECT_EQ(json({"channels"}), QVValue(QVArray{}));
}

}  // namespace
