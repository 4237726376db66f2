#include "platform/QVText.h"
#include "platform/fake/QVFakeTally.h"

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

using Driver = QVFakeTally::Driver;

const Driver kHaptics{"Haptics", "Stats"};
const Driver kSpeaker{"Speaker", std::nullopt};

class QVFakeTallyTest : public testing::Test {
 protected:
  struct Subscribed {
    std::shared_ptr<TallySubscription> subscription;
    std::shared_ptr<const TallyChannelSet> channels;
  };

  std::shared_ptr<const TallyChannelSet> copyChannels(const Driver& driver) {
    error_.reset();
    return tally_.TallyCopyChannelsInGroup(driver.group, driver.subgroup, 0, error_);
  }
  Subscribed subscribe(const Driver& driver) {
    Subscribed made;
    made.subscription = tally_.TallyCreateSubscription(*copyChannels(driver), made.channels);
    return made;
  }
  std::shared_ptr<const TallySampleSet> sample(const Subscribed& subscribed) {
    error_.reset();
    return tally_.TallyCreateSamples(subscribed.subscription, subscribed.channels, error_);
  }
  std::shared_ptr<const TallySampleSet> delta(const std::shared_ptr<const TallySampleSet>& earlier,
                                              const TallySampleSet& later) {
    error_.reset();
    return tally_.TallyCreateSamplesDelta(earlier, later, error_);
  }
  // "NAME VALUE" of each channel, in the library's order.
  std::vector<std::string> contents(const std::shared_ptr<const TallySampleSet>& samples) {
    std::vector<std::string> contents;
    tally_.TallyIterate(*samples, [&](const TallyChannelSample& sample) {
      contents.push_back(QVText(tally_.TallyChannelGetChannelName(sample), ' ',
                                tally_.TallySimpleGetIntegerValue(sample)));
      return 0;
    });
    return contents;
  }
  std::optional<int64_t> errorCode() const {
    return error_ ? std::optional(error_->code) : std::nullopt;
  }

  QVFakeTally tally_;
  QVTally::Error error_;
};

TEST_F(QVFakeTallyTest, FindsChannelsByGroupAndSubgroup) {
  tally_.publish(kHaptics, {{"a", 1}, {"b", 2}});
  tally_.publish({"Haptics", "Other"}, {{"c", 3}});
  tally_.publish(kSpeaker, {});
  EXPECT_EQ(tally_.TallyGetChannelCount(*copyChannels(kHaptics)), 2);
  EXPECT_EQ(tally_.TallyGetChannelCount(*copyChannels({"Haptics", std::nullopt})), 3);
  EXPECT_EQ(tally_.TallyGetChannelCount(*copyChannels({std::nullopt, "Stats"})), 2);
  EXPECT_EQ(tally_.TallyGetChannelCount(*copyChannels({std::nullopt, std::nullopt})), 3);
  EXPECT_EQ(tally_.TallyGetChannelCount(*copyChannels(kSpeaker)), 0);
  EXPECT_EQ(copyChannels({"Speaker", "Stats"}), nullptr);
  EXPECT_EQ(copyChannels({"Unknown", std::nullopt}), nullptr);
  EXPECT_EQ(error_, std::nullopt) << "nothing published is no error";
  EXPECT_THAT(tally_.lookUps(), SizeIs(7));
}

TEST_F(QVFakeTallyTest, SamplesTheValuesOfNow) {
  tally_.publish(kHaptics, {{"a", 1}, {std::nullopt, 2}, {"a", 3}});
  const Subscribed subscribed = subscribe({std::nullopt, "Stats"});
  const auto before = sample(subscribed);
  EXPECT_THAT(contents(before), ElementsAre("a 1", "(null) 2", "a 3"));
  tally_.publish(kHaptics, {{"a", 10}, {"new", 5}, {"a", 30}});
  EXPECT_THAT(contents(sample(subscribed)), ElementsAre("a 10", "a 30")) << "the nameless is gone";
  EXPECT_THAT(contents(before), ElementsAre("a 1", "(null) 2", "a 3")) << "a set does not change";
  tally_.withdraw(kHaptics);
  EXPECT_THAT(contents(sample(subscribed)), IsEmpty());
  EXPECT_THAT(tally_.subscriptions(), ElementsAre(Driver{std::nullopt, "Stats"}));
}

TEST_F(QVFakeTallyTest, TakesDifferencesChannelByChannel) {
  constexpr int64_t kLeast = std::numeric_limits<int64_t>::min();
  constexpr int64_t kMost = std::numeric_limits<int64_t>::max();
  tally_.publish(kHaptics, {{"a", 1}, {"gone", 1}, {"up", kLeast}, {"down", 1}});
  const Subscribed subscribed = subscribe(kHaptics);
  const auto before = sample(subscribed);
  tally_.publish(kHaptics, {{"a", 5}, {"up", kMost}, {"down", kLeast}});
  const auto after = sample(subscribed);
  EXPECT_THAT(contents(delta(before, *after)),
              ElementsAre("a 4", QVText("up ", kMost), QVText("down ", kLeast)));
  EXPECT_THAT(contents(delta(after, *before)),
              ElementsAre("a -4", QVText("up ", kLeast), QVText("down ", kMost)));
  EXPECT_EQ(delta(nullptr, *after), nullptr);
  EXPECT_EQ(error_, std::nullopt);
}

TEST_F(QVFakeTallyTest, IteratesUntilTheIteratorHasEnough) {
  tally_.publish(kHaptics, {{"a", 1}, {"b", 2}, {"c", 3}});
  const Subscribed subscribed = subscribe(kHaptics);
  int seen = 0;
  tally_.TallyIterate(*sample(subscribed),
                      [&seen](const TallyChannelSample&) { return ++seen == 2 ? 1 : 0; });
  EXPECT_EQ(seen, 2);
}

TEST_F(QVFakeTallyTest, FailsAsItIsTold) {
  tally_.publish(kHaptics, {{"a", 1}});
  tally_.publish(kSpeaker, {{"b", 1}});
  tally_.failChannels(kHaptics, {.code = 7});
  EXPECT_EQ(copyChannels(kHaptics), nullptr);
  EXPECT_EQ(errorCode(), 7);
  EXPECT_EQ(error_->domain, QVTally::kErrorDomain);
  tally_.failChannels(kHaptics, {.code = 8, .withSet = true});
  const Subscribed subscribed = subscribe(kHaptics);
  EXPECT_EQ(errorCode(), 8);
  EXPECT_NE(subscribed.subscription, nullptr);

  tally_.failSamples(kHaptics, {.code = 9, .withSet = true});
  EXPECT_NE(sample(subscribed), nullptr);
  EXPECT_EQ(errorCode(), 9);
  tally_.failSamples(kHaptics, {});
  EXPECT_EQ(sample(subscribed), nullptr);
  EXPECT_EQ(errorCode(), std::nullopt);
  EXPECT_NE(sample(subscribe(kSpeaker)), nullptr) << "another driver";

  tally_.endFailures();
  tally_.failDeltas(kHaptics, {.code = 10});
  const auto samples = sample(subscribed);
  EXPECT_EQ(delta(samples, *samples), nullptr);
  EXPECT_EQ(errorCode(), 10);
}

TEST_F(QVFakeTallyTest, SamplesNothingWithoutASubscription) {
  tally_.publish(kHaptics, {{"a", 1}});
  tally_.failSubscriptions(kHaptics);
  const Subscribed failed = subscribe(kHaptics);
  EXPECT_EQ(failed.subscription, nullptr);
  EXPECT_EQ(failed.channels, nullptr);
  EXPECT_EQ(sample(failed), nullptr);
  EXPECT_EQ(errorCode(), QVFakeTally::kMissingSubscription);
  tally_.endFailures();
  EXPECT_EQ(sample({subscribe(kHaptics).subscription, nullptr}), nullptr);
  EXPECT_EQ(errorCode(), QVFakeTally::kMissingSet);
}

TEST_F(QVFakeTallyTest, NotesMisuse) {
  class ForeignChannels final : public TallyChannelSet {};
  class ForeignSamples final : public TallySampleSet {};
  tally_.publish(kHaptics, {{"a", 1}});
  tally_.publish(kSpeaker, {{"b", 1}});
  EXPECT_NE(tally_.TallyCopyChannelsInGroup("Haptics", "Stats", 1, error_), nullptr);
  EXPECT_EQ(tally_.TallyGetChannelCount(ForeignChannels()), 0);
  sample({subscribe(kHaptics).subscription, subscribe(kSpeaker).channels});
  tally_.TallyIterate(ForeignSamples(), [](const TallyChannelSample&) { return 0; });
  tally_.TallyIterate(*sample(subscribe(kHaptics)), nullptr);
  EXPECT_THAT(
      tally_.takeMisuses(),
      ElementsAre("options other than 0", "a channel set that was not made here",
                  "a channel set of another subscription", "a sample set that was not made here",
                  "an iteration without an iterator"));
}

TEST(QVFakeTallyDeathTest, EndsTheTestThatKeepsWhatWasHandedOut) {
  EXPECT_DEATH(
      {
        std::shared_ptr<const TallyChannelSet> channels;
        QVFakeTally tally;
        tally.publish(kHaptics, {{"a", 1}});
        QVTally::Error error;
        channels = tally.TallyCopyChannelsInGroup("Haptics", "Stats", 0, error);
      },
      "QVFakeTally used wrongly: 1 objects that it handed out are left");
}

}  // namespace
