#pragma once

#include "QVServices/Statistics/QVReportingDriver.h"
#include "platform/QVTally.h"

#include <memory>

// The subscription to one driver's statistics channels, with the channels that it took. Both are
// none until they are set, and stay none where subscribing failed: that shows when it is sampled.
//
// Threads: filled by the thread that makes it, before anyone else sees it; only read after it.
class QVReportingIOChannelSubscription {
 public:
  static std::shared_ptr<QVReportingIOChannelSubscription> initWithDriver(
      std::shared_ptr<const QVReportingDriver> driver);

  const QVReportingDriver& driver() const { return *driver_; }
  const std::shared_ptr<TallySubscription>& subscription() const { return subscription_; }
  void setSubscription(std::shared_ptr<TallySubscription> subscription);
  const std::shared_ptr<const TallyChannelSet>& subscribedChannels() const {
    return subscribedChannels_;
  }
  void setSubscribedChannels(std::shared_ptr<const TallyChannelSet> channels);

 private:
  explicit QVReportingIOChannelSubscription(std::shared_ptr<const QVReportingDriver> driver);

  const std::shared_ptr<const QVReportingDriver> driver_;
  std::shared_ptr<TallySubscription> subscription_;
  std::shared_ptr<const TallyChannelSet> subscribedChannels_;
};
