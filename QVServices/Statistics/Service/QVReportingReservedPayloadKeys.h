#pragma once

#include <array>
#include <string_view>

// Payload keys that differ between messages that mean the same, in the order in which whoever
// compares messages leaves them out.
inline constexpr std::array<std::string_view, 5> kQVReportingReservedPayloadKeys{
    "systemuptime_sec", "processuptime_ms", "qvreporting_timestamp", "_comparison_field_blacklist",
    "_throttle_seconds"};
