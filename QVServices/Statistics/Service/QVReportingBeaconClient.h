#pragma once

#include <cstdint>
#include <cstdlib>
#include <string_view>

// How the service names itself to the reporting framework, in sessions and in single messages.
namespace QVReportingBeaconClient {

inline constexpr int32_t kType = 19;
inline constexpr std::string_view kName = "net.quillon.quietvox";
inline constexpr const char* kVersionText = "2.0";
// Session ID of messages without a session.
inline constexpr int64_t kNoSessionID = -1;

// The version as the framework takes it, a number.
inline double version() {
  return std::strtod(kVersionText, nullptr);
}

}  // namespace QVReportingBeaconClient
