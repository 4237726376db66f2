#include "client/QVClientVocabulary.h"

#include <algorithm>
#include <array>
#include <charconv>

namespace {

constexpr std::array<std::string_view, 13> kServiceTypeNames{
    "generic",          "voxa",          "telephony",
    "haptics",          "alarms",        "standalone",
    "soundautoconfig",  "longformaudio", "nonlongformaudio",
    "audiodeviceusage", "alerts",        "test",
    "apiusage"};

constexpr std::string_view kUnknownName = "unknown";

}  // namespace

std::string_view QVClientNameOf(QVClientServiceType serviceType) noexcept {
  const auto value = static_cast<std::size_t>(serviceType);
  if (value < kServiceTypeNames.size()) return kServiceTypeNames[value];
  return serviceType == QVClientServiceType::unknown ? kUnknownName : std::string_view();
}

std::optional<QVClientServiceType> QVClientServiceTypeNamed(std::string_view name) noexcept {
  if (name == kUnknownName) return QVClientServiceType::unknown;
  const auto* found = std::find(kServiceTypeNames.begin(), kServiceTypeNames.end(), name);
  if (found != kServiceTypeNames.end()) {
    return static_cast<QVClientServiceType>(found - kServiceTypeNames.begin());
  }
  uint16_t number = 0;
  const auto [end, problem] = std::from_chars(name.data(), name.data() + name.size(), number);
  if (problem != std::errc() || end != name.data() + name.size()) return std::nullopt;
  return static_cast<QVClientServiceType>(number);
}
