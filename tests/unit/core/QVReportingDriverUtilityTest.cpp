// The audio drivers' statistics: which channels are subscribed to, what a snapshot holds, what
// grew since one.

#include "QVServices/Statistics/QVReportingDriverUtility.h"
#include "tests/support/QVServiceFixture.h"

#include <cstdint>
#include <limits>
#include <optional>

namespace {

using enum QVLogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using Driver = QVFakeTally::Driver;

// As they are asked for, in the order of the table.
const Driver kNorvex{"NorvexMCA", std::nullopt};
const Driver kSpeaker{"Speaker", std::nullopt};
const Driver kMCA{std::nullopt, "MCA"};
const Driver kHaptics{"Haptics", "Stats"};

constexpr std::string_view kSnapShot = "getSnapShot";
constexpr std::string_view kStatistics = "getDriverStatisticsRelativeToSnapShot:";

class QVReportingDriverUtilityTest : public QVServiceFixture {
 protected:
  // Makes the utility; the journal is left as it is.
  void init() { utility_ = QVReportingDriverUtility::init(); }
  // The same, with everything that it read and wrote forgotten.
  void initQuietly() {
    init();
    journal_.forget();
  }
  QVReportingDriverUtility::SnapShot snapShot() {
    auto made = utility_->getSnapShot();
    journal_.forget();
    return made;
  }
  QVDictionary statistics(const QVReportingDriverUtility::SnapShot& snapShot) {
    return utility_->getDriverStatisticsRelativeToSnapShot(snapShot);
  }
  std::vector<std::string> subscribedDrivers() const {
    std::vector<std::string> drivers;
    for (const auto& subscription : utility_->ioChannelSubscriptions()) {
      drivers.push_back(subscription->driver().description());
    }
    return drivers;
  }
  static std::vector<std::string> driversOf(const QVReportingDriverSnapShot& snapShot) {
    std::vector<std::string> drivers;
    for (const auto& [driver, samples] : snapShot.sampleSets) drivers.push_back(driver);
    return drivers;
  }
  QVFakeTally& tally() { return platform_.tally(); }

  static std::string initLine(QVLogLevel level, std::string_view text) {
    return driverLine(level, "init", text);
  }
  const std::string creation_ = initLine(info, "creating tallying driver utility");
  const std::string sampling_ = driverLine(info, kStatistics, "getting latest samples");
  const std::string sampled_ = driverLine(info, kStatistics, "done getting latest samples");

  std::shared_ptr<QVReportingDriverUtility> utility_;
};

// ---- drivers and subscriptions

TEST_F(QVReportingDriverUtilityTest, DescribesDriversByGroupAndSubgroup) {
  EXPECT_EQ(QVReportingDriver::driverWithGroupName("Haptics", "Stats")->description(),
            "Haptics-Stats");
  EXPECT_EQ(QVReportingDriver::driverWithGroupName("Speaker", std::nullopt)->description(),
            "Speaker-(null)");
  const auto third = QVReportingDriver::driverWithGroupName(std::nullopt, "MCA");
  EXPECT_EQ(third->description(), "(null)-MCA") << "the absent group first";
  EXPECT_EQ(third->groupName(), std::nullopt);
  EXPECT_EQ(third->subGroupName(), "MCA");
}

TEST_F(QVReportingDriverUtilityTest, MakesSubscriptionsThatHoldNothingButTheirDriver) {
  const auto driver = QVReportingDriver::driverWithGroupName("a", "b");
  const auto subscription = QVReportingIOChannelSubscription::initWithDriver(driver);
  EXPECT_EQ(&subscription->driver(), driver.get());
  EXPECT_EQ(subscription->subscription(), nullptr);
  EXPECT_EQ(subscription->subscribedChannels(), nullptr);
}

TEST_F(QVReportingDriverUtilityTest, RegistersItsScope) {
  init();
  EXPECT_THAT(platform_.log().registrations(),
              ElementsAre(QVFakeLog::Registration{true, 0x71767264, "qvrd", "net.quillon.quietvox",
                                                  "reporting_driver_verbose", 31}));
}

TEST_F(QVReportingDriverUtilityTest, AsksForTheDriversInTheOrderOfTheTable) {
  init();
  EXPECT_THAT(tally().lookUps(), ElementsAre(kNorvex, kSpeaker, kMCA, kHaptics));
}

TEST_F(QVReportingDriverUtilityTest, IsMadeAlsoWhereNoDriverHasChannels) {
  init();
  EXPECT_THAT(takeJournal(), ElementsAre(creation_)) << "nothing is said of absent drivers";
  EXPECT_THAT(utility_->ioChannelSubscriptions(), IsEmpty());
  EXPECT_THAT(tally().subscriptions(), IsEmpty());
}

TEST_F(QVReportingDriverUtilityTest, SubscribesInTheOrderOfTheTable) {
  tally().publish(kHaptics, {{"taps", 1}});
  tally().publish({"Amplifier", "MCA"}, {{"clips", 1}});
  tally().publish({"NorvexMCA", "left"}, {{"frames", 1}});
  init();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(creation_, initLine(standard, "subscribed to group group NorvexMCA-(null)"),
                  initLine(standard, "subscribed to group group (null)-MCA"),
                  initLine(standard, "subscribed to group group Haptics-Stats")));
  EXPECT_THAT(subscribedDrivers(), ElementsAre("NorvexMCA-(null)", "(null)-MCA", "Haptics-Stats"));
  EXPECT_THAT(tally().subscriptions(), ElementsAre(kNorvex, kMCA, kHaptics));
  for (const auto& subscription : utility_->ioChannelSubscriptions()) {
    EXPECT_NE(subscription->subscription(), nullptr);
    EXPECT_NE(subscription->subscribedChannels(), nullptr);
  }
}

TEST_F(QVReportingDriverUtilityTest, SubscribesToNoDriverWithoutChannelsButSaysSo) {
  tally().publish({"Speaker", "left"}, {});
  init();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(creation_,
                  initLine(info, "couldn't find any channels for driver group Speaker-(null)"),
                  initLine(standard, "subscribed to group group Speaker-(null)")));
  EXPECT_THAT(utility_->ioChannelSubscriptions(), IsEmpty());
}

TEST_F(QVReportingDriverUtilityTest, SkipsADriverWhoseChannelsCannotBeRead) {
  tally().publish({"NorvexMCA", "left"}, {{"frames", 1}});
  tally().publish(kHaptics, {{"taps", 1}});
  tally().failChannels(kNorvex, {.code = -536870206});
  init();
  EXPECT_THAT(takeJournal(),
              ElementsAre(creation_,
                          initLine(error,
                                   "error -536870206 getting channels for driver "
                                   "NorvexMCA-(null)"),
                          initLine(standard, "subscribed to group group Haptics-Stats")));
  EXPECT_THAT(subscribedDrivers(), ElementsAre("Haptics-Stats"));
}

TEST_F(QVReportingDriverUtilityTest, SubscribesToChannelsThatCameWithAnError) {
  tally().publish({"Amplifier", "MCA"}, {{"clips", 1}});
  tally().failChannels(kMCA, {.code = 5, .withSet = true});
  init();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(creation_, initLine(error, "error 5 getting channels for driver (null)-MCA"),
                  initLine(standard, "subscribed to group group (null)-MCA")));
  EXPECT_THAT(subscribedDrivers(), ElementsAre("(null)-MCA"));
}

TEST_F(QVReportingDriverUtilityTest, DoesNotNoticeThatASubscriptionFailed) {
  tally().publish(kHaptics, {{"taps", 1}});
  tally().failSubscriptions(kHaptics);
  init();
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(creation_, initLine(standard, "subscribed to group group Haptics-Stats")));
  ASSERT_THAT(utility_->ioChannelSubscriptions(), SizeIs(1));
  EXPECT_EQ(utility_->ioChannelSubscriptions()[0]->subscription(), nullptr);

  EXPECT_THAT(utility_->getSnapShot()->sampleSets, IsEmpty());
  EXPECT_TRUE(statistics(nullptr).isAbsent());
  EXPECT_THAT(takeJournal(),
              ElementsAre(driverLine(info, kSnapShot, "sampling driver Haptics-Stats"),
                          driverLine(error, kSnapShot, "TallyCreateSamples error 1"), sampling_,
                          sampled_, driverLine(error, kStatistics, "TallyCreateSamples error 1")))
      << "it shows when it is sampled";
}

TEST_F(QVReportingDriverUtilityTest, NeverReadsADriverThatGainsChannelsLater) {
  initQuietly();
  tally().publish(kHaptics, {{"taps", 1}});
  EXPECT_THAT(utility_->getSnapShot()->sampleSets, IsEmpty());
  EXPECT_TRUE(statistics(nullptr).isAbsent());
  EXPECT_THAT(tally().lookUps(), SizeIs(4));
  EXPECT_THAT(takeJournal(), IsEmpty());
}

// ---- snapshots

TEST_F(QVReportingDriverUtilityTest, TakesASnapShotOfEverySubscribedDriver) {
  tally().publish({"Speaker", "left"}, {{"frames", 1}});
  tally().publish(kHaptics, {{"taps", 1}});
  initQuietly();
  const auto first = utility_->getSnapShot();
  EXPECT_THAT(takeJournal(),
              ElementsAre(driverLine(info, kSnapShot, "sampling driver Speaker-(null)"),
                          driverLine(info, kSnapShot, "sampling driver Haptics-Stats")));
  EXPECT_THAT(driversOf(*first), ElementsAre("Haptics-Stats", "Speaker-(null)"));
  EXPECT_NE(utility_->getSnapShot(), first) << "a new one each time";
}

TEST_F(QVReportingDriverUtilityTest, TakesAnEmptySnapShotWithoutSubscriptions) {
  initQuietly();
  ASSERT_NE(utility_->getSnapShot(), nullptr);
  EXPECT_THAT(utility_->getSnapShot()->sampleSets, IsEmpty());
  EXPECT_TRUE(statistics(nullptr).isAbsent());
  EXPECT_TRUE(statistics(utility_->getSnapShot()).isAbsent());
  EXPECT_THAT(takeJournal(), IsEmpty());
}

TEST_F(QVReportingDriverUtilityTest, LeavesADriverThatCannotBeSampledOutOfTheSnapShot) {
  tally().publish({"Speaker", "left"}, {{"frames", 1}});
  tally().publish(kHaptics, {{"taps", 1}});
  initQuietly();
  tally().failSamples(kSpeaker, {.code = 7, .withSet = true});
  EXPECT_THAT(driversOf(*utility_->getSnapShot()), ElementsAre("Haptics-Stats"))
      << "even though samples came with the error";
  EXPECT_THAT(takeJournal(),
              ElementsAre(driverLine(info, kSnapShot, "sampling driver Speaker-(null)"),
                          driverLine(error, kSnapShot, "TallyCreateSamples error 7"),
                          driverLine(info, kSnapShot, "sampling driver Haptics-Stats")));
  tally().failSamples(kSpeaker, {});
  EXPECT_THAT(driversOf(*snapShot()), ElementsAre("Haptics-Stats")) << "no samples and no error";
}

// ---- statistics

TEST_F(QVReportingDriverUtilityTest, TellsWhatGrewSinceTheSnapShot) {
  tally().publish({"NorvexMCA", "left"}, {{"frames", 100}, {"idle", 5}});
  tally().publish(kHaptics, {{"taps", 1}});
  initQuietly();
  const auto before = snapShot();
  tally().publish({"NorvexMCA", "left"}, {{"frames", 580}, {"idle", 5}});
  tally().publish(kHaptics, {{"taps", 3}});
  EXPECT_EQ(statistics(before),
            (QVDictionary{{"NorvexMCA_frames", 480}, {"Haptics_Stats_taps", 2}}));
  EXPECT_THAT(takeJournal(), ElementsAre(sampling_, sampled_, sampling_, sampled_));
}

TEST_F(QVReportingDriverUtilityTest, LeavesOutWhatDidNotGrow) {
  tally().publish(kHaptics, {{"same", 5}, {"down", 5}, {"up", 5}, {"wrapped", 5}});
  initQuietly();
  const auto before = snapShot();
  tally().publish(
      kHaptics,
      {{"same", 5}, {"down", 4}, {"up", 6}, {"wrapped", std::numeric_limits<int64_t>::min()}});
  EXPECT_EQ(statistics(before), (QVDictionary{{"Haptics_Stats_up", 1}}));
}

TEST_F(QVReportingDriverUtilityTest, IsAbsentWhereNothingGrew) {
  tally().publish(kHaptics, {{"taps", 5}});
  initQuietly();
  EXPECT_TRUE(statistics(snapShot()).isAbsent());
}

TEST_F(QVReportingDriverUtilityTest, TellsTotalsWithoutASnapShot) {
  tally().publish(
      kHaptics,
      {{"one", 1}, {"zero", 0}, {"negative", -1}, {"most", std::numeric_limits<int64_t>::max()}});
  initQuietly();
  EXPECT_EQ(statistics(nullptr),
            (QVDictionary{{"Haptics_Stats_one", 1},
                          {"Haptics_Stats_most", std::numeric_limits<int64_t>::max()}}));
}

TEST_F(QVReportingDriverUtilityTest, NamesChannelsAfterTheNamesThatTheDriverIsAskedForUnder) {
  tally().publish({"Amplifier", "MCA"}, {{"clips", 3}});
  tally().publish({"Speaker", "left"}, {{"frames", 1}});
  tally().publish(kHaptics, {{std::nullopt, 2}});
  initQuietly();
  EXPECT_EQ(statistics(nullptr),
            (QVDictionary{{"MCA_clips", 3}, {"Speaker_frames", 1}, {"Haptics_Stats_", 2}}));
}

TEST_F(QVReportingDriverUtilityTest, KeepsTheLaterOfTwoChannelsWithTheSameName) {
  tally().publish(kHaptics, {{"taps", 10}, {"taps", 3}, {"other", 9}, {"other", 0}});
  tally().publish({"Speaker", "left"}, {{"frames", 7}});
  tally().publish({"Speaker", "right"}, {{"frames", 2}});
  initQuietly();
  EXPECT_EQ(
      statistics(nullptr),
      (QVDictionary{{"Haptics_Stats_taps", 3}, {"Haptics_Stats_other", 9}, {"Speaker_frames", 2}}))
      << "one that did not grow replaces nothing";
}

TEST_F(QVReportingDriverUtilityTest, GoesOnWithoutADriverThatCannotBeSampled) {
  tally().publish({"Speaker", "left"}, {{"frames", 1}});
  tally().publish(kHaptics, {{"taps", 1}});
  initQuietly();
  tally().failSamples(kSpeaker, {.code = 7, .withSet = true});
  EXPECT_EQ(statistics(nullptr), (QVDictionary{{"Haptics_Stats_taps", 1}}));
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(sampling_, sampled_, driverLine(error, kStatistics, "TallyCreateSamples error 7"),
                  sampling_, sampled_));
  tally().failSamples(kSpeaker, {});
  EXPECT_EQ(statistics(nullptr), (QVDictionary{{"Haptics_Stats_taps", 1}}));
  EXPECT_THAT(takeJournal(), ElementsAre(sampling_, sampled_, sampling_, sampled_))
      << "no samples and no error: nothing is said";
}

TEST_F(QVReportingDriverUtilityTest, TellsTotalsWhereADifferenceCannotBeTaken) {
  tally().publish(kHaptics, {{"taps", 5}});
  initQuietly();
  const auto before = snapShot();
  tally().failDeltas(kHaptics, {.code = 9, .withSet = true});
  EXPECT_EQ(statistics(before), (QVDictionary{{"Haptics_Stats_taps", 5}}))
      << "also where differences came with the error";
  EXPECT_THAT(takeJournal(),
              ElementsAre(sampling_, sampled_,
                          driverLine(error, kStatistics, "TallyCreateSamplesDelta error 9")));
}

TEST_F(QVReportingDriverUtilityTest, TellsNothingOfADriverThatTheSnapShotLacks) {
  tally().publish(kHaptics, {{"taps", 5}});
  initQuietly();
  EXPECT_TRUE(statistics(std::make_shared<QVReportingDriverSnapShot>()).isAbsent());
  EXPECT_THAT(takeJournal(), ElementsAre(sampling_, sampled_));
  tally().failDeltas(kHaptics, {.code = 9});
  EXPECT_EQ(statistics(std::make_shared<QVReportingDriverSnapShot>()),
            (QVDictionary{{"Haptics_Stats_taps", 5}}))
      << "unless Tally makes an error of it";
}

TEST_F(QVReportingDriverUtilityTest, LeavesOutChannelsThatCameOrWentSinceTheSnapShot) {
  tally().publish(kHaptics, {{"taps", 5}, {"gone", 5}});
  initQuietly();
  const auto before = snapShot();
  tally().publish(kHaptics, {{"taps", 6}, {"new", 5}});
  EXPECT_EQ(statistics(before), (QVDictionary{{"Haptics_Stats_taps", 1}}));
  tally().withdraw(kHaptics);
  EXPECT_TRUE(statistics(before).isAbsent());
}

// ---- in the service

TEST_F(QVReportingDriverUtilityTest, SendsWhatGrewWhileASessionRan) {
  tally().publish({"Speaker", "left"}, {{"frames played", 100}});
  QVTestClient& client = clientWithStartedSession(42, 7);
  EXPECT_THAT(driversOf(*client.session(7)->driverSnapShot()), ElementsAre("Speaker-(null)"));
  takeBeaconStory();
  tally().publish({"Speaker", "left"}, {{"frames played", 580}});
  client.stop(7);
  runServerQueue();
  constexpr std::string_view kStop = "stopReportingSessionForID:reply:";
  EXPECT_THAT(
      takeJournal(),
      ElementsAre(
          traceEntry(kTraceStop), sampling_, sampled_, traceEntry(kTraceMessageSent),
          clientLine(standard, kStop, R"(fetching driver logs {"Speaker_frames played":480})"),
          traceEntry(kTraceSessionStopped),
          sessionLine(standard, "stop", "sending summary event for reporter 7"),
          traceEntry(kTraceMessageSent), "reply 42 start 7: YES",
          clientLine(standard, kStop, "stopping 7"), "reply 42 stop 7: YES"));
  runUntilIdle();
  EXPECT_EQ(takeBeaconStory().at(0), R"(message 1: 9/0 {"Speaker_frames_played":480})");
  EXPECT_EQ(client.session(7)->driverSnapShot(), nullptr);
}

TEST_F(QVReportingDriverUtilityTest, SamplesForASessionAfterItHasStarted) {
  makeSessionsVerbose();
  tally().publish(kHaptics, {{"taps", 1}});
  QVTestClient& client = clientWithSession(42, 7);
  client.start(7);
  runServerQueue();
  EXPECT_THAT(takeJournal(),
              ElementsAre(traceEntry(kTraceStart),
                          sessionLine(debug, "start", "starting session owned by 7"),
                          traceEntry(kTraceSessionStarted),
                          driverLine(info, kSnapShot, "sampling driver Haptics-Stats")));
}

TEST_F(QVReportingDriverUtilityTest, SendsTotalsWhenASessionIsStoppedThatNeverStarted) {
  tally().publish(kHaptics, {{"taps", 3}});
  QVTestClient& client = clientWithSession(42, 7);
  client.stop(7);
  runUntilIdle();
  EXPECT_THAT(takeBeaconStory(), ElementsAre(R"(single: 9/0 {"Haptics_Stats_taps":3})"));
}

}  // namespace
