#include "QVServices/Statistics/QVReportingDriver.h"

#include "platform/QVText.h"

#include <utility>

std::shared_ptr<const QVReportingDriver> QVReportingDriver::driverWithGroupName(Name groupName,
                                                                                Name subGroupName) {
  return std::shared_ptr<const QVReportingDriver>(
      new QVReportingDriver(std::move(groupName), std::move(subGroupName)));
}

QVReportingDriver::QVReportingDriver(Name groupName, Name subGroupName)
    : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

std::string QVReportingDriver::description() const {
  return QVText(groupName_, '-', subGroupName_);
}
