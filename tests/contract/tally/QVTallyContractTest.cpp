#include "platform/QVText.h"
#include "platform/fake/QVFakeLog.h"
#include "platform/fake/QVFakeTally.h"
#include "platform/linux/tally/QVPublishedTally.h"
#include "tests/support/QVTemporaryRoot.h"
#include "tests/unit/tally/QVPublisher.h"
#include "tests/unit/tally/QVTestMMV.h"

#include <filesystem>
#include <limits>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

using Name = QVTally::Name;
using Channels = std::vector<std::pair<std::string, int64_t>>;
using Samples = std::shared_ptr<const TallySampleSet>;

constexpr int64_t kLeast = std::numeric_limits<int64_t>::min();
constexpr int64_t kMost = std::numeric_limits<int64_t>::max();

class FakeTallyHarness {
 public:
  QVTally& tally() { return tally_; }
  // Makes these the publisher's channels, in place of earlier ones.
  void publish(const std::string& group, const Name& subgroup, const Channels& channels) {
    std::vector<QVFakeTally::Channel> published;
    for (const auto& [name, value] : channels) {
      published.push_back({name.empty() ? Name() : Name(name), value});
    }
    tally_.publish({group, subgroup}, published);
  }
  void withdraw(const std::string& group, const Name& subgroup) {
    tally_.withdraw({group, subgroup});
  }

 private:
  QVFakeTally tally_;
};

// Each group is a driver's file: its subgroups are the file's instances.
class PublishedTallyHarness {
 public:
  PublishedTallyHarness() { std::filesystem::create_directory(directory()); }

  QVTally& tally() { return tally_; }
  void publish(const std::string& group, const Name& subgroup, const Channels& channels) {
    published_[group][subgroup] = channels;
    write(group);
  }
  void withdraw(const std::string& group, const Name& subgroup) {
    published_[group].erase(subgroup);
    if (published_[group].empty()) {
      std::filesystem::remove(directory() / group);
    } else {
      write(group);
    }
  }

 private:
  std::filesystem::path directory() const { return root_.runtime() / "channels"; }

  void write(const std::string& group) {
    QVTestMMV file{.generation = ++generation_};
    for (const auto& [subgroup, channels] : published_[group]) {
      if (subgroup) file.subgroups.push_back(*subgroup);
    }
    std::size_t place = 0;
    for (const auto& [subgroup, channels] : published_[group]) {
      // A cell for each subgroup; those of others have no type that counts.
      for (const auto& [name, value] : channels) {
        file.metrics.push_back({.name = name, .cells = {QVTestCell(value)}, .type = kSigned64});
        if (subgroup) point(file, place);
      }
      if (subgroup) ++place;
    }
    QVPublishBytes(directory() / group, withInstances(file));
  }

  // Remembers that the newest metric has its value for that subgroup alone.
  void point(QVTestMMV& file, std::size_t subgroup) {
    file.metrics.back().grouped = true;
    instances_[file.metrics.size() - 1] = subgroup;
  }
  std::string withInstances(const QVTestMMV& file) {
    std::string bytes = file.bytes();
    for (const auto& [metric, subgroup] : std::exchange(instances_, {})) {
      QVPatch(bytes, file.valueAt(metric) + 24, uint64_t{file.instanceAt(subgroup)});
    }
    return bytes;
  }

  const QVTemporaryRoot root_;
  QVFakeLog log_;
  QVPublishedTally tally_{log_, directory().string(),
                          (root_.configuration() / "channels.json").string()};
  std::map<std::string, std::map<Name, Channels>> published_;
  std::map<std::size_t, std::size_t> instances_;  // of the file being written, by metric
  uint64_t generation_ = 0;
};

template <class Harness>
class QVTallyContract : public testing::Test {
 protected:
  struct Subscribed {
    std::shared_ptr<TallySubscription> subscription;
    std::shared_ptr<const TallyChannelSet> channels;
  };

  QVTally& tally() { return harness_.tally(); }
  std::shared_ptr<const TallyChannelSet> copyChannels(const Name& group, const Name& subgroup) {
    QVTally::Error error;
    auto channels = tally().TallyCopyChannelsInGroup(group, subgroup, 0, error);
    EXPECT_EQ(error, std::nullopt);
    return channels;
  }
  // How many channels there are; none where nothing is published.
  std::optional<int32_t> count(const Name& group, const Name& subgroup) {
    const auto channels = copyChannels(group, subgroup);
    return channels ? std::optional(tally().TallyGetChannelCount(*channels)) : std::nullopt;
  }
  Subscribed subscribe(const Name& group, const Name& subgroup) {
    Subscribed made;
    made.subscription =
        tally().TallyCreateSubscription(*copyChannels(group, subgroup), made.channels);
    EXPECT_NE(made.subscription, nullptr);
    EXPECT_NE(made.channels, nullptr);
    return made;
  }
  Samples sample(const Subscribed& subscribed) {
    QVTally::Error error;
    auto samples = tally().TallyCreateSamples(subscribed.subscription, subscribed.channels, error);
    EXPECT_EQ(error, std::nullopt);
    return samples;
  }
  Samples delta(const Samples& earlier, const Samples& later) {
    QVTally::Error error;
    auto differences = tally().TallyCreateSamplesDelta(earlier, *later, error);
    EXPECT_EQ(error, std::nullopt);
    return differences;
  }
  // "NAME VALUE" of each channel, in the library's order.
  std::vector<std::string> contents(const Samples& samples) {
    std::vector<std::string> contents;
    tally().TallyIterate(*samples, [&](const TallyChannelSample& channel) {
      contents.push_back(QVText(tally().TallyChannelGetChannelName(channel), ' ',
                                tally().TallySimpleGetIntegerValue(channel)));
      return 0;
    });
    return contents;
  }

  Harness harness_;
};

using Harnesses = testing::Types<FakeTallyHarness, PublishedTallyHarness>;
TYPED_TEST_SUITE(QVTallyContract, Harnesses);

TYPED_TEST(QVTallyContract, FindsChannelsByGroupAndSubgroup) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}, {"b", 2}});
  this->harness_.publish("Haptics", "Other", {{"c", 3}});
  this->harness_.publish("Card", "Stats", {{"d", 4}});
  this->harness_.publish("Speaker", std::nullopt, {{"e", 5}});
  EXPECT_EQ(this->count("Haptics", "Stats"), 2);
  EXPECT_EQ(this->count("Haptics", std::nullopt), 3);
  EXPECT_EQ(this->count(std::nullopt, "Stats"), 3);
  EXPECT_EQ(this->count("Speaker", std::nullopt), 1);
  EXPECT_EQ(this->count(std::nullopt, std::nullopt), 5);
}

TYPED_TEST(QVTallyContract, TellsAnEmptyGroupFromNone) {
  this->harness_.publish("Speaker", std::nullopt, {});
  this->harness_.publish("Haptics", "Stats", {});
  EXPECT_EQ(this->count("Speaker", std::nullopt), 0);
  EXPECT_EQ(this->count("Haptics", "Stats"), 0);
  EXPECT_EQ(this->count(std::nullopt, "Stats"), 0);
  EXPECT_EQ(this->count("Speaker", "Stats"), std::nullopt);
  EXPECT_EQ(this->count("Haptics", "Other"), std::nullopt);
  EXPECT_EQ(this->count("Unknown", std::nullopt), std::nullopt);
}

TYPED_TEST(QVTallyContract, SamplesTheValuesOfNow) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}, {"b", -2}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  const Samples before = this->sample(subscribed);
  this->harness_.publish("Haptics", "Stats", {{"a", 10}, {"b", kMost}});
  EXPECT_THAT(this->contents(this->sample(subscribed)), ElementsAre("a 10", QVText("b ", kMost)));
  EXPECT_THAT(this->contents(before), ElementsAre("a 1", "b -2")) << "a set does not change";
}

TYPED_TEST(QVTallyContract, SamplesAllThatMatchAnAbsentName) {
  this->harness_.publish("One", "MCA", {{"a", 1}});
  this->harness_.publish("Two", "MCA", {{"b", 2}});
  this->harness_.publish("Two", "Other", {{"c", 3}});
  EXPECT_THAT(this->contents(this->sample(this->subscribe(std::nullopt, "MCA"))),
              UnorderedElementsAre("a 1", "b 2"));
}

TYPED_TEST(QVTallyContract, LeavesOutWhatIsGoneAndWhatIsNew) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}, {"b", 2}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  this->harness_.publish("Haptics", "Stats", {{"new", 5}, {"b", 3}});
  EXPECT_THAT(this->contents(this->sample(subscribed)), ElementsAre("b 3"));
  this->harness_.publish("Haptics", "Other", {});
  this->harness_.withdraw("Haptics", "Stats");
  EXPECT_THAT(this->contents(this->sample(subscribed)), IsEmpty());
}

TYPED_TEST(QVTallyContract, LeavesOutAPublisherThatGoesAwayAndNoOther) {
  this->harness_.publish("One", "MCA", {{"a", 1}});
  this->harness_.publish("Two", "MCA", {{"b", 2}});
  const auto subscribed = this->subscribe(std::nullopt, "MCA");
  const Samples before = this->sample(subscribed);
  this->harness_.withdraw("One", "MCA");
  this->harness_.publish("Two", "MCA", {{"b", 5}});
  const Samples after = this->sample(subscribed);
  EXPECT_THAT(this->contents(after), ElementsAre("b 5"));
  EXPECT_THAT(this->contents(this->delta(before, after)), ElementsAre("b 3"));
}

TYPED_TEST(QVTallyContract, HasSamplesOfNothingOnceAllPublishersAreGone) {
  this->harness_.publish("One", "MCA", {{"a", 1}});
  this->harness_.publish("Two", "MCA", {{"b", 2}});
  const auto subscribed = this->subscribe(std::nullopt, "MCA");
  const Samples before = this->sample(subscribed);
  this->harness_.withdraw("One", "MCA");
  this->harness_.withdraw("Two", "MCA");
  const Samples after = this->sample(subscribed);
  ASSERT_NE(after, nullptr);
  EXPECT_THAT(this->contents(after), IsEmpty());
  EXPECT_THAT(this->contents(this->delta(before, after)), IsEmpty());
}

TYPED_TEST(QVTallyContract, KnowsChannelsOfOneNameByTheirPlace) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}, {"", 2}, {"a", 3}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  const Samples before = this->sample(subscribed);
  EXPECT_THAT(this->contents(before), ElementsAre("a 1", "(null) 2", "a 3"));
  this->harness_.publish("Haptics", "Stats", {{"a", 11}, {"", 22}, {"a", 33}});
  EXPECT_THAT(this->contents(this->delta(before, this->sample(subscribed))),
              ElementsAre("a 10", "(null) 20", "a 30"));
}

TYPED_TEST(QVTallyContract, TakesDifferencesChannelByChannel) {
  this->harness_.publish("Haptics", "Stats", {{"grew", 1}, {"gone", 1}, {"same", 7}, {"fell", 10}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  const Samples before = this->sample(subscribed);
  this->harness_.publish("Haptics", "Stats", {{"grew", 5}, {"same", 7}, {"fell", 4}});
  const Samples after = this->sample(subscribed);
  EXPECT_THAT(this->contents(this->delta(before, after)),
              ElementsAre("grew 4", "same 0", "fell -6"));
  EXPECT_THAT(this->contents(this->delta(after, before)),
              ElementsAre("grew -4", "same 0", "fell 6"));
}

TYPED_TEST(QVTallyContract, SaturatesDifferences) {
  this->harness_.publish("Haptics", "Stats", {{"up", kLeast}, {"down", kMost}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  const Samples before = this->sample(subscribed);
  this->harness_.publish("Haptics", "Stats", {{"up", kMost}, {"down", -2}});
  EXPECT_THAT(this->contents(this->delta(before, this->sample(subscribed))),
              ElementsAre(QVText("up ", kMost), QVText("down ", kLeast)));
}

TYPED_TEST(QVTallyContract, HasNoDifferencesToNothing) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}});
  EXPECT_EQ(this->delta(nullptr, this->sample(this->subscribe("Haptics", "Stats"))), nullptr);
}

TYPED_TEST(QVTallyContract, AnswersAnErrorWithoutASubscription) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  QVTally::Error error;
  EXPECT_EQ(this->tally().TallyCreateSamples(nullptr, subscribed.channels, error), nullptr);
  ASSERT_NE(error, std::nullopt);
  EXPECT_EQ(error->domain, QVTally::kErrorDomain);
  error.reset();
  EXPECT_EQ(this->tally().TallyCreateSamples(subscribed.subscription, nullptr, error), nullptr);
  EXPECT_NE(error, std::nullopt);
}

TYPED_TEST(QVTallyContract, IteratesUntilTheIteratorHasEnough) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}, {"b", 2}, {"c", 3}});
  const Samples samples = this->sample(this->subscribe("Haptics", "Stats"));
  int seen = 0;
  this->tally().TallyIterate(*samples,
                             [&seen](const TallyChannelSample&) { return ++seen == 2 ? 1 : 0; });
  EXPECT_EQ(seen, 2);
}

TYPED_TEST(QVTallyContract, IsUsedByManyThreads) {
  this->harness_.publish("Haptics", "Stats", {{"a", 1}});
  const auto subscribed = this->subscribe("Haptics", "Stats");
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) {
    threads.emplace_back([this, &subscribed] {
      for (int i = 0; i < 50; ++i) {
        EXPECT_EQ(this->count("Haptics", std::nullopt), 1);
        EXPECT_THAT(this->contents(this->sample(subscribed)), ElementsAre("a 1"));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
