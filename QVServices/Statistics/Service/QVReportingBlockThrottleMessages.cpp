// What the throttle reads out of a message.

#include "QVServices/Statistics/QVReportingVocabulary.h"
#include "QVServices/Statistics/Service/QVReportingBlockThrottle.h"
#include "QVServices/Statistics/Service/QVReportingReservedPayloadKeys.h"
#include "platform/QVPlatform.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <string_view>

namespace {

constexpr const char* kDetermineSleepTime = "+[QVReportingBlockThrottle determineSleepTime:]";

constexpr std::string_view kThrottleKey = "_throttle_seconds";
constexpr std::string_view kBlacklistKey = "_comparison_field_blacklist";
constexpr std::string_view kVolumeKey = "Volume";
constexpr std::string_view kVolumeTimeKey = "VolumeOperationTime";

constexpr double kDefaultDelay = 0.5;
constexpr int64_t kDelayLimit = 5;  // seconds; what is as long as that is not taken
constexpr std::string_view kDelayLimitText = "5.000000";

// Sorted, since a client decides how many there are.
std::vector<std::string_view> ignoredKeys(const QVDictionary& message) {
  std::vector<std::string_view> ignored(kQVReportingReservedPayloadKeys.begin(),
                                        kQVReportingReservedPayloadKeys.end());
  const QVValue* const blacklist = message.find(kBlacklistKey);
  if (blacklist != nullptr && blacklist->kind() == QVValue::Kind::array) {
    // The characters are the message's, not the array handle's.
    for (const QVValue& key : blacklist->array()) {
      if (key.isString()) ignored.push_back(key.string());
    }
  }
  if (message.contains(kVolumeKey) && message.contains(kVolumeTimeKey)) {
    ignored.push_back(kVolumeKey);
    ignored.push_back(kVolumeTimeKey);
  }
  std::ranges::sort(ignored);
  return ignored;
}

}  // namespace

std::string QVReportingBlockThrottle::buildMessageKey(const QVDictionary& message,
                                                      int64_t reporterID, uint32_t category,
                                                      uint16_t type) {
  const std::vector<std::string_view> ignored = ignoredKeys(message);
  std::string key;
  for (const auto& [name, value] : message) {
    key.append(name).push_back('|');
    if (std::ranges::binary_search(ignored, name)) {
      key.push_back('^');
    } else {
      QVAppendText(key, value);
    }
    key.push_back('|');
  }
  return QVText(key, "reporterID|", reporterID, '|', QVReportingCategoryName(category), '|',
                QVReportingMessageTypeName(type));
}

double QVReportingBlockThrottle::determineSleepTime(const QVDictionary& message) {
  QVLog& log = *QVPlatform::shared().log;
  const QVValue* const time = message.find(kThrottleKey);
  if (time == nullptr) return kDefaultDelay;
  if (!time->isNumber()) {
    log.info(nullptr, kDetermineSleepTime,
             "Rejecting non NSNumber value of throttle time. {time=", *time, '}');
    return kDefaultDelay;
  }
  if (time->integerValue() >= kDelayLimit) {
    log.info(nullptr, kDetermineSleepTime, "Rejecting large throttle time. {time=", *time,
             ", max=", kDelayLimitText, '}');
    return kDefaultDelay;
  }
  const double seconds = time->doubleValue();
  if (std::isnan(seconds)) return kDefaultDelay;
  // In single precision, as the facility reads it; far below zero it saturates.
  constexpr double kLowest = std::numeric_limits<float>::lowest();
  return static_cast<float>(std::max(seconds, kLowest));
}
