#include "platform/fake/QVFakeLog.h"
#include "platform/linux/tally/QVChannelConfiguration.h"
#include "tests/support/QVTemporaryRoot.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

using Description = QVKernelTextSource::Description;

class QVChannelConfigurationTest : public testing::Test {
 protected:
  std::vector<Description> read() { return QVChannelConfiguration::read(log_, path()); }
  std::vector<Description> read(const std::string& text) {
    root_.configure("channels.json", text);
    return read();
  }
  std::string path() const { return (root_.configuration() / "channels.json").string(); }
  static std::string line(const std::string& text) {
    return "3[default] +[QVChannelConfiguration read:]: " + text;
  }
  std::string leftOut(int number, const std::string& reason) const {
    return line("entry " + std::to_string(number) + " of " + path() + " is left out: " + reason);
  }

  const QVTemporaryRoot root_;
  QVFakeLog log_;
};

TEST_F(QVChannelConfigurationTest, ReadsEntries) {
  EXPECT_THAT(
      read(R"([{"group": "Speaker", "subgroup": "pcm0p",
                        "file": "/proc/asound/card0/pcm0p/sub0/status",
                        "channels": {"frames": "hw_ptr", "all": "appl_ptr"}},
                       {"group": "Haptics", "file": "/proc/stat", "comment": 1},
                       {"group": "Mixer", "subgroup": "", "file": "/f", "channels": {}}])"),
      ElementsAre(Description{.group = "Speaker",
                              .subgroup = "pcm0p",
                              .file = "/proc/asound/card0/pcm0p/sub0/status",
                              .channels = {{{"all", "appl_ptr"}, {"frames", "hw_ptr"}}}},
                  Description{.group = "Haptics",
                              .subgroup = std::nullopt,
                              .file = "/proc/stat",
                              .channels = std::nullopt},
                  Description{.group = "Mixer",
                              .subgroup = "",
                              .file = "/f",
                              .channels = std::vector<std::pair<std::string, std::string>>{}}));
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVChannelConfigurationTest, HoldsNothingWhereThereIsNoFile) {
  EXPECT_THAT(read(), IsEmpty());
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVChannelConfigurationTest, HoldsNothingInAnEmptyArray) {
  EXPECT_THAT(read("[]"), IsEmpty());
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVChannelConfigurationTest, NamesFileLineAndColumnOfWhatIsNoJSON) {
  EXPECT_THAT(read("[\n  {\"group\": \"Speaker\",\n   \"file\" \"/f\"}]"), IsEmpty());
  EXPECT_THAT(log_.renderings(),
              ElementsAre(line("cannot read driver channels " + path() +
                               ": line 3, column 11: Missing a colon after a name of object "
                               "member.")));
}

TEST_F(QVChannelConfigurationTest, CountsAnotherKindOfValueAsEmpty) {
  EXPECT_THAT(read(R"({"group": "Speaker", "file": "/f"})"), IsEmpty());
  EXPECT_THAT(log_.renderings(), ElementsAre(line("cannot read driver channels " + path() +
                                                  ": line 1, column 1: not an array")));
}

TEST_F(QVChannelConfigurationTest, SaysThatTheFileIsADirectory) {
  std::filesystem::create_directories(path());
  EXPECT_THAT(read(), IsEmpty());
  EXPECT_THAT(log_.renderings(),
              ElementsAre(line("cannot read driver channels " + path() + ": not a regular file")));
}

TEST_F(QVChannelConfigurationTest, LeavesOutEntriesOfTheWrongKinds) {
  EXPECT_THAT(
      read(R"([1, {"group": "Speaker", "file": "/f"},
                       {"file": "/f"}, {"group": 1, "file": "/f"}, {"group": "", "file": "/f"},
                       {"group": "a", "subgroup": 1, "file": "/f"},
                       {"group": "a", "subgroup": null, "file": "/f"},
                       {"group": "a"}, {"group": "a", "file": ["/f"]},
                       {"group": "a", "file": "f"}, {"group": "a", "file": "/f\u0000g"},
                       {"group": "a", "file": "/f", "channels": ["hw_ptr"]}])"),
      ElementsAre(Description{.group = "Speaker", .subgroup = {}, .file = "/f", .channels = {}}));
  EXPECT_THAT(
      log_.renderings(),
      ElementsAre(
          leftOut(1, "it is no object"), leftOut(3, "\"group\" is no name"),
          leftOut(4, "\"group\" is no name"), leftOut(5, "\"group\" is no name"),
          leftOut(6, "\"subgroup\" is no string"), leftOut(7, "\"subgroup\" is no string"),
          leftOut(8, "\"file\" is no absolute path"), leftOut(9, "\"file\" is no absolute path"),
          leftOut(10, "\"file\" is no absolute path"), leftOut(11, "\"file\" is no absolute path"),
          leftOut(12, "\"channels\" is no object")));
}

TEST_F(QVChannelConfigurationTest, LeavesOutChannelsOfTheWrongKind) {
  const auto descriptions = read(R"([{"group": "a", "file": "/f",
                                      "channels": {"one": 1, "two": "b", "three": null}}])");
  ASSERT_THAT(descriptions, SizeIs(1));
  EXPECT_EQ(descriptions.front().channels,
            (std::vector<std::pair<std::string, std::string>>{{"two", "b"}}));
  EXPECT_THAT(
      log_.renderings(),
      ElementsAre(
          line("channel one of entry 1 of " + path() + " is left out: its key is no string"),
          line("channel three of entry 1 of " + path() + " is left out: its key is no string")));
}

TEST_F(QVChannelConfigurationTest, LimitsEntries) {
  std::string text = "[";
  for (std::size_t i = 0; i < QVChannelConfiguration::kMaximumEntries + 2; ++i) {
    text += i == 0 ? "" : ",";
    text += R"({"group": "a", "file": "/f"})";
  }
  EXPECT_THAT(read(text + "]"), SizeIs(QVChannelConfiguration::kMaximumEntries));
  EXPECT_THAT(log_.renderings(),
              ElementsAre(line("entries of " + path() + " beyond the first 256 are left out")));
}

TEST_F(QVChannelConfigurationTest, LimitsTheChannelsOfAnEntry) {
  std::string channels;
  for (std::size_t i = 0; i < QVChannelConfiguration::kMaximumChannels; ++i) {
    channels += "\"a" + std::to_string(i) + R"(": "key", )";
  }
  const auto descriptions = read(R"([{"group": "a", "file": "/f", "channels": {)" + channels +
                                 R"("b": "key"}}, {"group": "b", "file": "/f", "channels": {)" +
                                 channels.substr(0, channels.size() - 2) + "}}]");
  ASSERT_THAT(descriptions, SizeIs(2));
  EXPECT_EQ(descriptions[0].channels, descriptions[1].channels);
  EXPECT_THAT(descriptions[0].channels, testing::Optional(SizeIs(1024)));
  EXPECT_THAT(log_.renderings(), ElementsAre(line("channels of entry 1 of " + path() +
                                                  " beyond the first 1024 are left out")));
}

}  // namespace
