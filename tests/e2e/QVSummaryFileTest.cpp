// The file that a session leaves on an internal build when it stops.

#include "tests/support/QVDirectoryWatch.h"
#include "tests/support/QVEndToEndTest.h"
#include "tests/support/QVSubprocess.h"

#include <cmath>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>

namespace {

using ::testing::ElementsAreArray;
using ::testing::IsEmpty;
using ::testing::Matcher;
using ::testing::MatchesRegex;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr uint16_t kVoxa = 1;
constexpr uint16_t kTelephony = 2;
constexpr const char* kFunction = "-[QVReportingSession writeSummaryJson]: ";

class QVSummaryFileTest : public QVEndToEndTest {
 protected:
  QVSummaryFileTest() { root_.configure("device.json", R"({"InternalBuild": true})"); }

  std::filesystem::path directory() const {
    return root_.logs() / "DiagnosticLogs" / "Audio" / "Reporting";
  }
  // The service with another place for its logs.
  void startServiceWithLogs(const std::filesystem::path& logs) {
    startService({.environment = {{"LOGS_DIRECTORY", logs.string()}}});
  }
  void runSession(QVPeerClient& client, const QVDictionary& configuration,
                  const QVDictionary& message = {{"a", 1}}) {
    client.create(7, kVoxa);
    client.configure(configuration, 7);
    client.start(7);
    client.sendMessage(message, {7});
    client.stop(7);
  }
  // Everything that lies in the directory, hidden files too.
  std::vector<std::string> names() const {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(directory())) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
  std::filesystem::path onlyFile() const {
    const std::vector<std::string> all = names();
    EXPECT_THAT(all, SizeIs(1));
    return all.empty() ? directory() : directory() / all[0];
  }
  // What a program of another make reads in the file.
  static std::string read(const std::filesystem::path& file, const std::string& expression) {
    return QVSubprocess::run({"/usr/bin/python3", "-c",
                              "import json, sys\nfile = json.load(open(sys.argv[1]))\nprint(" +
                                  expression + ", end='')",
                              file.string()})
        .text;
  }
  static std::string readAll(const std::filesystem::path& file) {
    return read(file, "json.dumps(file, separators=(',', ':'), ensure_ascii=False)");
  }
  // The stop's error lines, in this order and no others, and the stop went on behind them.
  void expectFailures(QVPeerClient& client, const std::vector<Matcher<std::string>>& texts) {
    expectServes(client);
    endService();
    std::vector<std::string> logged;
    for (const std::string& line : log().lines(kFunction)) {
      EXPECT_THAT(line, StartsWith("<3>[qvrr] QVReportingSessionSummary.cpp:"));
      logged.push_back(line.substr(line.find(kFunction) + std::string_view(kFunction).size()));
    }
    EXPECT_THAT(logged, ElementsAreArray(texts));
    EXPECT_EQ(store().number("SELECT count(*) FROM beacon_message WHERE type = 65535"), 1);
    EXPECT_EQ(store().number("SELECT count(*) FROM beacon_session WHERE flushed_at IS NULL"), 0);
  }
};

TEST_F(QVSummaryFileTest, HoldsWhatTheSessionWasSent) {
  auto client = connectClient();
  client.create(7, kTelephony);
  client.configure({{"HostApplicationDisplayID", "net.example.player"}, {"rate", 48000}}, 7);
  client.start(7);
  client.sendMessage({{"buffer size", 512}, {"note", "gr\xC3\xBC\xC3\x9F \"x\"\n"}}, {7});
  client.sendMessage({{"load", 0.25}, {"on", true}, {"list", QVArray{1, "x", 2.0}}}, {7},
                     0x40000007, 0);
  client.sendMessage({{"buffer size", UINT64_MAX}, {"load", 12.0}}, {7});
  client.stop(7);

  EXPECT_THAT(
      onlyFile().filename(),
      MatchesRegex(
          "[0-9]{8}-[0-9]{6}[+-][0-9]{4}-quietvox-net\\.example\\.player-telephony\\.json"));
  EXPECT_EQ(readAll(onlyFile()),
            R"([{"HostApplicationDisplayID":"net.example.player","rate":48000},)"
            R"({"Session_Playback_Start_1":{"buffer_size":512,"note":"grüß \"x\"\n"}},)"
            R"({"Routing_RouteChange_Generic_1":{"list":[1,"x",2.0],"load":0.25,"on":true}},)"
            R"({"Session_Playback_Start_2":{"buffer_size":18446744073709551615,"load":12.0}},)"
            R"({"Undefined_Unknown_1":{"QV_Session_Summary_Event":"2",)"
            R"("buffer_size":"512,18446744073709551615","list":"[1,\"x\",2]","load":"0.25,12",)"
            R"("note":"grüß \"x\"\n","on":"1"}}])");
  EXPECT_THAT(log().lines(kFunction), IsEmpty());
}

TEST_F(QVSummaryFileTest, AppearsWhenItIsWhole) {
  constexpr int kMessages = 5'000;
  std::filesystem::create_directories(directory());
  const QVDirectoryWatch watch(directory());
  auto client = connectClient();
  client.create(7, kVoxa);
  client.start(7);
  // Twenty MB of text: the writing takes a while, and is seen to go on.
  const std::string text(2'000, 'x');
  for (int i = 0; i < kMessages; ++i) client.sendMessage({{"i", i}, {"text", text}}, {7});

  std::string contents;
  {
    const std::jthread stop([&client] { client.stop(7); });
    EXPECT_TRUE(watch.await([this, &contents] {
      for (const std::string& name : names()) {
        if (!name.ends_with(".json")) continue;
        std::ifstream file(directory() / name);
        contents.assign(std::istreambuf_iterator<char>(file), {});
        return true;
      }
      return false;
    }));
  }
  EXPECT_TRUE(contents.ends_with("\n]"));
  EXPECT_EQ(contents.size(), std::filesystem::file_size(onlyFile())) << "whole when first seen";
  EXPECT_EQ(read(onlyFile(),
                 "len(file), list(file[-1]), "
                 "[list(m)[0] for m in file[1:-1]] == "
                 "['Session_Playback_Start_%d' % (i + 1) for i in range(5000)], "
                 "[m[list(m)[0]]['i'] for m in file[1:-1]] == list(range(5000))"),
            "5002 ['Undefined_Unknown_1'] True True");
}

TEST_F(QVSummaryFileTest, IsTheGroupsToReadInDirectoriesThatAreEverybodys) {
  auto client = connectClient();
  runSession(client, {});
  using std::filesystem::perms;
  const auto permissions = [](const std::filesystem::path& path) {
    return std::filesystem::status(path).permissions();
  };
  EXPECT_EQ(permissions(onlyFile()), perms::owner_read | perms::owner_write | perms::group_read);
  EXPECT_EQ(permissions(directory()), perms::all);
  EXPECT_EQ(permissions(root_.logs() / "DiagnosticLogs"), perms::all);
}

TEST_F(QVSummaryFileTest, IsNamedAfterLocalTime) {
  startService({.environment = {{"TZ", "XYZ+3:30"}}});
  auto client = connectClient();
  runSession(client, {});
  EXPECT_THAT(onlyFile().filename(),
              MatchesRegex("[0-9]{8}-[0-9]{6}-0330-quietvox-unknown-voxa\\.json"));
}

TEST_F(QVSummaryFileTest, IsWrittenForSessionsThatTheEndOfTheServiceStops) {
  auto client = connectClient();
  client.create(7, kVoxa);
  client.start(7);
  client.sendMessage({{"a", 1}}, {7});
  endService();
  EXPECT_EQ(read(onlyFile(), "len(file)"), "3");
}

TEST_F(QVSummaryFileTest, IsNotWrittenOnOtherBuilds) {
  root_.configure("device.json", R"({"InternalBuild": false})");
  auto client = connectClient();
  runSession(client, {});
  EXPECT_TRUE(std::filesystem::is_empty(root_.logs()));
}

TEST_F(QVSummaryFileTest, MakesThePlaceForItsLogs) {
  startServiceWithLogs(root_.path() / "new" / "logs");
  auto client = connectClient();
  runSession(client, {});
  EXPECT_FALSE(std::filesystem::is_empty(root_.path() / "new/logs/DiagnosticLogs/Audio/Reporting"));
}

TEST_F(QVSummaryFileTest, IsDoneWithoutWhereTheRootIsAFile) {
  const std::filesystem::path logs = root_.path() / "logfile";
  std::ofstream(logs) << "precious";
  startServiceWithLogs(logs);
  auto client = connectClient();
  runSession(client, {{"HostApplicationDisplayID", "x"}});
  const std::string directory = (logs / "DiagnosticLogs/Audio/Reporting").string();
  expectFailures(client, {"can't create logging directory at " + directory + ": " + logs.string() +
                              ": Not a directory",
                          MatchesRegex("jsonOutput writeToURL: " + directory +
                                       "/.*-quietvox-x-voxa\\.json: Not a directory")});
  EXPECT_EQ(std::filesystem::file_size(logs), 8u);
}

TEST_F(QVSummaryFileTest, IsDoneWithoutWhereAMessageHasNoJSON) {
  auto client = connectClient();
  runSession(client, {}, {{"rate", std::nan("")}});
  EXPECT_THAT(names(), IsEmpty());
  expectFailures(client,
                 {"dataWithJSONObject: Session_Playback_Start_1: \"rate\" is nan, which JSON has "
                  "no word for"});
}

TEST_F(QVSummaryFileTest, StaysInItsDirectoryWhateverTheApplicationIsCalled) {
  auto client = connectClient();
  runSession(client, {{"HostApplicationDisplayID", "../../../../x"}});
  EXPECT_THAT(onlyFile().filename(), MatchesRegex(".*-quietvox-.._.._.._.._x-voxa\\.json"));
}

TEST_F(QVSummaryFileTest, IsDoneWithoutWhereTheApplicationsNameIsTooLong) {
  auto client = connectClient();
  const std::string application(4'000, 'a');
  runSession(client, {{"HostApplicationDisplayID", application}});
  EXPECT_THAT(names(), IsEmpty());
  expectFailures(client,
                 {MatchesRegex("jsonOutput writeToURL: " + directory().string() + "/.*-quietvox-" +
                               application + "-voxa\\.json: File name too long")});
}

}  // namespace
