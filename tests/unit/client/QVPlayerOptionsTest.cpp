#include "client/examples/player/QVPlayerOptions.h"

#include <vector>

#include <getopt.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

class QVPlayerOptionsTest : public testing::Test {
 protected:
  std::optional<QVPlayerOptions> parse(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), "qv-player");
    std::vector<char*> pointers;
    for (std::string& argument : arguments) pointers.push_back(argument.data());
    pointers.push_back(nullptr);
    optind = 0;  // begin anew: the parser keeps its place from one command line to the next
    problem_.clear();
    return QVPlayerOptions::parse(static_cast<int>(arguments.size()), pointers.data(), problem_);
  }

  std::string problem_;
};

TEST_F(QVPlayerOptionsTest, HaveDefaults) {
  const auto options = parse({"a.wav", "b.flac"});
  ASSERT_TRUE(options);
  EXPECT_EQ(options->files, (std::vector<std::string>{"a.wav", "b.flac"}));
  EXPECT_EQ(options->device, "null");
  EXPECT_EQ(options->socket, "");
  EXPECT_EQ(options->serviceType, QVClientServiceType::nonlongformaudio);
  EXPECT_EQ(options->reporterID, getpid());
  EXPECT_EQ(options->application, "net.quillon.example.player");
  EXPECT_EQ(options->speed, 1);
  EXPECT_FALSE(options->haptics);
}

TEST_F(QVPlayerOptionsTest, TakeEverythingThatTheHelpNames) {
  const auto options = parse({"--device", "hw:0", "-s", "/run/s", "--service-type", "telephony",
                              "--reporter-id=-4", "--application", "a.b", "--speed", "0.5",
                              "--volume", "0", "--route", "hdmi", "--haptics", "f"});
  ASSERT_TRUE(options) << problem_;
  EXPECT_EQ(options->device, "hw:0");
  EXPECT_EQ(options->socket, "/run/s");
  EXPECT_EQ(options->serviceType, QVClientServiceType::telephony);
  EXPECT_EQ(options->reporterID, -4);
  EXPECT_EQ(options->application, "a.b");
  EXPECT_EQ(options->speed, 0.5);
  EXPECT_EQ(options->volume, 0);
  EXPECT_EQ(options->route, "hdmi");
  EXPECT_TRUE(options->haptics);
  for (const char* name :
       {"--device", "--socket", "--service-type", "--reporter-id", "--application", "--speed",
        "--volume", "--route", "--haptics", "--help"}) {
    EXPECT_NE(std::string(QVPlayerOptions::helpText()).find(name), std::string::npos) << name;
  }
}

TEST_F(QVPlayerOptionsTest, HelpNeedsNoFile) {
  EXPECT_TRUE(parse({"--help"})->help);
  EXPECT_TRUE(parse({"-h"})->help);
}

TEST_F(QVPlayerOptionsTest, RefuseWhatMakesNoSense) {
  const auto problemOf = [this](std::vector<std::string> arguments) {
    EXPECT_FALSE(parse(std::move(arguments)));
    return problem_;
  };
  EXPECT_EQ(problemOf({}), "no file to play");
  EXPECT_EQ(problemOf({"--nonsense", "f"}), "an option is unknown or lacks its argument");
  EXPECT_EQ(problemOf({"f", "--speed"}), "an option is unknown or lacks its argument");
  EXPECT_EQ(problemOf({"--service-type", "music", "f"}), "there is no service type \"music\"");
  EXPECT_EQ(problemOf({"--reporter-id", "0", "f"}),
            "a reporter ID is a number of 64 bits other than 0, not \"0\"");
  for (const char* speed : {"-1", "nan", "inf", "1001", "2x", ""}) {
    EXPECT_EQ(problemOf({"--speed", speed, "f"}),
              "the speed is a number from 0 to 1000, not \"" + std::string(speed) + "\"");
  }
  EXPECT_EQ(problemOf({"--volume", "101", "f"}),
            "the volume is a number from 0 to 100, not \"101\"");
}

}  // namespace
