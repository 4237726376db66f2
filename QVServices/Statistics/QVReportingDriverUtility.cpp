#include "QVServices/Statistics/QVReportingDriverUtility.h"

std::shared_ptr<QVReportingDriverUtility> QVReportingDriverUtility::init() {
  return std::shared_ptr<QVReportingDriverUtility>(new QVReportingDriverUtility);
}

QVDictionary QVReportingDriverUtility::getSnapShot() const {
  return QVDictionary(std::initializer_list<QVDictionaryEntry>{});
}

QVDictionary QVReportingDriverUtility::getDriverStatisticsRelativeToSnapShot(
    [[maybe_unused]] const QVDictionary& snapShot) const {
  return {};
}
