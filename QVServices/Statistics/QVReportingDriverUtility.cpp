#include "QVServices/Statistics/QVReportingDriverUtility.h"

#include "platform/QVPlatform.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace {

constexpr const char* kInitFunction = "-[QVReportingDriverUtility init]";
constexpr const char* kSnapShotFunction = "-[QVReportingDriverUtility getSnapShot]";
constexpr const char* kStatisticsFunction =
    "-[QVReportingDriverUtility getDriverStatisticsRelativeToSnapShot:]";

// The drivers that are read, in this order. No group, no subgroup: any.
struct DriverNames {
  std::optional<std::string_view> group;
  std::optional<std::string_view> subgroup;
};
constexpr DriverNames kDrivers[] = {{"NorvexMCA", std::nullopt},
                                    {"Speaker", std::nullopt},
                                    {std::nullopt, "MCA"},
                                    {"Haptics", "Stats"}};

// The scope "qvrd" of the process. Null, which is the default log, until it is registered; written
// before any client is served and after the last one is gone.
const QVLogScope* driverLogScope = nullptr;

QVLog& log() {
  return *QVPlatform::shared().log;
}
QVTally& tally() {
  return *QVPlatform::shared().tally;
}

std::shared_ptr<const TallySampleSet> createSamples(
    const QVReportingIOChannelSubscription& channels, QVTally::Error& error) {
  return tally().TallyCreateSamples(channels.subscription(), channels.subscribedChannels(), error);
}

// What to take the statistics from, given what is counted now: the differences to the snapshot,
// else all that was counted. Null where Tally sees no differences.
std::shared_ptr<const TallySampleSet> differences(
    const QVReportingDriverUtility::SnapShot& snapShot, const QVReportingDriver& driver,
    const std::shared_ptr<const TallySampleSet>& current) {
  if (snapShot == nullptr) return current;
  const auto entry = snapShot->sampleSets.find(driver.description());
  QVTally::Error error;
  auto grown = tally().TallyCreateSamplesDelta(
      entry == snapShot->sampleSets.end() ? nullptr : entry->second, *current, error);
  if (!error) return grown;
  log().error(driverLogScope, kStatisticsFunction, "TallyCreateSamplesDelta error ", error->code);
  // Totals tell more than nothing would.
  return current;
}

std::string channelKey(const QVReportingDriver& driver, const QVTally::Name& channel) {
  std::string key;
  for (const auto* const name : {&driver.groupName(), &driver.subGroupName()}) {
    if (*name) key.append(**name).append("_");
  }
  if (channel) key.append(*channel);
  return key;
}

using Statistics = std::map<std::string, int64_t, std::less<>>;

void addStatistics(Statistics& statistics, const QVReportingDriver& driver,
                   const TallySampleSet& differences) {
  tally().TallyIterate(differences, [&statistics, &driver](const TallyChannelSample& sample) {
    const int64_t value = tally().TallySimpleGetIntegerValue(sample);
    if (value >= 1) {
      // Of channels with the same name the later one counts.
      statistics.insert_or_assign(channelKey(driver, tally().TallyChannelGetChannelName(sample)),
                                  value);
    }
    return 0;
  });
}

}  // namespace

std::shared_ptr<QVReportingDriverUtility> QVReportingDriverUtility::init() {
  driverLogScope = log().registerScope(true, 0x71767264, "qvrd", "net.quillon.quietvox",
                                       "reporting_driver_verbose", 31);
  log().info(driverLogScope, kInitFunction, "creating tallying driver utility");
  std::shared_ptr<QVReportingDriverUtility> utility(new QVReportingDriverUtility);
  for (const auto& [group, subgroup] : kDrivers) {
    utility->subscribe(QVReportingDriver::driverWithGroupName(QVReportingDriver::Name(group),
                                                              QVReportingDriver::Name(subgroup)));
  }
  return utility;
}

QVReportingDriverUtility::~QVReportingDriverUtility() {
  // The scope belongs to the platform, which may end right after.
  driverLogScope = nullptr;
}

void QVReportingDriverUtility::subscribe(const std::shared_ptr<const QVReportingDriver>& driver) {
  const auto& group = driver->groupName();
  const auto& subgroup = driver->subGroupName();
  QVTally::Error error;
  const auto channels = tally().TallyCopyChannelsInGroup(group, subgroup, 0, error);
  if (error) {
    log().error(driverLogScope, kInitFunction, "error ", error->code,
                " getting channels for driver ", group, '-', subgroup);
  }
  if (channels == nullptr) return;
  if (tally().TallyGetChannelCount(*channels) >= 1) {
    const auto subscription = QVReportingIOChannelSubscription::initWithDriver(driver);
    std::shared_ptr<const TallyChannelSet> subscribed;
    subscription->setSubscription(tally().TallyCreateSubscription(*channels, subscribed));
    subscription->setSubscribedChannels(std::move(subscribed));
    ioChannelSubscriptions_.push_back(subscription);
  } else {
    log().info(driverLogScope, kInitFunction, "couldn't find any channels for driver group ", group,
               '-', subgroup);
  }
  // Written, with its doubled word, whether or not there was anything to subscribe to; tools match
  // on it.
  log().standard(driverLogScope, kInitFunction, "subscribed to group group ", group, '-', subgroup);
}

QVReportingDriverUtility::SnapShot QVReportingDriverUtility::getSnapShot() const {
  auto snapShot = std::make_shared<QVReportingDriverSnapShot>();
  for (const auto& channels : ioChannelSubscriptions_) {
    std::string description = channels->driver().description();
    log().info(driverLogScope, kSnapShotFunction, "sampling driver ", description);
    QVTally::Error error;
    auto samples = createSamples(*channels, error);
    if (error) {
      log().error(driverLogScope, kSnapShotFunction, "TallyCreateSamples error ", error->code);
    } else if (samples != nullptr) {
      snapShot->sampleSets.insert_or_assign(std::move(description), std::move(samples));
    }
  }
  return snapShot;
}

QVDictionary QVReportingDriverUtility::getDriverStatisticsRelativeToSnapShot(
    const SnapShot& snapShot) const {
  Statistics statistics;
  for (const auto& channels : ioChannelSubscriptions_) {
    log().info(driverLogScope, kStatisticsFunction, "getting latest samples");
    QVTally::Error error;
    const auto current = createSamples(*channels, error);
    log().info(driverLogScope, kStatisticsFunction, "done getting latest samples");
    if (error) {
      log().error(driverLogScope, kStatisticsFunction, "TallyCreateSamples error ", error->code);
      continue;
    }
    if (current == nullptr) continue;
    const auto grown = differences(snapShot, channels->driver(), current);
    if (grown != nullptr) addStatistics(statistics, channels->driver(), *grown);
  }
  if (statistics.empty()) return {};
  std::vector<QVDictionaryEntry> entries;
  entries.reserve(statistics.size());
  for (const auto& [key, value] : statistics) entries.push_back({key, value});
  return QVDictionary::assemble(entries);
}
