#include "QVServices/Statistics/QVReportingVocabulary.h"

#include <array>

namespace {

constexpr std::array<std::string_view, 13> kServiceTypeNames{
    "generic",          "voxa",          "telephony",
    "haptics",          "alarms",        "standalone",
    "soundautoconfig",  "longformaudio", "nonlongformaudio",
    "audiodeviceusage", "alerts",        "test",
    "apiusage"};

constexpr std::array<std::string_view, 12> kCategoryKindNames{
    "Undefined",     "Generic",     "Record", "Playback", "PlaybackAndRecord", "Setup",
    "ClientRequest", "RouteChange", "Error",  "Tallying", "Performance",       "Volume"};

constexpr std::array<std::string_view, 6> kMessageTypeNames{"Generic", "Start", "Stop",
                                                            "Setup",   "Error", "IssueDetector"};

constexpr uint16_t kMessageTypeUnknown = 0xFFFF;

// Nothing for words with several component flags, or with bits that are no flag.
std::string_view componentName(uint32_t category) {
  switch (category & kQVReportingCategoryComponentMask) {
    case 0x08000000:
      return "Session";
    case 0x10000000:
      return "DSP";
    case 0x20000000:
      return "HAL";
    case 0x40000000:
      return "Routing";
    case 0x80000000:
      return "Toolbox";
    default:
      return {};
  }
}

}  // namespace

std::optional<std::string_view> QVReportingServiceTypeName(uint16_t serviceType) {
  if (serviceType < kServiceTypeNames.size()) return kServiceTypeNames[serviceType];
  if (serviceType == kQVReportingServiceTypeUnknown) return "unknown";
  return std::nullopt;
}

std::string QVReportingCategoryName(uint32_t category) {
  std::string name;
  // The all-ones category is the summary's: it has no component and gets no "_".
  if (category >= 0x10000 && category != kQVReportingCategorySummary) {
    name = componentName(category);
    name += '_';
  }
  const uint32_t kind = category & kQVReportingCategoryKindMask;
  name += kCategoryKindNames[kind < kCategoryKindNames.size() ? kind : 0];
  return name;
}

std::string_view QVReportingMessageTypeName(uint16_t type) {
  if (type < kMessageTypeNames.size()) return kMessageTypeNames[type];
  return type == kMessageTypeUnknown ? "Unknown" : "Undefined";
}

QVValue QVReportingHostApplicationID(const QVDictionary& userInfo) {
  const QVValue* identifier = userInfo.find(kQVReportingHostApplicationKey);
  return identifier != nullptr ? *identifier : QVValue("Unknown");
}
