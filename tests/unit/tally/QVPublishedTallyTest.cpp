// What only the adapter over files has: where channels come from, in which order, and what bad
// files cost. What it has in common with its fake is in the contract suite.

#include "platform/QVText.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/linux/tally/QVPublishedTally.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/unit/tally/QVPublisher.h"
#include "tests/unit/tally/QVTestMMV.h"

#include <cerrno>
#include <filesystem>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Name = QVTally::Name;
using Samples = std::shared_ptr<const TallySampleSet>;

class QVPublishedTallyTest : public testing::Test {
 protected:
  QVPublishedTallyTest() { std::filesystem::create_directory(channels()); }

  std::filesystem::path channels() const { return root_.runtime() / "channels"; }
  void publish(const std::string& group, const QVTestMMV& file) const {
    QVPublishBytes(channels() / group, file.bytes());
  }
  void writeText(const std::string& name, const std::string& text) const {
    QVPublishBytes(root_.path() / name, text);
  }
  // The kernel's files of a group and subgroup, by their names in the root.
  void configure(const std::string& entries) const { root_.configure("channels.json", entries); }
  std::string entry(const std::string& names, const std::string& file) const {
    return "{" + names + R"(, "file": ")" + (root_.path() / file).string() + "\"}";
  }

  QVPublishedTally& tally() {
    if (!tally_) {
      tally_.emplace(log_, channels().string(), (root_.configuration() / "channels.json").string());
    }
    return *tally_;
  }
  std::shared_ptr<const TallyChannelSet> copyChannels(const Name& group, const Name& subgroup) {
    error_.reset();
    return tally().TallyCopyChannelsInGroup(group, subgroup, 0, error_);
  }
  void subscribe(const Name& group, const Name& subgroup) {
    const auto set = copyChannels(group, subgroup);
    ASSERT_NE(set, nullptr);
    subscription_ = tally().TallyCreateSubscription(*set, subscribed_);
  }
  Samples sample() {
    error_.reset();
    return tally().TallyCreateSamples(subscription_, subscribed_, error_);
  }
  // "NAME VALUE" of each channel.
  std::vector<std::string> contents(const Samples& samples) {
    std::vector<std::string> contents;
    tally().TallyIterate(*samples, [&](const TallyChannelSample& channel) {
      contents.push_back(QVText(tally().TallyChannelGetChannelName(channel), ' ',
                                tally().TallySimpleGetIntegerValue(channel)));
      return 0;
    });
    return contents;
  }
  std::vector<std::string> contentsNow(const Name& group, const Name& subgroup) {
    subscribe(group, subgroup);
    return contents(sample());
  }
  std::optional<int64_t> errorCode() const {
    return error_ ? std::optional(error_->code) : std::nullopt;
  }

  const QVTemporaryRoot root_;
  QVFakeLog log_;
  std::optional<QVPublishedTally> tally_;
  QVTally::Error error_;
  std::shared_ptr<TallySubscription> subscription_;
  std::shared_ptr<const TallyChannelSet> subscribed_;
};

QVTestMMV counters(std::vector<QVTestMMV::Metric> metrics) {
  return {.metrics = std::move(metrics)};
}

TEST_F(QVPublishedTallyTest, FindsNothingWhereNothingIsPublished) {
  EXPECT_EQ(copyChannels("Speaker", std::nullopt), nullptr);
  EXPECT_EQ(copyChannels(std::nullopt, "MCA"), nullptr);
  EXPECT_EQ(errorCode(), std::nullopt);
  std::filesystem::remove(channels());
  EXPECT_EQ(copyChannels("Speaker", std::nullopt), nullptr);
  EXPECT_EQ(copyChannels(std::nullopt, "MCA"), nullptr);
  EXPECT_EQ(errorCode(), std::nullopt);
  EXPECT_THAT(log_.renderings(), IsEmpty());
}

TEST_F(QVPublishedTallyTest, TellsAnEmptyGroupFromNone) {
  publish("Speaker", {});
  publish("Haptics", {.subgroups = {"Stats"}});
  writeText("text", "closed\n");
  configure("[" + entry(R"("group": "Kernel", "subgroup": "pcm0p")", "text") + "," +
            entry(R"("group": "Missing")", "missing") + "]");
  for (const auto& [group, subgroup] : std::vector<std::pair<Name, Name>>{{"Speaker", std::nullopt},
                                                                          {"Haptics", std::nullopt},
                                                                          {"Haptics", "Stats"},
                                                                          {"Kernel", std::nullopt},
                                                                          {"Kernel", "pcm0p"}}) {
    const auto set = copyChannels(group, subgroup);
    ASSERT_NE(set, nullptr) << QVText(group, ' ', subgroup);
    EXPECT_EQ(tally().TallyGetChannelCount(*set), 0);
  }
  EXPECT_EQ(copyChannels("Speaker", "Stats"), nullptr);
  EXPECT_EQ(copyChannels("Haptics", "Other"), nullptr);
  EXPECT_EQ(copyChannels("Kernel", "pcm1p"), nullptr);
  EXPECT_EQ(copyChannels("Missing", std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), std::nullopt);
}

TEST_F(QVPublishedTallyTest, OrdersByGroupSubgroupFileAndPlace) {
  publish("B", {.subgroups = {"right", "left"},
                .metrics = {{"z", {1, 2}, kUnsigned64, true},
                            {"plain", {3}},
                            {"a", {4, 5}, kUnsigned64, true}}});
  publish("A", counters({{"last", {6}}}));
  writeText("one", "k: 7\nj: 8\n");
  writeText("two", "i: 9\n");
  configure("[" + entry(R"("group": "B", "subgroup": "left")", "one") + "," +
            entry(R"("group": "B", "subgroup": "left")", "two") + "," +
            entry(R"("group": "C")", "two") + "]");
  EXPECT_THAT(
      contentsNow(std::nullopt, std::nullopt),
      ElementsAre("last 6", "plain 3", "z 2", "a 5", "k 7", "j 8", "i 9", "z 1", "a 4", "i 9"));
  EXPECT_THAT(contentsNow("B", "left"), ElementsAre("z 2", "a 5", "k 7", "j 8", "i 9"));
  EXPECT_THAT(contentsNow(std::nullopt, "left"), ElementsAre("z 2", "a 5", "k 7", "j 8", "i 9"));
  EXPECT_THAT(contentsNow("B", std::nullopt),
              ElementsAre("plain 3", "z 2", "a 5", "k 7", "j 8", "i 9", "z 1", "a 4"));
}

TEST_F(QVPublishedTallyTest, TakesFilesInTheMakingForNone) {
  publish(".Speaker.123", counters({{"frames", {1}}}));
  EXPECT_EQ(copyChannels(std::nullopt, std::nullopt), nullptr);
  EXPECT_EQ(copyChannels(".Speaker.123", std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), std::nullopt);
}

TEST_F(QVPublishedTallyTest, LooksForGroupsInItsDirectoryOnly) {
  QVPublishBytes(root_.runtime() / "secret", counters({{"frames", {1}}}).bytes());
  for (const std::string& group : {std::string("../secret"), std::string(".."), std::string("."),
                                   std::string(), std::string("sec\0ret", 7)}) {
    EXPECT_EQ(copyChannels(group, std::nullopt), nullptr);
    EXPECT_EQ(errorCode(), std::nullopt);
  }
}

TEST_F(QVPublishedTallyTest, AnswersAnErrorForABadFileAndWhatTheOthersHold) {
  publish("A", counters({{"one", {1}}}));
  QVPublishBytes(channels() / "B", "no channels");
  publish("C", counters({{"two", {2}}}));
  EXPECT_EQ(copyChannels("B", std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), EBADMSG);
  EXPECT_EQ(error_->domain, QVTally::kErrorDomain);
  EXPECT_EQ(error_->description(), "B: Bad message");
  subscribe(std::nullopt, std::nullopt);
  EXPECT_EQ(errorCode(), EBADMSG);
  EXPECT_EQ(tally().TallyGetChannelCount(*subscribed_), 2);
  EXPECT_THAT(contents(sample()), ElementsAre("one 1", "two 2"));
  EXPECT_EQ(errorCode(), std::nullopt) << "nobody subscribed to the bad one";
}

TEST_F(QVPublishedTallyTest, AnswersAnErrorForWhatCannotBeAFile) {
  ASSERT_EQ(::mkfifo((channels() / "A").c_str(), 0600), 0);
  EXPECT_EQ(copyChannels(std::nullopt, "MCA"), nullptr);
  EXPECT_EQ(errorCode(), EINVAL);
  std::filesystem::remove(channels() / "A");
  std::filesystem::create_symlink("/etc/passwd", channels() / "A");
  EXPECT_EQ(copyChannels("A", std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), ELOOP);
}

TEST_F(QVPublishedTallyTest, AnswersAnErrorWhereTheDirectoryIsNone) {
  std::filesystem::remove(channels());
  QVPublishBytes(channels(), "");
  EXPECT_EQ(copyChannels(std::nullopt, "MCA"), nullptr);
  EXPECT_EQ(errorCode(), ENOTDIR);
  EXPECT_EQ(copyChannels("Speaker", std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), ENOTDIR);
}

TEST_F(QVPublishedTallyTest, LimitsTheChannelsOfASet) {
  constexpr std::size_t kHalf = QVPublishedTally::kMaximumChannels / 2 + 1;
  for (const char* group : {"A", "B"}) {
    std::vector<QVTestMMV::Metric> metrics(kHalf, {"frames", {1}});
    publish(group, counters(std::move(metrics)));
  }
  EXPECT_EQ(tally().TallyGetChannelCount(*copyChannels("A", std::nullopt)), kHalf);
  EXPECT_EQ(errorCode(), std::nullopt);
  EXPECT_EQ(tally().TallyGetChannelCount(*copyChannels(std::nullopt, std::nullopt)),
            QVPublishedTally::kMaximumChannels);
  EXPECT_EQ(errorCode(), E2BIG);
}

TEST_F(QVPublishedTallyTest, LimitsTheFilesOfTheDirectory) {
  for (std::size_t i = 0; i <= QVPublishedTally::kMaximumFiles; ++i) {
    std::ofstream(channels() / ("." + std::to_string(i)));
  }
  EXPECT_EQ(copyChannels(std::nullopt, std::nullopt), nullptr);
  EXPECT_EQ(errorCode(), E2BIG);
}

TEST_F(QVPublishedTallyTest, LeavesOutAFileThatIsGoneAndTakesItBack) {
  publish("A", counters({{"one", {1}}}));
  publish("B", counters({{"two", {2}}}));
  subscribe(std::nullopt, std::nullopt);
  std::filesystem::remove(channels() / "A");
  EXPECT_THAT(contents(sample()), ElementsAre("two 2"));
  EXPECT_EQ(errorCode(), std::nullopt) << "a driver may go";
  std::filesystem::remove_all(channels());
  EXPECT_THAT(contents(sample()), IsEmpty());
  EXPECT_EQ(errorCode(), std::nullopt) << "all of them, too";
  std::filesystem::create_directory(channels());
  publish("A", counters({{"one", {3}}}));
  publish("B", counters({{"two", {2}}}));
  EXPECT_THAT(contents(sample()), ElementsAre("one 3", "two 2")) << "they are back";
  EXPECT_EQ(errorCode(), std::nullopt);
}

TEST_F(QVPublishedTallyTest, TellsAFileThatIsGoneFromOneThatCannotBeRead) {
  publish("A", counters({{"one", {1}}}));
  publish("B", counters({{"two", {2}}}));
  publish("C", counters({{"three", {3}}}));
  subscribe(std::nullopt, std::nullopt);
  std::filesystem::remove(channels() / "A");
  QVPublishBytes(channels() / "B", "no channels");
  EXPECT_THAT(contents(sample()), ElementsAre("three 3"));
  EXPECT_EQ(errorCode(), EBADMSG);
  EXPECT_EQ(error_->description(), "B: Bad message");
}

TEST_F(QVPublishedTallyTest, KnowsChannelsOfAReplacedFileByTheirNames) {
  publish("Speaker", {.subgroups = {"left", "right"},
                      .metrics = {{"frames", {1, 2}, kUnsigned64, true},
                                  {"gone", {3, 4}, kUnsigned64, true}}});
  subscribe("Speaker", std::nullopt);
  const Samples before = sample();
  publish("Speaker", {.subgroups = {"new", "right", "left"},
                      .metrics = {{"other", {0, 0, 0}, kUnsigned64, true},
                                  {"frames", {0, 20, 10}, kDouble, true}},
                      .generation = 8});
  EXPECT_THAT(contents(sample()), ElementsAre("frames 0", "frames 0")) << "cells of another type";
  publish("Speaker", {.subgroups = {"new", "right", "left"},
                      .metrics = {{"other", {0, 0, 0}, kUnsigned64, true},
                                  {"frames", {0, 20, 10}, kUnsigned64, true}},
                      .generation = 9});
  const Samples after = sample();
  EXPECT_THAT(contents(after), ElementsAre("frames 10", "frames 20"));
  const Samples delta = tally().TallyCreateSamplesDelta(before, *after, error_);
  EXPECT_THAT(contents(delta), ElementsAre("frames 9", "frames 18"));
}

TEST_F(QVPublishedTallyTest, KeepsEqualChannelsApartByTheirPlace) {
  publish("A", counters({{"n", {1}}, {"n", {10}}}));
  writeText("text", "n: 100\n");
  configure("[" + entry(R"("group": "A")", "text") + "]");
  subscribe("A", std::nullopt);
  const Samples before = sample();
  publish("A", counters({{"n", {2}}, {"n", {30}}}));
  writeText("text", "n: 400\n");
  EXPECT_THAT(contents(tally().TallyCreateSamplesDelta(before, *sample(), error_)),
              ElementsAre("n 1", "n 20", "n 300"));
  publish("A", counters({{"n", {2}}}));
  EXPECT_THAT(contents(tally().TallyCreateSamplesDelta(before, *sample(), error_)),
              ElementsAre("n 1", "n 300"));
}

TEST_F(QVPublishedTallyTest, TakesDifferencesAcrossSubscriptions) {
  publish("A", counters({{"a", {1}}, {"b", {2}}}));
  subscribe("A", std::nullopt);
  const Samples before = sample();
  publish("A", counters({{"new", {5}}, {"b", {12}}, {"a", {21}}}));
  subscribe("A", std::nullopt);
  EXPECT_THAT(contents(tally().TallyCreateSamplesDelta(before, *sample(), error_)),
              ElementsAre("b 10", "a 20"));
}

TEST_F(QVPublishedTallyTest, LeavesOutChannelsThatHaveNoValueAtTheMoment) {
  QVTestMMV file = counters({{"a", {UINT64_MAX}}, {"b", {2}}});
  file.flags = 4;
  publish("A", file);
  subscribe("A", std::nullopt);
  EXPECT_EQ(tally().TallyGetChannelCount(*subscribed_), 2);
  const Samples before = sample();
  EXPECT_THAT(contents(before), ElementsAre("b 2"));
  file.metrics.front().cells = {7};
  publish("A", file);
  const Samples after = sample();
  EXPECT_THAT(contents(after), ElementsAre("a 7", "b 2"));
  EXPECT_THAT(contents(tally().TallyCreateSamplesDelta(before, *after, error_)),
              ElementsAre("b 0"));
}

TEST_F(QVPublishedTallyTest, ReadsTextsWhoseLinesComeAndGo) {
  writeText("status", "hw_ptr      : 100\n");
  configure("[" + entry(R"("group": "Speaker", "channels": {"frames": "hw_ptr"})", "status") + "]");
  subscribe("Speaker", std::nullopt);
  EXPECT_THAT(contents(sample()), ElementsAre("frames 100"));
  writeText("status", "closed\n");
  EXPECT_THAT(contents(sample()), IsEmpty());
  EXPECT_EQ(errorCode(), std::nullopt);
  std::filesystem::remove(root_.path() / "status");
  EXPECT_THAT(contents(sample()), IsEmpty());
  EXPECT_EQ(errorCode(), std::nullopt);
}

TEST_F(QVPublishedTallyTest, ReadsTheConfigurationOnce) {
  configure("[,");
  publish("A", counters({{"a", {1}}}));
  EXPECT_THAT(contentsNow("A", std::nullopt), ElementsAre("a 1"));
  EXPECT_THAT(contentsNow(std::nullopt, std::nullopt), ElementsAre("a 1"));
  EXPECT_EQ(log_.renderings().size(), 1U);
}

TEST_F(QVPublishedTallyTest, IsSampledByManyThreads) {
  publish("A", counters({{"a", {1}}, {"b", {2}}}));
  subscribe("A", std::nullopt);
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this] {
      for (int i = 0; i < 100; ++i) {
        QVTally::Error error;
        EXPECT_THAT(contents(tally().TallyCreateSamples(subscription_, subscribed_, error)),
                    ElementsAre("a 1", "b 2"));
        EXPECT_EQ(error, std::nullopt);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
