#pragma once

#include "QVServices/Statistics/QVReportingDriverSnapShot.h"
#include "QVServices/Statistics/QVReportingIOChannelSubscription.h"
#include "platform/QVValue.h"

#include <memory>
#include <vector>

// Reads the audio drivers' statistics channels: a snapshot of the counters, and what grew since
// one. Subscribes when it is made and never again: a driver that has no channels then is not read
// for the life of the service. Failures are logged, to the scope "qvrd", and cost only the driver
// that they are about.
//
// Used by the service delegate, for the life of the service; there is one at a time.
// Threads: made before any client is served; its operations on any thread, at once.
class QVReportingDriverUtility {
 public:
  using Subscriptions = std::vector<std::shared_ptr<QVReportingIOChannelSubscription>>;
  using SnapShot = std::shared_ptr<const QVReportingDriverSnapShot>;

  static std::shared_ptr<QVReportingDriverUtility> init();
  ~QVReportingDriverUtility();
  QVReportingDriverUtility(const QVReportingDriverUtility&) = delete;
  QVReportingDriverUtility& operator=(const QVReportingDriverUtility&) = delete;

  // One for each driver that had a channel, in the order of the table of drivers.
  const Subscriptions& ioChannelSubscriptions() const { return ioChannelSubscriptions_; }

  // A new snapshot, maybe empty, never absent.
  SnapShot getSnapShot() const;
  // By GROUP_SUBGROUP_CHANNEL (absent names with their "_" left out) what grew since `snapShot`;
  // where that is absent, or a difference cannot be taken, what was counted in all. Absent where
  // nothing grew.
  QVDictionary getDriverStatisticsRelativeToSnapShot(const SnapShot& snapShot) const;

 private:
  QVReportingDriverUtility() = default;

  void subscribe(const std::shared_ptr<const QVReportingDriver>& driver);

  Subscriptions ioChannelSubscriptions_;  // constant after creation
};
