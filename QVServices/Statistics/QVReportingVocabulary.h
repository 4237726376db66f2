#pragma once

#include "platform/QVValue.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// The shared vocabulary of service types, message categories and message types, and the pure
// functions that turn them into the names that keys, file names and events are made of. No state,
// no locks, any thread.

// Service types with a meaning of their own to the service. A client may set any 16-bit value.
inline constexpr uint16_t kQVReportingServiceTypeTelephony = 2;
inline constexpr uint16_t kQVReportingServiceTypeAlarms = 4;
inline constexpr uint16_t kQVReportingServiceTypeStandalone = 5;
inline constexpr uint16_t kQVReportingServiceTypeLongFormAudio = 7;
inline constexpr uint16_t kQVReportingServiceTypeTest = 11;
inline constexpr uint16_t kQVReportingServiceTypeAPIUsage = 12;
inline constexpr uint16_t kQVReportingServiceTypeUnknown = 0xFFFF;

// A category is one component flag in the high 16 bits and a kind in the low 16 bits.
inline constexpr uint32_t kQVReportingCategoryComponentMask = 0xFFFF0000;
inline constexpr uint32_t kQVReportingCategoryKindMask = 0x0000FFFF;
inline constexpr uint32_t kQVReportingCategoryTallying = 9;
// Category and type of the message that a session sends to itself when it stops.
inline constexpr uint32_t kQVReportingCategorySummary = 0xFFFFFFFF;
inline constexpr uint16_t kQVReportingMessageTypeSummary = 0xFFFF;
// A key of that message: its column begins with the session's service type.
inline constexpr std::string_view kQVReportingSummaryEventKey = "QV_Session_Summary_Event";

inline constexpr uint16_t kQVReportingMessageTypeGeneric = 0;

// Key of a session's user information that names the application on whose behalf it reports.
inline constexpr std::string_view kQVReportingHostApplicationKey = "HostApplicationDisplayID";

// The lower-case name; nothing for 13 to 65534, which are formatted as "(null)".
std::optional<std::string_view> QVReportingServiceTypeName(uint16_t serviceType);

// Component and kind, "Session_Playback"; never empty, never fails.
std::string QVReportingCategoryName(uint32_t category);

// Never fails.
std::string_view QVReportingMessageTypeName(uint16_t type);

// What lies under "HostApplicationDisplayID", of whatever kind; "Unknown" where there is nothing.
QVValue QVReportingHostApplicationID(const QVDictionary& userInfo);
