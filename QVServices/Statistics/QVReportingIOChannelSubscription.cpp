#include "QVServices/Statistics/QVReportingIOChannelSubscription.h"

#include <utility>

std::shared_ptr<QVReportingIOChannelSubscription> QVReportingIOChannelSubscription::initWithDriver(
    std::shared_ptr<const QVReportingDriver> driver) {
  return std::shared_ptr<QVReportingIOChannelSubscription>(
      new QVReportingIOChannelSubscription(std::move(driver)));
}

QVReportingIOChannelSubscription::QVReportingIOChannelSubscription(
    std::shared_ptr<const QVReportingDriver> driver)
    : driver_(std::move(driver)) {}

void QVReportingIOChannelSubscription::setSubscription(
    std::shared_ptr<TallySubscription> subscription) {
  subscription_ = std::move(subscription);
}

void QVReportingIOChannelSubscription::setSubscribedChannels(
    std::shared_ptr<const TallyChannelSet> channels) {
  subscribedChannels_ = std::move(channels);
}
