#include "platform/linux/settings/QVJSONDeviceInformation.h"

#include "platform/QVPreferences.h"

#include <algorithm>
#include <limits>
#include <utility>

QVJSONDeviceInformation::QVJSONDeviceInformation(QVLog& log, std::string path)
    : file_(log, "device information"), path_(std::move(path)) {}

std::optional<bool> QVJSONDeviceInformation::booleanAnswer(std::string_view key) {
  const QVDictionary known = answers();
  const QVValue* value = known.find(key);
  if (value == nullptr) return std::nullopt;
  return QVPreferences::booleanReading(value);
}

std::optional<int32_t> QVJSONDeviceInformation::integerAnswer(std::string_view key) {
  using Limits = std::numeric_limits<int32_t>;
  const QVDictionary known = answers();
  const QVValue* value = known.find(key);
  if (value == nullptr || !value->isNumber()) return std::nullopt;
  return static_cast<int32_t>(
      std::clamp<int64_t>(value->integerValue(), Limits::min(), Limits::max()));
}

QVDictionary QVJSONDeviceInformation::answers() {
  return file_.read(path_, "-[QVJSONDeviceInformation answers]");
}
