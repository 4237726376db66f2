#pragma once

#include <cstdint>
#include <string_view>

// How the service names itself to the reporting framework, in sessions and in single messages.
namespace QVReportingBeaconClient {

inline constexpr int32_t kType = 19;
inline constexpr std::string_view kName = "net.quillon.quietvox";
inline constexpr double kVersion = 2.0;
// Session ID of messages without a session.
inline constexpr int64_t kNoSessionID = -1;

}  // namespace QVReportingBeaconClient
